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

    void moveClock(ModelClock::Seconds time) {
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
    RestrictedModeController::Hooks hooks;
    hooks.rearm = [&] {
        deadlines.push_back(controller_.nextDeadline());
    };
    controller_.setHooks(hooks);
    controller_.lock();
    controller_.setBootArg(true);
    controller_.setBootArg(false);
    controller_.unlock();
    EXPECT_THAT(deadlines, ElementsAre(kStart + 86400, kStart + 100, kStart + 86400, kStart + 100,
                                       kStart + 86400));
}

/// What the hooks were told, in words, and what the records said then.
class HooksTest : public RestrictedModeControllerTest {
  protected:
    using Seconds = RestrictedModeController::Seconds;
    static constexpr Seconds kPatience = 30;

    void listen(Seconds patience = kPatience) {
        RestrictedModeController::Hooks hooks;
        hooks.restrictedModeChanged = [this](bool restricted) {
            told_.push_back(restricted ? "restricted" : "open");
            publishedBefore_ = publisher_.publishedCount();
        };
        hooks.daemonStarted = [this](bool allowed, const StateBytes& state) {
            told_.push_back(allowed ? "daemon, allowed" : "daemon, not allowed");
            handedBack_ = state;
        };
        hooks.acknowledged = [this](const Registry::Record& record) {
            told_.push_back("acknowledged " + record.name);
        };
        hooks.unacknowledged = [this](const Registry::Record& record) {
            told_.push_back("waits " + record.name);
        };
        hooks.patience = patience;
        controller_.setHooks(hooks);
    }
    /// The daemon reads a property and acknowledges it.
    void daemonHandles(const char* property) {
        static_cast<void>(registry_.copy(property));
        controller_.acknowledge(property);
    }

    std::vector<std::string> told_;
    std::uint64_t publishedBefore_ = 0;
    StateBytes handedBack_{};
};

TEST_F(HooksTest, NoHookIsNeeded) {
    controller_.setHooks({});
    controller_.lock();
    moveClock(kStart + 100);
    daemonStarts(true, {});
    daemonHandles("KSTRMTimerRestarted");
    EXPECT_EQ(registry_.find("KSTRMTimerRestarted"), nullptr);
}

TEST_F(HooksTest, ProgramIsToldOfRestrictedModeBeforeAnyRecordSaysSo) {
    listen(RestrictedModeController::kForever);
    controller_.lock();
    moveClock(kStart + 99);
    EXPECT_THAT(told_, IsEmpty());
    const std::uint64_t published = publisher_.publishedCount();
    moveClock(kStart + 100);
    EXPECT_THAT(told_, ElementsAre("restricted"));
    EXPECT_EQ(publishedBefore_, published);
    moveClock(kStart + 101);
    controller_.unlock();
    EXPECT_THAT(told_, ElementsAre("restricted", "open"));
}

TEST_F(HooksTest, PolicyThatGoesOffOpensAndThatComesBackCloses) {
    listen(RestrictedModeController::kForever);
    controller_.lock();
    moveClock(kStart + 100);
    controller_.setAllowed(false);
    controller_.setAllowed(true);
    EXPECT_THAT(told_, ElementsAre("restricted", "open", "restricted"));
}

TEST_F(HooksTest, StayThatBeginsAndEndsInOneStepIsNone) {
    listen(RestrictedModeController::kForever);
    controller_.lock();
    clock_.time = kStart + 100;
    controller_.unlock();
    EXPECT_THAT(told_, IsEmpty());
}

TEST_F(HooksTest, QuietModelTellsTheProgramAllTheSame) {
    listen();
    controller_.setQuiet(true);
    controller_.lock();
    moveClock(kStart + 100);
    moveClock(kStart + 100 + kPatience);
    EXPECT_THAT(told_, ElementsAre("restricted"));
}

