#include "platform/fake/FakeEventHost.h"

#include <gmock/gmock.h>

#include <memory>
#include <string>
#include <vector>

namespace {

using platform::Date;
using platform::Event;
using platform::EventDictionary;
using platform::FakeAlarmStore;
using platform::FakeClock;
using platform::FakeEventHost;
using platform::kAlarmDateKey;
using platform::kDistantFuture;
using testing::ElementsAre;
using testing::IsEmpty;
using testing::Optional;

constexpr char kStream[] = "com.zerva.notifyd.matching";
constexpr char kAlarms[] = "com.zerva.alarm";

class FakeEventHostTest : public testing::Test {
  protected:
    FakeEventHostTest() {
        listen(host_, kStream);
        listen(host_, kAlarms);
    }

    void listen(FakeEventHost& host, const char* stream) {
        host.events().setHandler(stream,
                                 [this](const Event& event) { delivered_.push_back(event.name); });
    }

    bool run(Date deadline = kDistantFuture) { return host_.runLoop().runOnce(deadline); }

    void setAlarm(const std::string& name, Date date) {
        const EventDictionary dictionary = {{kAlarmDateKey, date}};
        host_.alarms().set(kAlarms, name, &dictionary);
    }

    [[nodiscard]] Date in(std::int64_t nanoseconds) const {
        return {FakeClock::kStart.nanosecondsSince1970 + nanoseconds};
    }

