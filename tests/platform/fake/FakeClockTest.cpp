#include "platform/fake/FakeClock.h"

#include <gtest/gtest.h>

#include <thread>

namespace {

using platform::Date;
using platform::FakeClock;

TEST(FakeClockTest, StandsStillUntilMoved) {
    FakeClock clock;
    EXPECT_EQ(clock.now(), FakeClock::kStart);
    EXPECT_EQ(clock.now(), FakeClock::kStart);
    clock.advance(5);
    EXPECT_EQ(clock.now(), Date{FakeClock::kStart.nanosecondsSince1970 + 5});
    clock.set(Date{-3});
    EXPECT_EQ(clock.now(), Date{-3});
    clock.advance(-4);
    EXPECT_EQ(clock.now(), Date{-7});
}

TEST(FakeClockTest, WaitsForwardsOnly) {
    FakeClock clock;
    clock.set(Date{10});
    clock.waitUntil(Date{9});
    EXPECT_EQ(clock.now(), Date{10});
    clock.waitUntil(Date{11});
    EXPECT_EQ(clock.now(), Date{11});
}

TEST(FakeClockTest, AdvancesNoFurtherThanTheDistantFuture) {
    FakeClock clock;
    clock.set(Date{platform::kDistantFuture.nanosecondsSince1970 - 1});
    clock.advance(1);
    EXPECT_EQ(clock.now(), platform::kDistantFuture);
    clock.advance(1);
    EXPECT_EQ(clock.now(), platform::kDistantFuture);
}

TEST(FakeClockTest, IsMovedByTwoThreads) {
    FakeClock clock;
    clock.set(Date{0});
    const auto advance = [&clock] {
        for (int i = 0; i < 1000; ++i) {
            clock.advance(1);
        }
    };
    std::thread other(advance);
    advance();
    other.join();
    EXPECT_EQ(clock.now(), Date{2000});
}

} // namespace