TEST_F(HooksTest, ProgramIsToldWhatADaemonHandedBackOnceItIsTakenUp) {
    listen();
    const auto afterwards = controller_.daemonStarted(true, state(1, kStart - 500, 1));
    EXPECT_THAT(told_, ElementsAre("restricted", "daemon, allowed"));
    EXPECT_EQ(handedBack_, state(1, kStart - 500, 1));
    afterwards();
    daemonStarts(false, {});
    EXPECT_THAT(told_, ElementsAre("restricted", "daemon, allowed", "open", "daemon, not allowed"));
    EXPECT_EQ(handedBack_, StateBytes{});
}

TEST_F(HooksTest, ProgramIsToldOfRecordsThatAnAcknowledgementDropped) {
    listen();
    controller_.lock();
    controller_.acknowledge("KSTRMTimerRestarted");
    controller_.acknowledge("nothing");
    EXPECT_THAT(told_, IsEmpty());
    daemonHandles("KSTRMTimerRestarted");
    EXPECT_THAT(told_, ElementsAre("acknowledged KSTRMTimerRestarted"));
    controller_.acknowledge("KSTRMTimerRestarted");
    EXPECT_EQ(told_.size(), 1U);
}

TEST_F(HooksTest, ProgramIsToldOnceOfARecordThatWaitedTooLong) {
    listen();
    controller_.lock();
    EXPECT_EQ(controller_.nextDeadline(), kStart + kPatience);
    moveClock(kStart + kPatience - 1);
    EXPECT_THAT(told_, IsEmpty());
    moveClock(kStart + kPatience);
    EXPECT_THAT(told_, ElementsAre("waits KSTRMTimerRestarted"));
    EXPECT_EQ(controller_.nextDeadline(), kStart + 100);
    moveClock(kStart + kPatience + 1);
    EXPECT_EQ(told_.size(), 1U);
}

TEST_F(HooksTest, RecordThatWasAcknowledgedInTimeDoesNotWait) {
    listen();
    controller_.lock();
    daemonHandles("KSTRMTimerRestarted");
    EXPECT_EQ(controller_.nextDeadline(), kStart + 100);
    moveClock(kStart + kPatience);
    EXPECT_THAT(told_, ElementsAre("acknowledged KSTRMTimerRestarted"));
}

TEST_F(HooksTest, NewerRecordWaitsAnew) {
    listen();
    controller_.lock();
    moveClock(kStart + kPatience - 1);
    controller_.setBootArg(true);
    moveClock(kStart + kPatience);
    EXPECT_THAT(told_, IsEmpty());
    moveClock(kStart + kPatience - 1 + kPatience);
    EXPECT_THAT(told_, ElementsAre("waits KSTRMTimerRestarted"));
}

TEST_F(HooksTest, RecordThatIsToldAgainToADaemonWaitsAnew) {
    listen();
    controller_.lock();
    moveClock(kStart + kPatience - 1);
    daemonStarts(true, {});
    told_.clear();
    moveClock(kStart + kPatience);
    EXPECT_THAT(told_, IsEmpty());
    moveClock(kStart + kPatience - 1 + kPatience);
    EXPECT_THAT(told_, ElementsAre("waits KSTRMTimerRestarted"));
}

TEST_F(HooksTest, WhatOthersPutInItsPlaceIsNotWaitedFor) {
    listen();
    controller_.lock();
    ASSERT_TRUE(registry_.set("KSTRMTimerRestarted", ByteVector{1}));
    moveClock(kStart + kPatience);
    EXPECT_THAT(told_, IsEmpty());
}

TEST_F(HooksTest, PatienceThatNeverEndsAsksForNoDeadline) {
    listen(RestrictedModeController::kForever);
    controller_.lock();
    EXPECT_EQ(controller_.nextDeadline(), kStart + 100);
    listen(RestrictedModeController::kForever - 1);
    controller_.setBootArg(true);
    moveClock(kStart + 86399);
    EXPECT_THAT(told_, IsEmpty());
}

TEST(SystemClockTest, IsFarBeyondTheYear2020) {
    EXPECT_GT(DateClock().now(), 1'600'000'000U);
}

} // namespace

} // namespace keystrand::test
