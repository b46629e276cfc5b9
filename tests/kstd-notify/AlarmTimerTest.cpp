#include "kstd-notify/AlarmTimer.h"

#include "platform/fake/FakeClock.h"
#include "tests/kstd-notify/FakeTimerUnit.h"

#include <gtest/gtest.h>

#include <string>
#include <vector>

namespace notify {
namespace {

using platform::Date;
using platform::FakeClock;
using Calls = std::vector<std::string>;
using Machine = AlarmTimer::Machine;
using Timer = wire::AlarmAnswer::Timer;

constexpr std::int64_t kNow = FakeClock::kStart.nanosecondsSince1970;
constexpr Date kDate{kNow + 5'000'000'000};
const std::string kDateText = std::to_string(kDate.nanosecondsSince1970 / 1000);
const platform::Error kRefusal{"bus", 1, "Access denied"};

class AlarmTimerTest : public testing::Test {
  protected:
    AlarmTimer make(Machine machine = Machine::canBeWoken) { return {unit, clock, machine}; }

    static wire::AlarmAnswer waits(Date date = kDate, bool wakesMachine = true) {
        return {Timer::waits, wakesMachine, date.nanosecondsSince1970, {}};
    }
    static wire::AlarmAnswer failed(const std::string& reason) {
        return {Timer::failed, true, kDate.nanosecondsSince1970, reason};
    }

    FakeClock clock;
    FakeTimerUnit unit{clock};
};

TEST_F(AlarmTimerTest, WaitsForTheDateAndWakesTheMachine) {
    EXPECT_EQ(make().set(kDate), waits());
    EXPECT_EQ(unit.takeCalls(), (Calls{"elapses", "stop", "start waking " + kDateText, "elapses"}));
}

TEST_F(AlarmTimerTest, OneThatWaitsForTheDateAlreadyStays) {
    unit.waits = kDate.nanosecondsSince1970 / 1000;
    EXPECT_EQ(make().set(kDate), waits());
    EXPECT_EQ(unit.takeCalls(), Calls{"elapses"});
}

TEST_F(AlarmTimerTest, OneOfAnotherDateIsReplaced) {
    unit.waits = kDate.nanosecondsSince1970 / 1000 + 1;
    EXPECT_EQ(make().set(kDate), waits());
    EXPECT_EQ(unit.waits, kDate.nanosecondsSince1970 / 1000);
}

TEST_F(AlarmTimerTest, DateBetweenTwoMicrosecondsIsRoundedUp) {
    auto timer = make();
    for (const std::int64_t nanoseconds : {1, 999, 1000, 1001}) {
        const Date date{kDate.nanosecondsSince1970 + nanoseconds};
        EXPECT_EQ(timer.set(date), waits(date));
        EXPECT_EQ(unit.waits, kDate.nanosecondsSince1970 / 1000 + (nanoseconds + 999) / 1000);
    }
}

TEST_F(AlarmTimerTest, DateBeyondWhatATimerCanHaveIsHeldThere) {
    auto timer = make();
    const Date latest{AlarmTimerUnit::kLatest * 1000};
    for (const Date date :
         {latest, Date{latest.nanosecondsSince1970 + 1}, platform::kDistantFuture}) {
        EXPECT_EQ(timer.set(date), waits(date));
        EXPECT_EQ(unit.waits, AlarmTimerUnit::kLatest);
    }
    EXPECT_EQ(timer.set(Date{latest.nanosecondsSince1970 - 1000}),
              waits({latest.nanosecondsSince1970 - 1000}));
    EXPECT_EQ(unit.waits, AlarmTimerUnit::kLatest - 1);
}

TEST_F(AlarmTimerTest, MachineWithoutAWakingClockGetsOneThatDoesNotWake) {
    EXPECT_EQ(make(Machine::cannotBeWoken).set(kDate), waits(kDate, false));
    EXPECT_EQ(unit.takeCalls(), (Calls{"elapses", "stop", "start " + kDateText, "elapses"}));
}

TEST_F(AlarmTimerTest, WakingThatFailsInTheTimersJobIsTriedOnce) {
    auto timer = make();
    unit.wakesMachine = false;
    EXPECT_EQ(timer.set(kDate), waits(kDate, false));
    EXPECT_EQ(unit.takeCalls(), (Calls{"elapses", "stop", "start waking " + kDateText, "elapses",
                                       "start " + kDateText, "elapses"}));
    const Date next{kDate.nanosecondsSince1970 + 1000};
    EXPECT_EQ(timer.set(next), waits(next, false));
    EXPECT_EQ(unit.takeCalls().size(), 4U);
}

TEST_F(AlarmTimerTest, DateThatPassesMeanwhileIsAFailure) {
    for (const Machine machine : {Machine::canBeWoken, Machine::cannotBeWoken}) {
        clock.set(FakeClock::kStart);
        unit.onStart = [this] {
            clock.set(kDate);
        };
        EXPECT_EQ(make(machine).set(kDate), failed("the timer does not wait"));
    }
}

TEST_F(AlarmTimerTest, PastDateDoesNotMeanThatTheMachineCannotBeWoken) {
    auto timer = make();
    unit.onStart = [this] {
        clock.set(kDate);
    };
    EXPECT_EQ(timer.set(kDate), failed("the timer does not wait"));
    unit.onStart = nullptr;
    const Date next{kDate.nanosecondsSince1970 + 1'000'000};
    EXPECT_EQ(timer.set(next), waits(next));
    EXPECT_EQ(unit.calls.at(6), "start waking " + std::to_string(*unit.waits));
}

TEST_F(AlarmTimerTest, RefusalIsTheReason) {
    std::optional<platform::Error>* const failures[] = {&unit.elapsesError, &unit.stopError,
                                                        &unit.startError};
    for (auto* const failure : failures) {
        auto timer = make();
        unit.waits.reset();
        *failure = kRefusal;
        EXPECT_EQ(timer.set(kDate), failed("Access denied"));
        failure->reset();
        unit.takeCalls();
        EXPECT_EQ(timer.set(kDate), waits());
        EXPECT_EQ(unit.takeCalls().at(2), "start waking " + kDateText);
    }
}

TEST_F(AlarmTimerTest, OneThatDoesNotWaitThoughItWasStartedIsAFailure) {
    unit.keepsNothing = true;
    EXPECT_EQ(make(Machine::cannotBeWoken).set(kDate), failed("the timer does not wait"));
}

TEST_F(AlarmTimerTest, WithoutADateItIsTakenAway) {
    auto timer = make();
    unit.waits = 1;
    EXPECT_EQ(timer.set(std::nullopt), wire::AlarmAnswer());
    EXPECT_EQ(unit.takeCalls(), Calls{"stop"});
    unit.stopError = kRefusal;
    EXPECT_EQ(timer.set(std::nullopt),
              (wire::AlarmAnswer{Timer::failed, true, 0, "Access denied"}));
}

} // namespace
} // namespace notify
