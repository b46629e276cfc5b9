// A daemon that keeps ending because it is idle, and events that keep coming.

#include "tests/system/SystemFixture.h"

#include <map>

namespace system_tests {
namespace {

class IdleExitTest : public SystemFixture {};

TEST_F(IdleExitTest, NothingOfThousandEventsIsLostOverManyExits) {
    constexpr int kEvents = 1200;
    constexpr int kBurst = 6;
    const auto supervisor = startSupervisor(1, false);
    int sent = 0;
    while (sent < kEvents) {
        for (int i = 0; i < kBurst; ++i) {
            sendEvent("event." + std::to_string(sent++) + ".");
        }
        // Every other burst meets a daemon that is about to end.
        if (sent % (2 * kBurst) == 0) {
            ASSERT_TRUE(supervisor->awaitLine("kstd-supervise: ended"));
        }
    }
    sendEvent("the last one");
    ASSERT_TRUE(supervisor->awaitLine("Wisp Event: the last one (notifyd)."));

    std::map<std::string, int> handled;
    for (const std::string& line : supervisor->lines()) {
        const auto event = line.find("Wisp Event: ");
        if (event != std::string::npos) {
            ++handled[line.substr(event)];
        }
    }
    EXPECT_EQ(handled.size(), static_cast<std::size_t>(kEvents) + 1);
    for (const auto& [line, times] : handled) {
        EXPECT_EQ(times, 1) << line;
    }
    EXPECT_GE(supervisor->count("kstd-supervise: ended 0"), 50U);
    EXPECT_EQ(supervisor->count("kstd-supervise: ended"),
              supervisor->count("kstd-supervise: ended 0"));
    RecordProperty("exits", static_cast<int>(supervisor->count("kstd-supervise: ended 0")));
}

TEST_F(IdleExitTest, ArmedAlarmKeepsTheDaemonFromEnding) {
    startKernel();
    const auto supervisor = startSupervisor(1, true);
    ASSERT_TRUE(supervisor->awaitLine("Entering the main runloop."));
    kernel("publish timer-restarted alarm=4102444800");
    kernel("wait acks=1");
    sendEvent("first tick");
    ASSERT_TRUE(supervisor->awaitLine("Wisp Event: first tick"));
    // Each of these would otherwise meet another process.
    const std::size_t launches = supervisor->count("kstd-supervise: started");
    for (int i = 0; i < 20; ++i) {
        sendEvent("tick");
        ASSERT_TRUE(supervisor->awaitLine("Wisp Event: tick"));
    }
    EXPECT_EQ(supervisor->count("kstd-supervise: started"), launches);
    kernel("publish timer-restarted alarm=0");
    ASSERT_TRUE(supervisor->awaitLine("kstd-supervise: ended 0"));
}

} // namespace
} // namespace system_tests
