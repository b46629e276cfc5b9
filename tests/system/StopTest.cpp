// The daemon asked to end, by SIGTERM, at whatever moment.

#include "tests/support/SystemCallStepper.h"
#include "tests/system/SystemFixture.h"

#include <csignal>
#include <sys/syscall.h>

namespace system_tests {
namespace {

constexpr char kStopped[] = "kstd: main: Stoping service - <DeviceRestrictedModeService>.";

class StopTest : public SystemFixture {
  protected:
    void SetUp() override { startKernel(); }

    /// Everything that a stopped daemon owes: its last lines, and status 0.
    static void expectOrderlyEnd(Program& daemon) {
        EXPECT_EQ(daemon.awaitEnd(), 0);
        EXPECT_EQ(daemon.count(kStopped), 1U);
        EXPECT_EQ(daemon.lines().back(), "kstd: -[DeviceRestrictedModeService stop]: returning, .");
    }
};

TEST_F(StopTest, ADaemonWithoutWorkEnds) {
    const auto daemon = startDaemon();
    daemon->signal(SIGTERM);
    expectOrderlyEnd(*daemon);
}

TEST_F(StopTest, WaitingForAnAlarmIsNoWork) {
    const auto daemon = startDaemon();
    kernel("publish timer-restarted alarm=4102444800");
    kernel("wait acks=1");
    daemon->signal(SIGTERM);
    expectOrderlyEnd(*daemon);
}

TEST_F(StopTest, TheStartExchangeIsFinished) {
    kernel("fault control=3 delay=200");
    const auto daemon = beginDaemon();
    kernel("wait control=3 count=1");
    daemon->signal(SIGTERM);
    expectOrderlyEnd(*daemon);
    EXPECT_EQ(daemon->count("KSTKernelControl: returning, err = "), 0U);
    EXPECT_EQ(daemon->count("kstd: main: Entering the main runloop."), 1U);
}

TEST_F(StopTest, ANotificationInHandIsFinishedAtWhateverSystemCallItIs) {
    constexpr int kStep = 7;
    bool acknowledged = false;
    int stops = 0;
    for (; !acknowledged && !HasFailure(); stops += kStep) {
        SCOPED_TRACE("asked at stop " + std::to_string(stops));
        const auto daemon = startDaemon();
        {
            support::SystemCallStepper stepper(daemon->pid());
            kernel("publish timer-restarted alarm=4102444800");
            for (int i = 0; i < stops && !acknowledged; ++i) {
                const auto stop = stepper.next();
                ASSERT_TRUE(stop);
                acknowledged = stop->number == static_cast<std::uint64_t>(SYS_epoll_wait) &&
                               kernelStatus("acks") == "1";
            }
            daemon->signal(SIGTERM);
        }
        expectOrderlyEnd(*daemon);
        const bool wasInHand = daemon->count("Wisp Event: ") == 1;
        EXPECT_EQ(kernelStatus("acks"), wasInHand ? "1" : "0");
        EXPECT_EQ(kernelStatus("properties"), wasInHand ? "0" : "1");
        stopKernel();
        startKernel();
    }
    EXPECT_GT(stops, 70);
}

} // namespace
} // namespace system_tests
