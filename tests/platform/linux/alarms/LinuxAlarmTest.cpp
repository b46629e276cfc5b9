#include "platform/linux/alarms/LinuxAlarm.h"

#include "platform/fake/FakeSystemLog.h"
#include "platform/linux/LinuxClock.h"
#include "platform/linux/alarms/TimerAlarmWaker.h"
#include "tests/platform/linux/alarms/FakeAlarmWaker.h"
#include "tests/support/TemporaryDirectory.h"

#include <gmock/gmock.h>

#include <filesystem>
#include <fstream>
#include <memory>
#include <string>
#include <time.h>
#include <unistd.h>
#include <vector>

namespace platform {
namespace {

using testing::ElementsAre;
using testing::Pair;

constexpr std::int64_t kMillisecond = 1'000'000;
constexpr std::int64_t kFarAway = 4'102'444'800'000'000'000;

const std::vector<std::string> kNames = {"a", "b", "c", "sooner", "later"};

/// One process's alarms on a directory.
struct AlarmProcess {
    explicit AlarmProcess(const std::string& directory)
        : alarm(events, AlarmStore(directory, kNames, log), waker) {}

    void subscribe() {
        events.setHandler("stream",
                          [this](const Event& event) { delivered.push_back(event.name); });
    }

    void set(const std::string& event, std::int64_t date) {
        const EventDictionary dictionary{{kAlarmDateKey, {date}}};
        alarm.set("stream", event, &dictionary);
    }

    FakeSystemLog log;
    LinuxRunLoop loop{log};
    LinuxEventStream events{loop, log};
    TimerAlarmWaker waker{loop, [this] {
                              alarm.woke();
                          }};
    LinuxAlarm alarm;
    std::vector<std::string> delivered;
};

class LinuxAlarmTest : public testing::Test {
  protected:
    void SetUp() override { start(); }

    void start() {
        process.reset();
        process = std::make_unique<AlarmProcess>(path);
        process->subscribe();
    }

    static std::vector<std::uint8_t> dateBytes(std::int64_t date) {
        std::vector<std::uint8_t> bytes;
        for (int i = 0; i < 8; ++i) {
            bytes.push_back(static_cast<std::uint8_t>(static_cast<std::uint64_t>(date) >> (8 * i)));
        }
        return bytes;
    }

    [[nodiscard]] std::vector<std::pair<std::string, Date>> registered() {
        return AlarmStore(path, kNames, process->log).load("stream");
    }

