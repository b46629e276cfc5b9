#include "platform/linux/SystemdAlarmWaker.h"

#include "platform/fake/FakeClock.h"
#include "platform/fake/FakeSystemLog.h"
#include "tests/platform/linux/FakeAlarmWaker.h"

#include <gtest/gtest.h>

#include <functional>
#include <string>
#include <utility>
#include <vector>

namespace platform {
namespace {

using Calls = std::vector<std::string>;
using Machine = SystemdAlarmWaker::Machine;

constexpr std::int64_t kNow = FakeClock::kStart.nanosecondsSince1970;
constexpr Date kDate{kNow + 5'000'000'000};
const std::string kDateText = std::to_string(kDate.nanosecondsSince1970 / 1000);
constexpr char kDoesNotWakeLine[] =
    "kstd: AlarmWaker: this machine cannot be woken from sleep; an alarm that comes due meanwhile "
    "waits until it is awake.";

const Error kRefusal{"bus", 1, "Access denied"};

/// The init system's timer as it behaves: there is one at most, and what is past never waits.
class FakeTimerUnit final : public AlarmTimerUnit {
  public:
    explicit FakeTimerUnit(FakeClock& clock) : clock_(clock) {}

    Result<std::optional<Time>> elapses() override {
        calls.emplace_back("elapses");
        if (elapsesError) {
            return *elapsesError;
        }
        return waits;
    }

    std::optional<Error> start(Time time, Wakes wakes) override {
        calls.push_back((wakes == Wakes::machine ? "start waking " : "start ") +
                        std::to_string(time));
        EXPECT_FALSE(waits.has_value()) << "a timer stands in the way";
        if (onStart) {
            onStart();
        }
        if (startError) {
            return startError;
        }
        const bool canWake = wakes == Wakes::nothing || wakesMachine;
        if (!keepsNothing && canWake && time > clock_.now().nanosecondsSince1970 / 1000) {
            waits = time;
        }
        return std::nullopt;
    }

    std::optional<Error> stop() override {
        calls.emplace_back("stop");
        waits.reset();
        return stopError;
    }

    Calls takeCalls() { return std::exchange(calls, {}); }

    Calls calls;
    std::optional<Time> waits;
    bool wakesMachine = true;
    bool keepsNothing = false;
    std::optional<Error> elapsesError;
    std::optional<Error> startError;
    std::optional<Error> stopError;
    std::function<void()> onStart;

  private:
    FakeClock& clock_;
};

class SystemdAlarmWakerTest : public testing::Test {
  protected:
    SystemdAlarmWaker make(Machine machine = Machine::canBeWoken) {
        return {timer, fallback, clock, log, machine};
    }

    FakeClock clock;
    FakeSystemLog log;
    FakeTimerUnit timer{clock};
    FakeAlarmWaker fallback;
};

TEST_F(SystemdAlarmWakerTest, TimerWaitsForTheDateAndWakesTheMachine) {
    auto waker = make();
    EXPECT_TRUE(waker.arm(kDate));
    EXPECT_EQ(timer.takeCalls(),
              (Calls{"elapses", "stop", "start waking " + kDateText, "elapses"}));
    EXPECT_EQ(fallback.takeCalls(), Calls{"disarm"});
    EXPECT_TRUE(log.texts().empty());
}

TEST_F(SystemdAlarmWakerTest, TimerThatWaitsForTheDateAlreadyStays) {
    auto waker = make();
    timer.waits = kDate.nanosecondsSince1970 / 1000;
    EXPECT_TRUE(waker.arm(kDate));
    EXPECT_EQ(timer.takeCalls(), Calls{"elapses"});
}

TEST_F(SystemdAlarmWakerTest, TimerOfAnotherDateIsReplaced) {
    auto waker = make();
    timer.waits = kDate.nanosecondsSince1970 / 1000 + 1;
    EXPECT_TRUE(waker.arm(kDate));
    EXPECT_EQ(timer.waits, kDate.nanosecondsSince1970 / 1000);
}

TEST_F(SystemdAlarmWakerTest, DateBetweenTwoMicrosecondsIsRoundedUp) {
    auto waker = make();
    for (const std::int64_t nanoseconds : {1, 999, 1000, 1001}) {
        EXPECT_TRUE(waker.arm({kDate.nanosecondsSince1970 + nanoseconds}));
        EXPECT_EQ(timer.waits, kDate.nanosecondsSince1970 / 1000 + (nanoseconds + 999) / 1000);
    }
}

TEST_F(SystemdAlarmWakerTest, DateBeyondWhatATimerCanHaveIsHeldThere) {
    auto waker = make();
    const Date latest{AlarmTimerUnit::kLatest * 1000};
    for (const Date date : {latest, Date{latest.nanosecondsSince1970 + 1}, kDistantFuture}) {
        EXPECT_TRUE(waker.arm(date));
        EXPECT_EQ(timer.waits, AlarmTimerUnit::kLatest);
    }
    EXPECT_TRUE(waker.arm({latest.nanosecondsSince1970 - 1000}));
    EXPECT_EQ(timer.waits, AlarmTimerUnit::kLatest - 1);
}

TEST_F(SystemdAlarmWakerTest, MachineWithoutAWakingClockGetsATimerThatDoesNotWake) {
    auto waker = make(Machine::cannotBeWoken);
    EXPECT_TRUE(waker.arm(kDate));
    EXPECT_EQ(timer.takeCalls(), (Calls{"elapses", "stop", "start " + kDateText, "elapses"}));
    EXPECT_EQ(log.texts(), Calls{kDoesNotWakeLine});
}

TEST_F(SystemdAlarmWakerTest, WakingThatFailsInTheTimersJobIsTriedOnce) {
    auto waker = make();
    timer.wakesMachine = false;
    EXPECT_TRUE(waker.arm(kDate));
    EXPECT_EQ(timer.takeCalls(), (Calls{"elapses", "stop", "start waking " + kDateText, "elapses",
                                        "start " + kDateText, "elapses"}));
    EXPECT_TRUE(waker.arm({kDate.nanosecondsSince1970 + 1000}));
    EXPECT_EQ(timer.takeCalls().size(), 4U);
    EXPECT_EQ(log.texts(), Calls{kDoesNotWakeLine});
    EXPECT_EQ(fallback.takeCalls(), (Calls{"disarm", "disarm"}));
}

TEST_F(SystemdAlarmWakerTest, DateThatPassesWhileTheTimerIsMadeIsToldAsPast) {
    for (const Machine machine : {Machine::canBeWoken, Machine::cannotBeWoken}) {
        clock.set(FakeClock::kStart);
        auto waker = make(machine);
        timer.onStart = [this] {
            clock.set(kDate);
        };
        EXPECT_FALSE(waker.arm(kDate));
        EXPECT_TRUE(fallback.takeCalls().empty());
        EXPECT_TRUE(log.texts().empty());
    }
}

TEST_F(SystemdAlarmWakerTest, PastDateDoesNotSayThatTheMachineCannotBeWoken) {
    auto waker = make();
    timer.onStart = [this] {
        clock.set(kDate);
    };
    EXPECT_FALSE(waker.arm(kDate));
    timer.onStart = nullptr;
    EXPECT_TRUE(waker.arm({kDate.nanosecondsSince1970 + 1'000'000}));
    EXPECT_EQ(timer.calls.at(6), "start waking " + std::to_string(*timer.waits));
}

TEST_F(SystemdAlarmWakerTest, InitSystemThatRefusesLeavesTheAlarmToTheOtherWaker) {
    const std::string line = "kstd: AlarmWaker: no timer of the init system: Access denied; the "
                             "daemon stays to wait for its alarm.";
    std::optional<Error>* const failures[] = {&timer.elapsesError, &timer.stopError,
                                              &timer.startError};
    for (auto* const failure : failures) {
        auto waker = make();
        timer.waits.reset();
        *failure = kRefusal;
        EXPECT_TRUE(waker.arm(kDate));
        EXPECT_EQ(fallback.takeCalls(), Calls{"arm " + std::to_string(kDate.nanosecondsSince1970)});
        EXPECT_EQ(log.texts(), Calls{line});
        log.clear();
        failure->reset();
        timer.takeCalls();
        EXPECT_TRUE(waker.arm(kDate));
        EXPECT_EQ(timer.takeCalls().at(2), "start waking " + kDateText);
        EXPECT_EQ(fallback.takeCalls(), Calls{"disarm"});
        EXPECT_TRUE(log.texts().empty());
    }
}

TEST_F(SystemdAlarmWakerTest, TimerThatDoesNotWaitThoughItWasStartedIsAFailure) {
    auto waker = make(Machine::cannotBeWoken);
    timer.keepsNothing = true;
    EXPECT_TRUE(waker.arm(kDate));
    EXPECT_EQ(fallback.takeCalls(), Calls{"arm " + std::to_string(kDate.nanosecondsSince1970)});
    EXPECT_EQ(log.texts(),
              Calls{"kstd: AlarmWaker: no timer of the init system: the timer does not "
                    "wait; the daemon stays to wait for its alarm."});
}

TEST_F(SystemdAlarmWakerTest, DisarmingStopsBothWhateverTheInitSystemSays) {
    auto waker = make();
    timer.stopError = kRefusal;
    waker.disarm();
    EXPECT_EQ(timer.takeCalls(), Calls{"stop"});
    EXPECT_EQ(fallback.takeCalls(), Calls{"disarm"});
    EXPECT_TRUE(log.texts().empty());
}

TEST_F(SystemdAlarmWakerTest, ClosingLeavesTheTimer) {
    auto waker = make();
    EXPECT_TRUE(waker.arm(kDate));
    timer.takeCalls();
    fallback.takeCalls();
    waker.close();
    EXPECT_TRUE(timer.takeCalls().empty());
    EXPECT_EQ(fallback.takeCalls(), Calls{"close"});
}

} // namespace
} // namespace platform
