#include "tests/platform/contract/EventHostContract.h"

#include <gmock/gmock.h>

#include <limits>
#include <memory>
#include <optional>

namespace contract {

namespace {

using platform::Date;
using platform::Event;
using platform::EventDictionary;
using platform::kAlarmDateKey;
using platform::kDistantFuture;
using platform::kNanosecondsPerSecond;
using testing::ElementsAre;
using testing::IsEmpty;

constexpr char kNotifyd[] = "com.zerva.notifyd.matching";
constexpr char kCorvid[] = "com.zerva.corvid.matching";
constexpr char kAlarms[] = "com.zerva.alarm";
constexpr char kDrained[] = "drained";

constexpr std::int64_t kMilliseconds = 1'000'000;
constexpr std::int64_t kSoon = 20 * kMilliseconds;
constexpr std::int64_t kLater = 60 * kMilliseconds;

/// What an implementation may take for anything: long enough for the slowest machine.
constexpr std::int64_t kTooLong = 20 * kNanosecondsPerSecond;

Date after(Date date, std::int64_t nanoseconds) {
    return {date.nanosecondsSince1970 + nanoseconds};
}

} // namespace

void EventHostContract::listen(std::string_view stream) {
    fixture().events().setHandler(stream, [this](const Event& event) {
        delivered.push_back(event.stream + "/" + event.name);
    });
}

void EventHostContract::setAlarm(std::string_view event, std::int64_t nanoseconds) {
    setAlarmAt(event, after(fixture().now(), nanoseconds));
}

void EventHostContract::setAlarmAt(std::string_view event, Date date) {
    const EventDictionary dictionary = {{kAlarmDateKey, date}};
    fixture().alarms().set(kAlarms, event, &dictionary);
}

void EventHostContract::cancelAlarm(std::string_view event) {
    fixture().alarms().set(kAlarms, event, nullptr);
}

bool EventHostContract::runUntil(const std::function<bool()>& done) {
    const Date limit = after(fixture().now(), kTooLong);
    while (!done()) {
        if (fixture().now() >= limit || !fixture().runLoop().runOnce(limit)) {
            return false;
        }
    }
    return true;
}

bool EventHostContract::runUntilDelivered(std::size_t count) {
    return runUntil([this, count] { return delivered.size() >= count; });
}

void EventHostContract::drain() {
    bool drained = false;
    fixture().events().setHandler(
        kCorvid, [&drained](const Event& event) { drained = drained || event.name == kDrained; });
    post(kCorvid, kDrained);
    ASSERT_TRUE(runUntil([&drained] { return drained; }));
    fixture().events().setHandler(kCorvid, nullptr);
}

void EventHostContract::runFor(std::int64_t nanoseconds) {
    const Date end = after(fixture().now(), nanoseconds);
    while (fixture().now() < end) {
        ASSERT_TRUE(fixture().runLoop().runOnce(end));
    }
}

TEST_P(EventHostContract, EventReachesTheHandlerOfItsStream) {
    listen(kNotifyd);
    listen(kCorvid);
    post(kCorvid, "com.zerva.any");
    ASSERT_TRUE(runUntilDelivered(1));
    EXPECT_THAT(delivered, ElementsAre("com.zerva.corvid.matching/com.zerva.any"));
}

TEST_P(EventHostContract, EventsComeInTheOrderOfTheirArrivalOverAllStreams) {
    listen(kNotifyd);
    listen(kCorvid);
    post(kNotifyd, "1");
    post(kCorvid, "2");
    post(kNotifyd, "3");
    post(kCorvid, "4");
    ASSERT_TRUE(runUntilDelivered(4));
    EXPECT_THAT(delivered,
                ElementsAre("com.zerva.notifyd.matching/1", "com.zerva.corvid.matching/2",
                            "com.zerva.notifyd.matching/3", "com.zerva.corvid.matching/4"));
}

TEST_P(EventHostContract, EventOfTheSameNameComesAsOftenAsItWasPosted) {
    listen(kNotifyd);
    for (int i = 0; i < 5; ++i) {
        post(kNotifyd, "again");
    }
    ASSERT_TRUE(runUntilDelivered(5));
    drain();
    EXPECT_EQ(delivered.size(), 5U);
}

TEST_P(EventHostContract, EventQueuedBeforeItsHandlerIsDelivered) {
    post(kNotifyd, "early");
    listen(kNotifyd);
    ASSERT_TRUE(runUntilDelivered(1));
    EXPECT_THAT(delivered, ElementsAre("com.zerva.notifyd.matching/early"));
}

TEST_P(EventHostContract, NothingIsDeliveredOutsideTheRunLoop) {
    listen(kNotifyd);
    listen(kAlarms);
    post(kNotifyd, "event");
    setAlarm("alarm", -1);
    EXPECT_THAT(delivered, IsEmpty());
    ASSERT_TRUE(runUntilDelivered(2));
}

TEST_P(EventHostContract, SecondHandlerReplacesTheFirst) {
    const auto held = std::make_shared<int>(0);
    fixture().events().setHandler(kNotifyd, [held](const Event&) { ++*held; });
    listen(kNotifyd);
    EXPECT_EQ(held.use_count(), 1) << "the replaced handler is still held";
    post(kNotifyd, "event");
    ASSERT_TRUE(runUntilDelivered(1));
    EXPECT_EQ(*held, 0);
}

TEST_P(EventHostContract, HandlerMayReplaceItselfAndPost) {
    fixture().events().setHandler(kNotifyd, [this](const Event&) {
        listen(kNotifyd);
        post(kNotifyd, "from the handler");
    });
    post(kNotifyd, "first");
    ASSERT_TRUE(runUntilDelivered(1));
    EXPECT_THAT(delivered, ElementsAre("com.zerva.notifyd.matching/from the handler"));
}

TEST_P(EventHostContract, EventWithoutHandlerHoldsUpNothing) {
    listen(kNotifyd);
    post(kCorvid, "nobody listens");
    post(kNotifyd, "next");
    ASSERT_TRUE(runUntilDelivered(1));
    EXPECT_THAT(delivered, ElementsAre("com.zerva.notifyd.matching/next"));
}

TEST_P(EventHostContract, DeadlineEndsAWaitWithoutEvents) {
    listen(kNotifyd);
    const Date deadline = after(fixture().now(), kSoon);
    runFor(kSoon);
    EXPECT_GE(fixture().now(), deadline);
    EXPECT_THAT(delivered, IsEmpty());
}

TEST_P(EventHostContract, PastDeadlineStillRuns) {
    EXPECT_TRUE(fixture().runLoop().runOnce(Date{0}));
    EXPECT_TRUE(fixture().runLoop().runOnce(Date{std::numeric_limits<std::int64_t>::min()}));
    EXPECT_TRUE(fixture().runLoop().runOnce(fixture().now()));
}

TEST_P(EventHostContract, LoopWithoutSourcesCannotBeRun) {
    listen(kNotifyd);
    fixture().closeSources();
    EXPECT_FALSE(fixture().runLoop().runOnce(kDistantFuture));
    EXPECT_FALSE(fixture().runLoop().runOnce(Date{0}));
}

TEST_P(EventHostContract, SourcesMayBeClosedFromAHandler) {
    fixture().events().setHandler(kNotifyd, [this](const Event& event) {
        delivered.push_back(event.name);
        fixture().closeSources();
    });
    post(kNotifyd, "last");
    ASSERT_TRUE(runUntilDelivered(1));
    EXPECT_FALSE(fixture().runLoop().runOnce(kDistantFuture));
}

TEST_P(EventHostContract, AlarmComesAtItsDateAndOnce) {
    listen(kAlarms);
    const Date date = after(fixture().now(), kSoon);
    setAlarmAt("alarm", date);
    ASSERT_TRUE(runUntilDelivered(1));
    EXPECT_GE(fixture().now(), date);
    runFor(kSoon);
    EXPECT_THAT(delivered, ElementsAre("com.zerva.alarm/alarm"));
}

TEST_P(EventHostContract, PastAlarmComesAtOnceAndOnce) {
    for (const Date date : {after(fixture().now(), -1), Date{0}, Date{-1},
                            Date{std::numeric_limits<std::int64_t>::min()}}) {
        delivered.clear();
        listen(kAlarms);
        setAlarmAt("alarm", date);
        ASSERT_TRUE(runUntilDelivered(1)) << date.nanosecondsSince1970;
        drain();
        EXPECT_THAT(delivered, ElementsAre("com.zerva.alarm/alarm"));
    }
}

TEST_P(EventHostContract, AlarmsComeInTheOrderOfTheirDates) {
    listen(kAlarms);
    // Both must be set before one is due, however slow the machine is.
    Date base{};
    do {
        drain();
        delivered.clear();
        base = fixture().now();
        setAlarmAt("later", after(base, kLater));
        setAlarmAt("sooner", after(base, kSoon));
    } while (!(fixture().now() < after(base, kSoon)));
    ASSERT_TRUE(runUntilDelivered(2));
    EXPECT_THAT(delivered, ElementsAre("com.zerva.alarm/sooner", "com.zerva.alarm/later"));
}

TEST_P(EventHostContract, FarAlarmsAreHeld) {
    listen(kAlarms);
    constexpr std::int64_t kLatest = std::numeric_limits<std::int64_t>::max();
    for (const std::int64_t date :
         {kLatest, kLatest - 1, kLatest / kNanosecondsPerSecond * kNanosecondsPerSecond}) {
        setAlarmAt("far", Date{date});
        runFor(kSoon);
        drain();
        EXPECT_THAT(delivered, IsEmpty());
    }
    cancelAlarm("far");
    setAlarm("near", kSoon);
    ASSERT_TRUE(runUntilDelivered(1));
    EXPECT_THAT(delivered, ElementsAre("com.zerva.alarm/near"));
}

TEST_P(EventHostContract, CancelledAlarmDoesNotCome) {
    listen(kAlarms);
    setAlarm("cancelled", kSoon);
    cancelAlarm("cancelled");
    setAlarm("kept", kLater);
    ASSERT_TRUE(runUntilDelivered(1));
    EXPECT_THAT(delivered, ElementsAre("com.zerva.alarm/kept"));
}

TEST_P(EventHostContract, DictionaryWithoutADateCancels) {
    listen(kAlarms);
    setAlarm("cancelled", kSoon);
    const EventDictionary dictionary = {{"date", fixture().now()}};
    fixture().alarms().set(kAlarms, "cancelled", &dictionary);
    setAlarm("kept", kLater);
    ASSERT_TRUE(runUntilDelivered(1));
    EXPECT_THAT(delivered, ElementsAre("com.zerva.alarm/kept"));
}

TEST_P(EventHostContract, CancellingWhatIsNotRegisteredDoesNothing) {
    listen(kAlarms);
    cancelAlarm("never registered");
    cancelAlarm("never registered");
    drain();
    EXPECT_THAT(delivered, IsEmpty());
}

TEST_P(EventHostContract, LaterRegistrationReplacesTheEarlier) {
    listen(kAlarms);
    setAlarm("alarm", kSoon);
    const Date date = after(fixture().now(), kLater);
    setAlarmAt("alarm", date);
    ASSERT_TRUE(runUntilDelivered(1));
    EXPECT_GE(fixture().now(), date);
    runFor(kSoon);
    EXPECT_EQ(delivered.size(), 1U);
}

TEST_P(EventHostContract, EarlierRegistrationReplacesTheLater) {
    listen(kAlarms);
    setAlarmAt("alarm", kDistantFuture);
    setAlarm("alarm", kSoon);
    ASSERT_TRUE(runUntilDelivered(1));
    EXPECT_THAT(delivered, ElementsAre("com.zerva.alarm/alarm"));
}

TEST_P(EventHostContract, UndeliveredEventOfAReplacedAlarmIsDropped) {
    listen(kAlarms);
    setAlarm("alarm", -1);
    setAlarmAt("alarm", kDistantFuture);
    drain();
    EXPECT_THAT(delivered, IsEmpty());
    cancelAlarm("alarm");
}

TEST_P(EventHostContract, UndeliveredEventOfACancelledAlarmIsDropped) {
    listen(kAlarms);
    setAlarm("alarm", -1);
    cancelAlarm("alarm");
    drain();
    EXPECT_THAT(delivered, IsEmpty());
}

TEST_P(EventHostContract, AlarmsOfOtherNamesAreLeftAlone) {
    listen(kAlarms);
    setAlarm("one", -1);
    setAlarm("two", -1);
    cancelAlarm("one");
    ASSERT_TRUE(runUntilDelivered(1));
    drain();
    EXPECT_THAT(delivered, ElementsAre("com.zerva.alarm/two"));
}

TEST_P(EventHostContract, AlarmMayBeRegisteredAnewFromItsHandler) {
    fixture().events().setHandler(kAlarms, [this](const Event& event) {
        delivered.push_back(event.name);
        if (delivered.size() < 3) {
            setAlarm("alarm", kMilliseconds);
        } else {
            cancelAlarm("alarm");
        }
    });
    setAlarm("alarm", kMilliseconds);
    ASSERT_TRUE(runUntilDelivered(3));
    runFor(kSoon);
    EXPECT_EQ(delivered.size(), 3U);
}

TEST_P(EventHostContract, DueAlarmMayBeRegisteredAnewFromItsHandler) {
    fixture().events().setHandler(kAlarms, [this](const Event& event) {
        delivered.push_back(event.name);
        if (delivered.size() < 3) {
            setAlarm("alarm", -1);
        }
    });
    setAlarm("alarm", -1);
    ASSERT_TRUE(runUntilDelivered(3));
    drain();
    EXPECT_EQ(delivered.size(), 3U);
}

TEST_P(EventHostContract, AlarmIsKeptForTheNextProcess) {
    listen(kAlarms);
    setAlarm("alarm", kSoon);
    fixture().restart();
    listen(kAlarms);
    ASSERT_TRUE(runUntilDelivered(1));
    EXPECT_THAT(delivered, ElementsAre("com.zerva.alarm/alarm"));
}

TEST_P(EventHostContract, AlarmThatWasNotDeliveredComesToTheNextProcess) {
    listen(kAlarms);
    setAlarm("alarm", -1);
    fixture().restart();
    listen(kAlarms);
    ASSERT_TRUE(runUntilDelivered(1));
    drain();
    EXPECT_THAT(delivered, ElementsAre("com.zerva.alarm/alarm"));
}

TEST_P(EventHostContract, KeptAlarmCanBeCancelledByTheNextProcess) {
    listen(kAlarms);
    setAlarm("alarm", kSoon);
    fixture().restart();
    listen(kAlarms);
    cancelAlarm("alarm");
    runFor(kLater);
    fixture().restart();
    listen(kAlarms);
    drain();
    EXPECT_THAT(delivered, IsEmpty());
}

TEST_P(EventHostContract, KeptAlarmIsReplacedByTheNextProcess) {
    setAlarm("alarm", -1);
    fixture().restart();
    setAlarmAt("alarm", kDistantFuture);
    listen(kAlarms);
    drain();
    EXPECT_THAT(delivered, IsEmpty());
    cancelAlarm("alarm");
}

TEST_P(EventHostContract, DeliveredAlarmDoesNotComeToTheNextProcess) {
    listen(kAlarms);
    setAlarm("alarm", -1);
    ASSERT_TRUE(runUntilDelivered(1));
    fixture().restart();
    listen(kAlarms);
    drain();
    EXPECT_EQ(delivered.size(), 1U);
}

TEST_P(EventHostContract, CancelledAlarmDoesNotComeToTheNextProcess) {
    listen(kAlarms);
    setAlarm("alarm", -1);
    cancelAlarm("alarm");
    fixture().restart();
    listen(kAlarms);
    drain();
    EXPECT_THAT(delivered, IsEmpty());
}

TEST_P(EventHostContract, TransactionsAreCounted) {
    platform::ProcessTransactions& transactions = fixture().transactions();
    EXPECT_FALSE(fixture().hasTransactions());
    {
        const platform::ProcessTransaction outer(transactions, "outer");
        EXPECT_TRUE(fixture().hasTransactions());
        {
            const platform::ProcessTransaction inner(transactions, "inner");
            EXPECT_TRUE(fixture().hasTransactions());
        }
        EXPECT_TRUE(fixture().hasTransactions());
    }
    EXPECT_FALSE(fixture().hasTransactions());
}

TEST_P(EventHostContract, TransactionsOfOneLabelAreCountedEach) {
    platform::ProcessTransactions& transactions = fixture().transactions();
    transactions.begin("label");
    transactions.begin("label");
    transactions.end("label");
    EXPECT_TRUE(fixture().hasTransactions());
    transactions.end("label");
    EXPECT_FALSE(fixture().hasTransactions());
}

TEST_P(EventHostContract, TransactionMayOutliveItsHandler) {
    std::optional<platform::ProcessTransaction> transaction;
    fixture().events().setHandler(kNotifyd, [this, &transaction](const Event& event) {
        transaction.emplace(fixture().transactions(), "kept");
        delivered.push_back(event.name);
    });
    post(kNotifyd, "event");
    ASSERT_TRUE(runUntilDelivered(1));
    EXPECT_TRUE(fixture().hasTransactions());
    transaction.reset();
    EXPECT_FALSE(fixture().hasTransactions());
}

TEST_P(EventHostContract, ChangedSettingIsAnnouncedAndFound) {
    std::vector<bool> answers;
    fixture().events().setHandler(kNotifyd, [this, &answers](const Event& event) {
        delivered.push_back(event.name);
        answers.push_back(fixture().settings().isRestrictedModeAllowed());
    });
    EXPECT_TRUE(fixture().settings().isRestrictedModeAllowed());
    fixture().changeSetting(false);
    ASSERT_TRUE(runUntilDelivered(1));
    EXPECT_EQ(delivered.back(), platform::kSettingsChangedEvent);
    EXPECT_FALSE(answers.back());
    fixture().changeSetting(true);
    ASSERT_TRUE(runUntilDelivered(delivered.size() + 1));
    EXPECT_EQ(delivered.back(), platform::kSettingsChangedEvent);
    EXPECT_TRUE(answers.back());
}

TEST_P(EventHostContract, AlarmIsCancelledByAProcessThatHasNoHandlerForIt) {
    setAlarm("alarm", kSoon);
    fixture().restart();
    cancelAlarm("alarm");
    fixture().restart();
    listen(kAlarms);
    runFor(kLater);
    EXPECT_THAT(delivered, IsEmpty());
}

} // namespace contract