    support::TemporaryDirectory directory;
    std::string path = directory.file("alarms");
    std::unique_ptr<AlarmProcess> process;
};

TEST_F(LinuxAlarmTest, ArmedAlarmHoldsTheProcessAndKeepsTheLoopRunning) {
    EXPECT_FALSE(process->alarm.holdsProcess());
    EXPECT_FALSE(process->loop.runOnce({0}));
    process->set("a", kFarAway);
    EXPECT_TRUE(process->alarm.holdsProcess());
    EXPECT_TRUE(process->loop.runOnce({0}));
    process->set("b", kFarAway);
    EXPECT_TRUE(process->alarm.holdsProcess());
    process->alarm.set("stream", "a", nullptr);
    EXPECT_TRUE(process->alarm.holdsProcess());
    process->alarm.set("stream", "b", nullptr);
    EXPECT_FALSE(process->alarm.holdsProcess());
    EXPECT_FALSE(process->loop.runOnce({0}));
}

TEST_F(LinuxAlarmTest, TimerWakesTheLoopAtTheDateAndNotBefore) {
    const Date date{realTimeNow().nanosecondsSince1970 + 5 * kMillisecond};
    process->set("a", date.nanosecondsSince1970);
    while (process->delivered.empty() && process->loop.runOnce(kDistantFuture)) {
    }
    EXPECT_THAT(process->delivered, ElementsAre("a"));
    EXPECT_GE(realTimeNow(), date);
    EXPECT_FALSE(process->alarm.holdsProcess());
    EXPECT_THAT(registered(), ElementsAre());
}

TEST_F(LinuxAlarmTest, EarliestAlarmComesFirst) {
    const std::int64_t now = realTimeNow().nanosecondsSince1970;
    process->set("sooner", now + 4 * kMillisecond);
    process->set("later", now + 8 * kMillisecond);
    while (process->delivered.size() < 2 && process->loop.runOnce(kDistantFuture)) {
    }
    EXPECT_THAT(process->delivered, ElementsAre("sooner", "later"));
}

TEST_F(LinuxAlarmTest, LatestDateIsHeldAndDoesNotFire) {
    process->set("a", kDistantFuture.nanosecondsSince1970);
    EXPECT_TRUE(process->loop.runOnce({realTimeNow().nanosecondsSince1970 + 2 * kMillisecond}));
    EXPECT_THAT(process->delivered, ElementsAre());
    EXPECT_THAT(registered(), ElementsAre(Pair("a", kDistantFuture)));
}

TEST_F(LinuxAlarmTest, SurvivesAStepOfTheClock) {
    const Date date{realTimeNow().nanosecondsSince1970 + 5 * kMillisecond};
    process->set("a", date.nanosecondsSince1970);
    // Setting the clock to what it shows is a step like any other for the timer.
    timespec now{};
    ::clock_gettime(CLOCK_REALTIME, &now);
    if (::clock_settime(CLOCK_REALTIME, &now) != 0) {
        GTEST_SKIP() << "needs the right to set the clock";
    }
    while (process->delivered.empty() && process->loop.runOnce(kDistantFuture)) {
    }
    EXPECT_THAT(process->delivered, ElementsAre("a"));
    EXPECT_GE(realTimeNow(), date);
}

TEST_F(LinuxAlarmTest, TimerSaysThatTheClockWasSet) {
    RealTimeTimer timer;
    timer.arm({kFarAway});
    EXPECT_EQ(timer.acknowledge(), RealTimeTimer::Wake::nothing);
    timespec now{};
    ::clock_gettime(CLOCK_REALTIME, &now);
    if (::clock_settime(CLOCK_REALTIME, &now) != 0) {
        GTEST_SKIP() << "needs the right to set the clock";
    }
    EXPECT_EQ(timer.acknowledge(), RealTimeTimer::Wake::clockWasSet);
}

TEST_F(LinuxAlarmTest, LaterProcessFiresWhatBecameDueWhileNobodyRan) {
    const Date date{realTimeNow().nanosecondsSince1970 + kMillisecond};
    process->set("a", date.nanosecondsSince1970);
    process->set("b", kFarAway);
    process.reset();
    while (realTimeNow() < date) {
    }
    start();
    while (process->delivered.empty() && process->loop.runOnce(kDistantFuture)) {
    }
    EXPECT_THAT(process->delivered, ElementsAre("a"));
    EXPECT_THAT(registered(), ElementsAre(Pair("b", Date{kFarAway})));
}

TEST_F(LinuxAlarmTest, ProcessThatEndsBeforeTheDeliveryLeavesTheAlarm) {
    process->set("a", 1);
    EXPECT_TRUE(process->events.busy());
    start();
    while (process->delivered.empty() && process->loop.runOnce(kDistantFuture)) {
    }
    EXPECT_THAT(process->delivered, ElementsAre("a"));
    EXPECT_THAT(registered(), ElementsAre());
}

TEST_F(LinuxAlarmTest, AlarmSetAnewByItsOwnHandlerStays) {
    process->events.setHandler("stream", [this](const Event&) { process->set("a", kFarAway); });
    process->set("a", 1);
    EXPECT_TRUE(process->loop.runOnce(kDistantFuture));
    EXPECT_THAT(registered(), ElementsAre(Pair("a", Date{kFarAway})));
    EXPECT_TRUE(process->alarm.holdsProcess());
}

TEST_F(LinuxAlarmTest, ArrivedAlarmCountsForThePresentRegistrationOnly) {
    process->set("a", kFarAway);
    EXPECT_TRUE(process->alarm.arrived("stream", "a", dateBytes(kFarAway - 1)));
    EXPECT_TRUE(process->alarm.arrived("stream", "unknown", dateBytes(kFarAway)));
    EXPECT_FALSE(process->events.busy());
    EXPECT_TRUE(process->alarm.arrived("stream", "a", dateBytes(kFarAway)));
    EXPECT_TRUE(process->alarm.arrived("stream", "a", dateBytes(kFarAway)));
    while (process->loop.runOnce({0})) {
    }
    EXPECT_THAT(process->delivered, ElementsAre("a"));
    EXPECT_THAT(registered(), ElementsAre());
}

TEST_F(LinuxAlarmTest, ArrivedAlarmWithoutADateIsMalformed) {
    process->set("a", kFarAway);
    auto longer = dateBytes(kFarAway);
    longer.push_back(0);
    EXPECT_FALSE(process->alarm.arrived("stream", "a", {}));
    EXPECT_FALSE(process->alarm.arrived("stream", "a", std::vector<std::uint8_t>(7)));
    EXPECT_FALSE(process->alarm.arrived("stream", "a", longer));
    EXPECT_FALSE(process->events.busy());
}

TEST_F(LinuxAlarmTest, RegistrationThatIsOnDiskIsNotWrittenAgain) {
    process->set("a", kFarAway);
    const std::string file = path + "/stream/a";
    std::filesystem::remove(file);
    process->set("a", kFarAway);
    EXPECT_FALSE(std::filesystem::exists(file));
    process->set("a", kFarAway + 1);
    EXPECT_THAT(registered(), ElementsAre(Pair("a", Date{kFarAway + 1})));
}

TEST_F(LinuxAlarmTest, RegistrationThatCouldNotBeKeptIsTriedAgain) {
    std::ofstream(path) << "a file in the directory's place";
    process->set("a", kFarAway);
    EXPECT_EQ(process->log.texts().size(), 1U);
    std::filesystem::remove(path);
    process->set("a", kFarAway);
    EXPECT_THAT(registered(), ElementsAre(Pair("a", Date{kFarAway})));
}

TEST_F(LinuxAlarmTest, FiredAlarmIsRegisteredAnewAtTheSameDate) {
    process->set("a", 1);
    EXPECT_TRUE(process->loop.runOnce(kDistantFuture));
    process->set("a", 1);
    EXPECT_THAT(registered(), ElementsAre(Pair("a", Date{1})));
    EXPECT_TRUE(process->loop.runOnce(kDistantFuture));
    EXPECT_THAT(process->delivered, ElementsAre("a", "a"));
}

TEST_F(LinuxAlarmTest, AfterCloseRegistrationsAreStillKept) {
    process->alarm.close();
    process->set("a", kFarAway);
    EXPECT_THAT(registered(), ElementsAre(Pair("a", Date{kFarAway})));
    EXPECT_FALSE(process->alarm.holdsProcess());
}

/// Alarms with a waker that only notes what it is asked for.
class AlarmsWaker : public testing::Test {
  protected:
    using Calls = std::vector<std::string>;