    FakeClock clock_;
    FakeAlarmStore store_;
    FakeEventHost host_{clock_, store_};
    std::vector<std::string> delivered_;
};

TEST_F(FakeEventHostTest, OneEventIsDeliveredATurn) {
    host_.post(kStream, "1");
    host_.post(kStream, "2");
    EXPECT_TRUE(run());
    EXPECT_THAT(delivered_, ElementsAre("1"));
    EXPECT_TRUE(run());
    EXPECT_THAT(delivered_, ElementsAre("1", "2"));
}

TEST_F(FakeEventHostTest, DeliveringTakesNoTime) {
    host_.post(kStream, "1");
    EXPECT_TRUE(run(in(100)));
    EXPECT_EQ(clock_.now(), FakeClock::kStart);
}

TEST_F(FakeEventHostTest, ClockJumpsToTheDeadline) {
    EXPECT_TRUE(run(in(100)));
    EXPECT_EQ(clock_.now(), in(100));
}

TEST_F(FakeEventHostTest, ClockJumpsToTheAlarmBeforeTheDeadline) {
    setAlarm("alarm", in(60));
    EXPECT_TRUE(run(in(100)));
    EXPECT_EQ(clock_.now(), in(60));
    EXPECT_THAT(delivered_, ElementsAre("alarm"));
}

TEST_F(FakeEventHostTest, ClockJumpsNoFurtherThanTheDeadline) {
    setAlarm("alarm", in(60));
    EXPECT_TRUE(run(in(59)));
    EXPECT_EQ(clock_.now(), in(59));
    EXPECT_THAT(delivered_, IsEmpty());
    EXPECT_TRUE(run(in(60)));
    EXPECT_THAT(delivered_, ElementsAre("alarm"));
}

TEST_F(FakeEventHostTest, ClockSetForwardsMakesAnAlarmDue) {
    setAlarm("alarm", in(60));
    clock_.set(in(1000));
    EXPECT_TRUE(run(Date{0}));
    EXPECT_THAT(delivered_, ElementsAre("alarm"));
    EXPECT_EQ(clock_.now(), in(1000));
}

TEST_F(FakeEventHostTest, ClockSetBackwardsPutsAnAlarmOff) {
    setAlarm("alarm", in(60));
    clock_.set(in(-1000));
    EXPECT_TRUE(run(in(59)));
    EXPECT_THAT(delivered_, IsEmpty());
    EXPECT_TRUE(run());
    EXPECT_THAT(delivered_, ElementsAre("alarm"));
    EXPECT_EQ(clock_.now(), in(60));
}

TEST_F(FakeEventHostTest, LatestDateIsDueWhenTheClockStandsThere) {
    setAlarm("alarm", kDistantFuture);
    clock_.set(kDistantFuture);
    EXPECT_TRUE(run());
    EXPECT_THAT(delivered_, ElementsAre("alarm"));
}

TEST_F(FakeEventHostTest, StoreShowsWhatIsRegistered) {
    EXPECT_EQ(store_.date(kAlarms, "alarm"), std::nullopt);
    setAlarm("alarm", in(60));
    EXPECT_THAT(store_.date(kAlarms, "alarm"), Optional(in(60)));
    setAlarm("alarm", in(70));
    EXPECT_THAT(store_.date(kAlarms, "alarm"), Optional(in(70)));
    host_.alarms().set(kAlarms, "alarm", nullptr);
    EXPECT_EQ(store_.date(kAlarms, "alarm"), std::nullopt);
}

TEST_F(FakeEventHostTest, RegistrationLastsUntilItsHandlerHasReturned) {
    bool registered = false;
    host_.events().setHandler(
        kAlarms, [&](const Event&) { registered = store_.date(kAlarms, "alarm").has_value(); });
    setAlarm("alarm", in(60));
    EXPECT_TRUE(run());
    EXPECT_TRUE(registered);
    EXPECT_EQ(store_.date(kAlarms, "alarm"), std::nullopt);
}

TEST_F(FakeEventHostTest, AlarmThatBecameDueWhileNobodyRanComesToTheNextProcess) {
    setAlarm("alarm", in(60));
    clock_.advance(1000);
    FakeEventHost next(clock_, store_);
    EXPECT_TRUE(next.runLoop().runOnce(in(1000))) << "the alarm waits for its stream's handler";
    EXPECT_THAT(delivered_, IsEmpty());
    listen(next, kAlarms);
    EXPECT_TRUE(next.runLoop().runOnce(kDistantFuture));
    EXPECT_THAT(delivered_, ElementsAre("alarm"));
    EXPECT_EQ(clock_.now(), in(1000));
}

TEST_F(FakeEventHostTest, ClosedSourcesDeliverNothingMore) {
    host_.post(kStream, "queued");
    host_.closeSources();
    EXPECT_FALSE(run());
    EXPECT_THAT(delivered_, IsEmpty());
}

TEST_F(FakeEventHostTest, IdleHookMayPost) {
    host_.runLoop().onIdle([this] { host_.post(kStream, "from the hook"); });
    EXPECT_TRUE(run());
    EXPECT_THAT(delivered_, ElementsAre("from the hook"));
}

TEST_F(FakeEventHostTest, IdleHookMayCloseTheSources) {
    host_.runLoop().onIdle([this] { host_.closeSources(); });
    EXPECT_TRUE(run());
    EXPECT_FALSE(run());
}

TEST_F(FakeEventHostTest, IdleHookMaySetAnAlarm) {
    host_.runLoop().onIdle([this] { setAlarm("alarm", in(60)); });
    EXPECT_TRUE(run());
    EXPECT_TRUE(run());
    EXPECT_THAT(delivered_, ElementsAre("alarm"));
}

TEST_F(FakeEventHostTest, IdleHookMayReplaceItself) {
    host_.runLoop().onIdle([this, name = std::string("first")] {
        host_.runLoop().onIdle([this] { host_.closeSources(); });
        host_.post(kStream, name);
    });
    while (run()) {
    }
    EXPECT_THAT(delivered_, ElementsAre("first"));
}

TEST_F(FakeEventHostTest, IdleHookIsNotCalledWhileThereIsSomethingToWaitFor) {
    host_.runLoop().onIdle([] { FAIL() << "the loop is not idle"; });
    setAlarm("alarm", in(60));
    EXPECT_TRUE(run());
    EXPECT_TRUE(run(in(100)));
}

TEST_F(FakeEventHostTest, HandlerMayHoldATransactionToTheEnd) {
    FakeEventHost host(clock_, store_);
    host.events().setHandler(kStream,
                             [held = std::make_shared<platform::ProcessTransaction>(
                                  host.transactions(), "held by a handler")](const Event&) {});
    EXPECT_EQ(host.transactions().count(), 1U);
    // At the end the handler goes first; a count that went before it would stop the test.
}

using FakeEventHostDeathTest = FakeEventHostTest;

TEST_F(FakeEventHostDeathTest, WaitingForEverIsAnErrorInTheTest) {
    EXPECT_DEATH(static_cast<void>(run()), "error in the test: the run loop would wait for ever");
    setAlarm("alarm", kDistantFuture);
    EXPECT_DEATH(static_cast<void>(run()), "error in the test: the run loop would wait for ever");
}

TEST_F(FakeEventHostDeathTest, IdleHookThatDoesNothingIsAnErrorInTheTest) {
    host_.runLoop().onIdle([] {});
    EXPECT_DEATH(static_cast<void>(run()), "error in the test: the idle hook has given");
}

TEST_F(FakeEventHostTest, TransactionsAreRemembered) {
    host_.transactions().begin("a");
    host_.transactions().begin("b");
    host_.transactions().end("a");
    EXPECT_EQ(host_.transactions().count(), 1U);
    EXPECT_THAT(host_.transactions().open(), ElementsAre("b"));
    EXPECT_THAT(host_.transactions().begun(), ElementsAre("a", "b"));
}

TEST_F(FakeEventHostDeathTest, EndingATransactionThatDidNotBeginIsAnError) {
    host_.transactions().begin("a");
    EXPECT_DEATH(host_.transactions().end("b"), "the transaction \"b\" was ended and never begun");
}

} // namespace
