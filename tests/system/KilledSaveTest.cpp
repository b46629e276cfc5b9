// The daemon killed at every system call between a notification's arrival and its acknowledgement,
// or at every KSTD_KILL_STEP-th stop of those.

#include "tests/support/SystemCallStepper.h"
#include "tests/system/SystemFixture.h"

#include <gmock/gmock.h>

#include <csignal>
#include <filesystem>
#include <sys/syscall.h>

namespace system_tests {
namespace {

using testing::AnyOf;

/// version, standardModeStartTimestamp 1800000000, lockedInRestrictedMode 1.
std::vector<std::uint8_t> stateOf(std::uint8_t version) {
    return {version, 0, 0, 0, 0x00, 0xd2, 0x49, 0x6b, 0, 0, 0, 0, 1};
}

enum class Ended { killed, acknowledged };

class KilledSaveTest : public SystemFixture {
  protected:
    /// Starts a daemon on the old state, lets the notification of the new one arrive, and kills the
    /// daemon at the `stops`-th stop after that, if it has not acknowledged before.
    Ended killAt(int stops) {
        const auto daemon = startDaemon();
        support::SystemCallStepper stepper(daemon->pid());
        kernel("requests clear");
        kernel("publish timer-restarted alarm=4102444800 version=2 start=1800000000 locked=1");
        for (int i = 0; i < stops; ++i) {
            const auto stop = stepper.next();
            const bool isWaiting =
                stop && stop->isEntry && stop->number == static_cast<std::uint64_t>(SYS_epoll_wait);
            if (!stop || (isWaiting && kernelStatus("acks") == "1")) {
                stepper.kill();
                daemon->awaitEnd();
                return Ended::acknowledged;
            }
        }
        stepper.kill();
        EXPECT_EQ(daemon->awaitEnd(), 128 + SIGKILL);
        return Ended::killed;
    }

    void removeState() const {
        std::filesystem::remove(real(kStateFile));
        std::filesystem::remove_all(real("/var/lib/kstd/alarms"));
    }

    /// What must hold whenever the daemon was killed: the record is with the kernel side or was
    /// saved, and the next daemon hands over just what the file holds.
    void expectNothingLost(const std::optional<std::vector<std::uint8_t>>& saved) {
        const bool acknowledged = kernelStatus("acks") == "1";
        EXPECT_EQ(kernelStatus("properties"), acknowledged ? "0" : "1");
        if (acknowledged) {
            EXPECT_EQ(saved, stateOf(2));
        }
        kernel("requests clear");
        const auto daemon = startDaemon();
        const bool isLoaded = saved && saved->size() >= 13;
        const auto handedOver = requests();
        ASSERT_FALSE(handedOver.empty());
        EXPECT_EQ(
            handedOver[0],
            (Request{3, "010000" + hex(isLoaded ? *saved : std::vector<std::uint8_t>(13, 0)), 0}));
        // Only a record that is still there is announced to it again, and acknowledged once.
        EXPECT_LE(handedOver.size(), acknowledged ? 1U : 2U);
        if (handedOver.size() == 2) {
            EXPECT_EQ(handedOver[1].control, 7U);
        }
        daemon->signal(SIGKILL);
        daemon->awaitEnd();
    }

    void startAnewForTheNextRound() {
        stopKernel();
        startKernel();
    }
};

TEST_F(KilledSaveTest, StateFileOverAnOlderOneIsOldOrNewAtEveryStage) {
    startKernel();
    int rounds = 0;
    for (Ended ended = Ended::killed; ended == Ended::killed; rounds += KSTD_KILL_STEP) {
        removeState();
        putFile(kStateFile, stateOf(1));
        ended = killAt(rounds);
        const auto saved = file(kStateFile);
        EXPECT_THAT(saved, AnyOf(stateOf(1), stateOf(2))) << "killed at stop " << rounds;
        expectNothingLost(saved);
        startAnewForTheNextRound();
    }
    EXPECT_GT(rounds, 40);
    RecordProperty("rounds", rounds);
}

TEST_F(KilledSaveTest, NewStateFileIsMissingEmptyOrWholeAtEveryStage) {
    startKernel();
    int rounds = 0;
    for (Ended ended = Ended::killed; ended == Ended::killed; rounds += KSTD_KILL_STEP) {
        removeState();
        ended = killAt(rounds);
        const auto saved = file(kStateFile);
        EXPECT_TRUE(!saved || saved->empty() || saved == stateOf(2)) << "stop " << rounds;
        expectNothingLost(saved);
        startAnewForTheNextRound();
    }
    EXPECT_GT(rounds, 40);
    RecordProperty("rounds", rounds);
}

} // namespace
} // namespace system_tests