    void set(const std::string& event, std::int64_t date) {
        const EventDictionary dictionary{{kAlarmDateKey, {date}}};
        alarm.set("stream", event, &dictionary);
    }
    void cancel(const std::string& event) { alarm.set("stream", event, nullptr); }

    /// What another process finds that has no alarm of its own.
    [[nodiscard]] AlarmStore store() { return {directory.file("alarms"), {"a", "b", "c"}, log}; }

    static std::string armed(std::int64_t date) { return "arm " + std::to_string(date); }

    support::TemporaryDirectory directory;
    FakeSystemLog log;
    LinuxRunLoop loop{log};
    LinuxEventStream events{loop, log};
    FakeAlarmWaker waker;
    LinuxAlarm alarm{events, store(), waker};
};

TEST_F(AlarmsWaker, IsArmedForTheEarliestOfTheAlarms) {
    set("b", kFarAway);
    set("a", kFarAway - 1);
    set("c", kFarAway + 1);
    cancel("a");
    cancel("b");
    cancel("c");
    EXPECT_EQ(waker.takeCalls(), (Calls{armed(kFarAway), armed(kFarAway - 1), armed(kFarAway),
                                        armed(kFarAway + 1), "disarm"}));
}

TEST_F(AlarmsWaker, IsLeftAloneWhileNothingIsRegistered) {
    events.setHandler("stream", [](const Event&) {});
    cancel("a");
    cancel("a");
    EXPECT_EQ(waker.takeCalls(), Calls{});
}

TEST_F(AlarmsWaker, IsArmedForWhatALaterProcessFinds) {
    EXPECT_TRUE(store().save("stream", "a", {kFarAway}));
    events.setHandler("stream", [](const Event&) {});
    events.setHandler("other", [](const Event&) {});
    EXPECT_EQ(waker.takeCalls(), Calls{armed(kFarAway)});
}

TEST_F(AlarmsWaker, IsArmedAgainWhenAnEventCameFromOutside) {
    set("a", kFarAway);
    waker.takeCalls();
    const std::vector<std::uint8_t> anotherDate(8);
    EXPECT_TRUE(alarm.arrived("stream", "a", anotherDate));
    EXPECT_EQ(waker.takeCalls(), Calls{armed(kFarAway)});
    cancel("a");
    waker.takeCalls();
    EXPECT_TRUE(alarm.arrived("stream", "a", anotherDate));
    EXPECT_EQ(waker.takeCalls(), Calls{"disarm"});
    EXPECT_FALSE(alarm.arrived("stream", "a", {}));
    EXPECT_EQ(waker.takeCalls(), Calls{});
}

TEST_F(AlarmsWaker, IsArmedAgainWhenItWoke) {
    set("a", kFarAway);
    waker.takeCalls();
    alarm.woke();
    EXPECT_EQ(waker.takeCalls(), Calls{armed(kFarAway)});
}

TEST_F(AlarmsWaker, IsAskedAgainAtEachRegistrationWhileItHoldsTheProcess) {
    set("a", kFarAway);
    set("a", kFarAway);
    EXPECT_EQ(waker.takeCalls(), Calls{armed(kFarAway)});
    waker.holds = true;
    set("a", kFarAway);
    set("a", kFarAway);
    EXPECT_EQ(waker.takeCalls(), (Calls{armed(kFarAway), armed(kFarAway)}));
    EXPECT_TRUE(alarm.holdsProcess());
    waker.holds = false;
    set("a", kFarAway);
    EXPECT_EQ(waker.takeCalls(), Calls{});
    EXPECT_FALSE(alarm.holdsProcess());
}

TEST_F(AlarmsWaker, TriesAgainAfterAnIdleTime) {
    set("a", kFarAway);
    waker.takeCalls();
    alarm.tryAgain();
    EXPECT_EQ(waker.takeCalls(), Calls{"try again"});
}

TEST_F(AlarmsWaker, IsClosedWithTheAlarms) {
    alarm.close();
    EXPECT_EQ(waker.takeCalls(), Calls{"close"});
    EXPECT_EQ(log.texts(), Calls{});
}

/// Alarms for which a file stands in the place of their directory, since it was read.
class UnsavedAlarmTest : public AlarmsWaker {
  protected:
    UnsavedAlarmTest() {
        events.setHandler("stream",
                          [this](const Event& event) { delivered.push_back(event.name); });
        breakDisk();
    }

