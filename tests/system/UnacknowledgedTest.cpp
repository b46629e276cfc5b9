// What a daemon has left unacknowledged comes to the next one, and counts once however many events
// there are about it.

#include "tests/system/AnalyticsFixture.h"

#include <csignal>

namespace system_tests {
namespace {

class UnacknowledgedTest : public AnalyticsFixture {
  protected:
    void SetUp() override { startKernel(); }

    void killDaemon() {
        daemon->signal(SIGKILL);
        daemon->awaitEnd();
    }

    /// The daemon is launched by what waits in the socket, and goes on until it has handled all.
    void launchForWhatIsQueued(int acknowledgements) {
        supervisor_ = startSupervisor(3'600'000, false);
        kernel("wait acks=" + std::to_string(acknowledgements));
        sendEvent("the last one");
        ASSERT_TRUE(supervisor_->awaitLine("Wisp Event: the last one (notifyd)."));
    }

    std::unique_ptr<Program> supervisor_;
};

TEST_F(UnacknowledgedTest, ARecordWhoseDaemonWasKilledComesToTheNextOne) {
    launch();
    kernel("fault control=7 status=-42 times=2");
    kernel("publish save-analytics " + hex(std::vector<std::uint8_t>(32, 7)));
    kernel("publish timer-restarted alarm=4102444800 version=3 start=1800000000 locked=1");
    kernel("wait control=7 count=2");
    killDaemon();
    EXPECT_EQ(kernelStatus("properties"), "2");
    launch();
    kernel("wait acks=2");
    EXPECT_EQ(kernelStatus("properties"), "0");
    EXPECT_EQ(file(kAnalyticsFile), std::vector<std::uint8_t>(32, 7));
    launch();
    EXPECT_EQ(daemon->count("Wisp Event: "), 0U);
}

TEST_F(UnacknowledgedTest, FiguresWhoseOwnEventLaunchesTheDaemonGiveOneRow) {
    kernel("publish analytics-collected");
    launchForWhatIsQueued(1);
    EXPECT_EQ(storedEvents(), 1);
    EXPECT_EQ(kernelStatus("acks"), "1");
    EXPECT_EQ(kernelStatus("properties"), "0");
    EXPECT_EQ(supervisor_->count("XXX Daemon: EMPTY IGNORING KSTRMAnalyticsCollected."), 1U);
}

TEST_F(UnacknowledgedTest, FiguresWithSeveralEventsGiveOneRow) {
    kernel("publish timer-restarted-analytics total=1");
    kernel("publish timer-restarted-analytics total=2");
    kernel("post com.zerva.Keystrand.KSTRMTimerRestartedAnalyticsCollected");
    launchForWhatIsQueued(1);
    EXPECT_EQ(storedEvents(), 1);
    EXPECT_EQ(kernelStatus("acks"), "1");
    EXPECT_EQ(kernelStatus("properties"), "0");
}

} // namespace
} // namespace system_tests
