#include "keystrand/RestrictedModeController.h"

#include "tests/keystrand/Records.h"
#include "tests/keystrand/SetClock.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <string>

namespace keystrand::test {

namespace {

using testing::ElementsAre;
using testing::IsEmpty;

constexpr std::uint64_t kStart = 500'000;

class RecordingPoster : public EventPoster {
  public:
    bool post(std::string_view stream, std::string_view name) override {
        if (full) {
            return false;
        }
        events.push_back(std::string(stream) + " " + std::string(name));
        return true;
    }

    bool full = false;
    std::vector<std::string> events;
};

class RestrictedModeControllerTest : public testing::Test {
  protected:
    void acknowledge(const char* property) {
        static_cast<void>(registry_.copy(property));
        ASSERT_TRUE(registry_.acknowledge(property));
    }
    static StateBytes state(std::uint32_t version, std::uint64_t start, std::uint8_t locked) {
        return arrayOf<13>(Bytes().u32(version).u64(start).u8(locked));
    }
    ByteVector property(const char* name) const {
        const Registry::Property* found = registry_.find(name);
        return found == nullptr ? ByteVector() : found->value;
    }

    /// The daemon says so and has its reply.
    void daemonStarts(bool allowed, const StateBytes& handedBack) {
        controller_.daemonStarted(allowed, handedBack)();
    }

    void moveClock(Clock::Seconds time) {
        clock_.time = time;
        controller_.catchUp();
    }

