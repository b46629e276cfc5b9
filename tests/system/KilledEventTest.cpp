// The daemon killed at system calls between the arrival of figures that become an event and their
// acknowledgement: at every one of them, or at every kStep-th in the short form.

#include "tests/support/SystemCallStepper.h"
#include "tests/system/AnalyticsFixture.h"

#include <csignal>
#include <filesystem>
#include <functional>
#include <sys/syscall.h>

namespace system_tests {
namespace {

namespace fs = std::filesystem;

constexpr int kStep = KSTD_KILL_STEP;

class KilledEventTest : public AnalyticsFixture {
  protected:
    void SetUp() override { startKernel(); }

    /// Kills a daemon at every kStep-th stop, each time on what `arrange` has put there, until one
    /// acknowledges before its stop comes. `eventsBefore` is how many events that holds.
    void killAtEveryStage(int eventsBefore, const std::function<void()>& arrange) {
        int stops = 0;
        bool acknowledged = false;
        for (; !acknowledged; stops += kStep) {
            SCOPED_TRACE("killed at stop " + std::to_string(stops));
            arrange();
            acknowledged = killAt(stops);
            expectNothingLost(eventsBefore);
            if (HasFailure()) {
                return;
            }
        }
        EXPECT_GT(stops, 200);
        RecordProperty("stops", stops);
    }

    void removeDatabase() const {
        for (const char* const suffix : {"", "-wal", "-shm"}) {
            fs::remove(database() + suffix);
        }
    }

    void restore(const fs::path& saved) const {
        removeDatabase();
        fs::copy_file(saved, database());
    }

  private:
    /// Lets the figures arrive and kills the daemon at the `stops`-th stop after that. Whether it
    /// had acknowledged, and waited for the next event, before.
    bool killAt(int stops) {
        launch();
        support::SystemCallStepper stepper(daemon->pid());
        kernel("publish analytics-collected");
        for (int i = 0; i < stops; ++i) {
            const auto stop = stepper.next();
            const bool isWaiting =
                stop && stop->isEntry && stop->number == static_cast<std::uint64_t>(SYS_epoll_wait);
            if (!stop || (isWaiting && kernelStatus("acks") == "1")) {
                stepper.kill();
                daemon->awaitEnd();
                return true;
            }
        }
        stepper.kill();
        EXPECT_EQ(daemon->awaitEnd(), 128 + SIGKILL);
        return false;
    }

    /// The figures are with the kernel side or were stored; what was left behind is sound, and the
    /// next daemon goes on with it.
    void expectNothingLost(int eventsBefore) {
        const bool acknowledged = kernelStatus("acks") == "1";
        EXPECT_EQ(kernelStatus("properties"), acknowledged ? "0" : "1");
        const int left = eventsLeftBehind();
        if (acknowledged) {
            EXPECT_EQ(left, eventsBefore + 1);
        } else {
            EXPECT_TRUE(left == eventsBefore || left == eventsBefore + 1) << left;
            // The kernel side tells a daemon that starts of what is not acknowledged.
            launch();
            kernel("wait acks=1");
            daemon->signal(SIGKILL);
            daemon->awaitEnd();
            EXPECT_EQ(eventsLeftBehind(), left + 1);
        }
        stopKernel();
        startKernel();
    }

    /// How many events a copy of the database holds, which is found sound. The copy leaves the
    /// recovery of the files themselves to the next daemon.
    int eventsLeftBehind() const {
        const fs::path copy = root.path() / "copy.db";
        for (const char* const suffix : {"", "-wal"}) {
            fs::remove(copy.string() + suffix);
            if (fs::exists(database() + suffix)) {
                fs::copy_file(database() + suffix, copy.string() + suffix);
            }
        }
        OtherConnection connection(copy);
        EXPECT_EQ(connection.one("pragma integrity_check"), "ok");
        return connection.rows("select 1 from sqlite_master where name = 'all_events'").empty()
                   ? 0
                   : std::stoi(connection.one("select count(*) from all_events"));
    }
};

TEST_F(KilledEventTest, WhileTheDatabaseIsMade) {
    killAtEveryStage(0, [this] { removeDatabase(); });
}

TEST_F(KilledEventTest, WhileOneIsThere) {
    launch();
    publishPolicyEvent();
    daemon.reset();
    stopKernel();
    startKernel();
    const fs::path saved = root.path() / "saved.db";
    // Whoever closes a database last brings everything into the one file.
    EXPECT_EQ(storedEvents(), 1);
    fs::copy_file(database(), saved);
    killAtEveryStage(1, [this, &saved] { restore(saved); });
}

} // namespace
} // namespace system_tests
