// The daemon killed before a system call, and the next one before one of its own, ahead of a third
// that goes on: every pair of calls, or every KSTD_PAIR_STEP-th.

#include "tests/system/CallInjector.h"
#include "tests/system/RelaunchFixture.h"

#include <atomic>
#include <cerrno>
#include <climits>
#include <csignal>
#include <filesystem>
#include <iostream>

namespace system_tests {
namespace {

namespace fs = std::filesystem;
using Bytes = std::vector<std::uint8_t>;

/// In slices, so that a whole run can be taken up where it was left.
constexpr int kSlices = KSTD_PAIR_STEP == 1 ? 8 : 1;

/// A record, and the file that it is kept in.
struct Kept {
    std::string name;
    std::string command;
    std::string file;
    Bytes before;
    Bytes after;
};

/// Lets a daemon make so many calls, counted from its main function on, and kills it before the
/// next one.
class Killer {
  public:
    Killer(std::string root, int eventSocket, int calls)
        : idle_(std::move(root), eventSocket), calls_(calls) {}

    int judge(const support::SystemCall& call) {
        static_cast<void>(idle_.judge(call));
        if (!idle_.hasBegun() || ++made_ <= calls_) {
            return 0;
        }
        ::kill(call.thread, SIGKILL);
        // Let go on, it would be carried out before the signal counts.
        return EINTR;
    }

    [[nodiscard]] CallInjector& idle() { return idle_; }
    [[nodiscard]] int made() const { return made_; }

  private:
    CallInjector idle_;
    int calls_;
    /// Counted by the gate's thread.
    std::atomic<int> made_ = 0;
};

class KilledTwiceTest : public RelaunchFixture, public testing::WithParamInterface<int> {
  protected:
    void SetUp() override { startKernel(); }

    void killAtEachPair(const Kept& kept) {
        arrange(kept);
        const int calls = runUntil(INT_MAX);
        ASSERT_GT(calls, 100);
        int pairs = 0;
        for (int number = GetParam() * KSTD_PAIR_STEP; number < calls * calls;
             number += kSlices * KSTD_PAIR_STEP, ++pairs) {
            SCOPED_TRACE("killed at " + std::to_string(number / calls) + " and at " +
                         std::to_string(number % calls) + " of " + std::to_string(calls));
            arrange(kept);
            runUntil(number / calls);
            runUntil(number % calls);
            expectNothingLost(kept);
            if (HasFailure()) {
                return;
            }
        }
        std::cout << kept.name << ": " << calls << " calls, " << pairs << " pairs\n";
        RecordProperty("pairs", pairs);
    }

  private:
    void arrange(const Kept& kept) {
        dropEvents();
        fs::remove_all(real("/var/lib/kstd/alarms"));
        fs::create_directories(real("/var/lib/kstd/alarms"));
        putFile(kept.file, kept.before);
        kernel("requests clear");
        kernel(kept.command);
    }

    /// How many calls it made, at most `calls`.
    int runUntil(int calls) {
        Killer killer(root.path().string(), eventSocket(), calls);
        const auto gate = relaunchedBehind(
            [&killer](const support::SystemCall& call) { return killer.judge(call); });
        const auto daemonIs = killer.idle().awaitIdle(gate->program().pid(), support::kPatience);
        EXPECT_NE(daemonIs, CallInjector::Daemon::busy);
        gate->program().signal(SIGKILL);
        EXPECT_EQ(gate->program().awaitEnd(), 128 + SIGKILL);
        return killer.made();
    }

    /// The record was acknowledged and is on disk, or it comes to the next daemon.
    void expectNothingLost(const Kept& kept) {
        if (kernelStatus("properties") != "0") {
            EXPECT_EQ(acks(), 0);
            const auto found = file(kept.file);
            EXPECT_TRUE(found == kept.before || found == kept.after);
            const auto third = relaunched();
            kernel("wait acks=1");
            third->signal(SIGKILL);
            third->awaitEnd();
        }
        EXPECT_EQ(file(kept.file), kept.after);
        EXPECT_EQ(kernelStatus("properties"), "0");
        EXPECT_EQ(acks(), 1);
    }
};

TEST_P(KilledTwiceTest, StateAndAlarm) {
    killAtEachPair({"state and alarm",
                    "publish timer-restarted alarm=4102444800 version=2 start=1800000000 locked=1",
                    kStateFile, stateOf(1), stateOf(2)});
}

TEST_P(KilledTwiceTest, Accumulator) {
    const Bytes before(32, 0x11);
    const Bytes after(32, 0x22);
    killAtEachPair(
        {"accumulator", "publish save-analytics " + hex(after), kAnalyticsFile, before, after});
}

INSTANTIATE_TEST_SUITE_P(Slices, KilledTwiceTest, testing::Range(0, kSlices));

} // namespace
} // namespace system_tests
