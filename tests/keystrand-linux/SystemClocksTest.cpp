#include "keystrand-linux/SystemClocks.h"

#include "tests/keystrand/LoopTurns.h"

#include <gtest/gtest.h>

#include <ctime>

namespace keystrand::usb {
namespace {

timespec timeOf(clockid_t clock) {
    timespec now{};
    EXPECT_EQ(::clock_gettime(clock, &now), 0);
    return now;
}

TEST(SystemClocksTest, ShowWhatTheMachinesClocksShow) {
    const SystemClocks clocks;
    const std::int64_t wallBefore = timeOf(CLOCK_REALTIME).tv_sec;
    const timespec before = timeOf(CLOCK_BOOTTIME);
    const BootTime sinceStart = clocks.sinceStart();
    const std::int64_t wall = clocks.wall() / std::chrono::seconds(1);
    const timespec after = timeOf(CLOCK_BOOTTIME);
    const std::int64_t wallAfter = timeOf(CLOCK_REALTIME).tv_sec;
    const auto microseconds = [](const timespec& time) {
        return BootTime(time.tv_sec * 1'000'000 + time.tv_nsec / 1000);
    };
    EXPECT_GE(sinceStart, microseconds(before));
    EXPECT_LE(sinceStart, microseconds(after));
    // Another test may set the date meanwhile, to what it showed a moment before.
    EXPECT_GE(wall, wallBefore - 1);
    EXPECT_LE(wall, wallAfter + 1);
}

class DateWatchTest : public testing::Test {
  protected:
    static bool setDate() {
        // To what it shows: a step like any other.
        const timespec now = timeOf(CLOCK_REALTIME);
        return ::clock_settime(CLOCK_REALTIME, &now) == 0;
    }

    std::unique_ptr<EventLoop> loop = EventLoop::create();
    int told = 0;
};

TEST_F(DateWatchTest, DateThatIsSetIsToldEachTime) {
    const DateWatch watch(*loop, [this] { ++told; });
    ASSERT_TRUE(watch.isWatching());
    for (int time = 1; time <= 3; ++time) {
        if (!setDate()) {
            GTEST_SKIP() << "needs the right to set the clock";
        }
        EXPECT_TRUE(turnUntil(*loop, [&] { return told >= time; }));
    }
}

TEST_F(DateWatchTest, WatchMayEndWithinTheCall) {
    std::optional<DateWatch> watch;
    watch.emplace(*loop, [&] {
        ++told;
        watch.reset();
    });
    if (!setDate()) {
        GTEST_SKIP() << "needs the right to set the clock";
    }
    EXPECT_TRUE(turnUntil(*loop, [&] { return told > 0; }));
    ASSERT_TRUE(setDate());
    turnAll(*loop);
    EXPECT_EQ(told, 1);
}

} // namespace
} // namespace keystrand::usb