    SetClock clock_{kStart};
    Registry registry_;
    RecordingPoster poster_;
    NotificationPublisher publisher_{registry_, poster_};
    RestrictedModeController controller_{
        {.untilRestricted = 100, .analytics = 86400}, clock_, registry_, publisher_};
};

TEST_F(RestrictedModeControllerTest, QuietModelGoesOnWithoutPublishing) {
    controller_.setQuiet(true);
    controller_.lock();
    moveClock(kStart + 100);
    EXPECT_TRUE(controller_.timer().restricted());
    EXPECT_THAT(poster_.events, IsEmpty());
    EXPECT_EQ(registry_.count(), 0U);
    controller_.setQuiet(false);
    controller_.unlock();
    EXPECT_FALSE(poster_.events.empty());
}

TEST_F(RestrictedModeControllerTest, LockPutsTheRecordIntoItsPropertyAndPostsItsEvent) {
    controller_.lock();
    EXPECT_EQ(property("KSTRMTimerRestarted"), timerRestarted(kStart + 100, 1, kStart, 0));
    EXPECT_THAT(poster_.events, ElementsAre("com.zerva.notifyd.matching "
                                            "com.zerva.Keystrand.KSTRMTimerRestarted"));
}

TEST_F(RestrictedModeControllerTest, RecordStaysWhenItsEventIsRefused) {
    poster_.full = true;
    controller_.lock();
    EXPECT_FALSE(property("KSTRMTimerRestarted").empty());
}

TEST_F(RestrictedModeControllerTest, ZeroStateOnlySaysWhetherItIsAllowed) {
    daemonStarts(false, state(0, 0, 0));
    EXPECT_FALSE(controller_.timer().policy().allowed);
    EXPECT_FALSE(controller_.timer().locked());
    EXPECT_THAT(poster_.events, IsEmpty());
}

TEST_F(RestrictedModeControllerTest, StateThatWasLastPublishedIsNoNews) {
    controller_.lock();
    static_cast<void>(registry_.copy("KSTRMTimerRestarted"));
    moveClock(kStart + 100);
    acknowledge("KSTRMTimerRestarted");
    acknowledge("KSTRMSaveAnalytics");
    poster_.events.clear();
    daemonStarts(true, state(1, kStart, 1));
    EXPECT_THAT(poster_.events, IsEmpty());
}

TEST_F(RestrictedModeControllerTest, AlarmOfARunningTimerIsAnnouncedToEveryDaemonThatStarts) {
    controller_.lock();
    const ByteVector record = property("KSTRMTimerRestarted");
    acknowledge("KSTRMTimerRestarted");
    poster_.events.clear();
    daemonStarts(true, state(1, kStart, 0));
    EXPECT_THAT(poster_.events,
                ElementsAre("com.zerva.notifyd.matching com.zerva.Keystrand.KSTRMTimerRestarted"));
    EXPECT_EQ(property("KSTRMTimerRestarted"), record);
    // It is there now; a second daemon is told of it as of anything unacknowledged.
    poster_.events.clear();
    daemonStarts(true, state(1, kStart, 0));
    EXPECT_EQ(poster_.events.size(), 1U);
    EXPECT_EQ(property("KSTRMTimerRestarted"), record);
}

TEST_F(RestrictedModeControllerTest, AQuietModelAnnouncesNoAlarmAgain) {
    controller_.lock();
    acknowledge("KSTRMTimerRestarted");
    poster_.events.clear();
    controller_.setQuiet(true);
    daemonStarts(true, state(1, kStart, 0));
    EXPECT_THAT(poster_.events, IsEmpty());
}

TEST_F(RestrictedModeControllerTest, StateOlderThanAWaitingRecordIsNotTakenOver) {
    controller_.lock();
    daemonStarts(true, state(1, kStart - 50, 0));
    EXPECT_EQ(controller_.timer().timerRestarted().state.standardModeStart, kStart);
}

TEST_F(RestrictedModeControllerTest, OtherStateIsTakenOverWhenNothingWaits) {
    controller_.lock();
    acknowledge("KSTRMTimerRestarted");
    daemonStarts(true, state(9, kStart - 50, 0));
    EXPECT_EQ(property("KSTRMTimerRestarted"), timerRestarted(kStart + 50, 9, kStart - 50, 0));
}

TEST_F(RestrictedModeControllerTest,
       RecordsLeftUnacknowledgedAreToldAgainOnceTheDaemonHasItsReply) {
    controller_.lock();
    moveClock(kStart + 100);
    controller_.unlock();
    poster_.events.clear();
    const auto afterwards = controller_.daemonStarted(true, {});
    EXPECT_THAT(poster_.events, IsEmpty());
    afterwards();
    EXPECT_THAT(poster_.events,
                ElementsAre("com.zerva.notifyd.matching "
                            "com.zerva.Keystrand.KSTRMTimerRestartedAnalyticsCollected",
                            "com.zerva.notifyd.matching com.zerva.Keystrand.KSTRMTimerRestarted",
                            "com.zerva.notifyd.matching com.zerva.Keystrand.KSTRMSaveAnalytics"));
}

TEST_F(RestrictedModeControllerTest, WhatIsToldAgainAnnouncesNothingAnew) {
    controller_.lock();
    moveClock(kStart + 100);
    daemonStarts(true, {});
    acknowledge("KSTRMTimerRestarted");
    acknowledge("KSTRMSaveAnalytics");
}

TEST_F(RestrictedModeControllerTest, WhatIsPublishedMeanwhileHasItsOwnEvent) {
    controller_.lock();
    const auto afterwards = controller_.daemonStarted(true, {});
    controller_.unlock();
    poster_.events.clear();
    afterwards();
    EXPECT_THAT(poster_.events, IsEmpty());
    static_cast<void>(registry_.copy("KSTRMTimerRestarted"));
    EXPECT_FALSE(registry_.acknowledge("KSTRMTimerRestarted"));
    acknowledge("KSTRMTimerRestarted");
}

TEST_F(RestrictedModeControllerTest, WhatTheStartItselfPublishesIsToldOnce) {
    daemonStarts(true, state(9, kStart - 50, 0));
    EXPECT_EQ(poster_.events.size(), registry_.count());
}

TEST_F(RestrictedModeControllerTest, FiguresOlderThanAWaitingRecordAreNotTakenOver) {
    controller_.lock();
    moveClock(kStart + 100);
    const AnalyticsFigures before = controller_.timer().figures();
    controller_.restoreAnalytics(arrayOf<32>(figuresBlob(kStart - 7, 1, 2, 0)));
    EXPECT_EQ(controller_.timer().figures(), before);
}

TEST_F(RestrictedModeControllerTest, FiguresThatWereLastPublishedAreNoNews) {
    controller_.lock();
    moveClock(kStart + 100);
    const auto published = arrayOf<32>(figuresBlob(kStart, 0, 0, kStart + 100));
    acknowledge("KSTRMSaveAnalytics");
    moveClock(kStart + 150);
    controller_.setAllowed(false);
    acknowledge("KSTRMSaveAnalytics");
    controller_.restoreAnalytics(arrayOf<32>(figuresBlob(kStart, 50, 50, 0)));
    EXPECT_EQ(controller_.timer().figures().restrictedInPeriod, 50U);
    controller_.restoreAnalytics(published);
    EXPECT_EQ(controller_.timer().figures().restrictedInPeriod, 0U);
}

TEST_F(RestrictedModeControllerTest, ManualClockFiresWhatLiesOnItsWay) {
    controller_.lock();
    moveClock(kStart + 99);
    EXPECT_FALSE(controller_.timer().restricted());
    moveClock(kStart + 100);
    EXPECT_TRUE(controller_.timer().restricted());
    EXPECT_EQ(poster_.events.size(), 3U);
}

TEST_F(RestrictedModeControllerTest, ClockSetBackFiresNothing) {
    controller_.lock();
    moveClock(1);
    EXPECT_EQ(clock_.now(), 1U);
    EXPECT_EQ(poster_.events.size(), 1U);
}

TEST_F(RestrictedModeControllerTest, RearmsOnEveryChangeOfTheDeadline) {
    std::vector<std::uint64_t> deadlines;
    controller_.setRearm([&] { deadlines.push_back(controller_.timer().nextDeadline()); });
    controller_.lock();
    controller_.setBootArg(true);
    controller_.setBootArg(false);
    controller_.unlock();
    EXPECT_THAT(deadlines, ElementsAre(kStart + 86400, kStart + 100, kStart + 86400, kStart + 100,
                                       kStart + 86400));
}

TEST(SystemClockTest, IsFarBeyondTheYear2020) {
    EXPECT_GT(SystemClock().now(), 1'600'000'000U);
}

} // namespace

} // namespace keystrand::test