    void breakDisk() { std::ofstream(directory.file("alarms")) << "a file"; }
    void mendDisk() { std::filesystem::remove(directory.file("alarms")); }

    [[nodiscard]] std::string file(const std::string& event) const {
        return directory.file("alarms/stream/" + event);
    }
    [[nodiscard]] std::string notKept(const std::string& event) const {
        return "kstd: AlarmStore: cannot keep the alarm on disk: " + file(event) +
               ": Not a directory.";
    }
    [[nodiscard]] std::string lost(const std::string& event) const {
        return "kstd: AlarmStore: the alarm is lost until the kernel side sends it again: " +
               file(event) + ": Not a directory.";
    }

    std::vector<std::string> delivered;
};

TEST_F(UnsavedAlarmTest, HoldsTheProcessUntilItIsOnDisk) {
    set("a", kFarAway);
    EXPECT_TRUE(alarm.holdsProcess());
    for (int idleTimes = 0; idleTimes < 3; ++idleTimes) {
        alarm.tryAgain();
        EXPECT_TRUE(alarm.holdsProcess());
    }
    EXPECT_EQ(log.texts(), Calls{notKept("a")});
    EXPECT_EQ(waker.takeCalls(), (Calls{armed(kFarAway), "try again", "try again", "try again"}));
    mendDisk();
    alarm.tryAgain();
    EXPECT_FALSE(alarm.holdsProcess());
    EXPECT_THAT(store().load("stream"), ElementsAre(Pair("a", Date{kFarAway})));
    EXPECT_EQ(waker.takeCalls(), Calls{armed(kFarAway)}) << "who makes the timer reads the disk";
}

TEST_F(UnsavedAlarmTest, HoldsTheProcessThoughAnEarlierOneIsOnDisk) {
    mendDisk();
    set("a", kFarAway);
    std::filesystem::create_directory(file("b"));
    set("b", kFarAway + 1);
    EXPECT_TRUE(alarm.holdsProcess());
    std::filesystem::remove(file("b"));
    alarm.tryAgain();
    EXPECT_FALSE(alarm.holdsProcess());
}

TEST_F(UnsavedAlarmTest, IsReplacedByTheNextRegistration) {
    set("a", kFarAway);
    mendDisk();
    set("a", kFarAway + 1);
    EXPECT_FALSE(alarm.holdsProcess());
    alarm.tryAgain();
    EXPECT_THAT(store().load("stream"), ElementsAre(Pair("a", Date{kFarAway + 1})));
}

TEST_F(UnsavedAlarmTest, CanBeCancelled) {
    set("a", kFarAway);
    cancel("a");
    EXPECT_FALSE(alarm.holdsProcess());
    mendDisk();
    alarm.tryAgain();
    EXPECT_THAT(store().load("stream"), ElementsAre());
}

TEST_F(UnsavedAlarmTest, FiresAllTheSame) {
    set("a", 1);
    EXPECT_TRUE(alarm.holdsProcess());
    EXPECT_TRUE(loop.runOnce(kDistantFuture));
    EXPECT_THAT(delivered, ElementsAre("a"));
    EXPECT_FALSE(alarm.holdsProcess());
}

TEST_F(UnsavedAlarmTest, IsTriedOnceMoreAtTheEnd) {
    set("a", kFarAway);
    log.clear();
    mendDisk();
    alarm.close();
    EXPECT_THAT(store().load("stream"), ElementsAre(Pair("a", Date{kFarAway})));
    EXPECT_EQ(log.texts(), Calls{});
}

TEST_F(UnsavedAlarmTest, IsLostAtTheEndWithALine) {
    set("a", kFarAway);
    set("b", kFarAway);
    alarm.close();
    EXPECT_EQ(log.texts(), (Calls{notKept("a"), notKept("b"), lost("a"), lost("b")}));
    log.clear();
    set("c", kFarAway);
    EXPECT_EQ(log.texts(), (Calls{notKept("c"), lost("c")}));
}

TEST_F(AlarmsWaker, LeavesADirectoryThatCannotBeReadToFireEveryAlarm) {
    std::ofstream(directory.file("alarms")) << "a file";
    std::vector<std::string> delivered;
    events.setHandler("stream", [&](const Event& event) { delivered.push_back(event.name); });
    while (events.busy() && loop.runOnce(kDistantFuture)) {
    }
    EXPECT_THAT(delivered, ElementsAre("a", "b", "c"));
}

} // namespace
} // namespace platform
