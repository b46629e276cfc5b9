// Restricted mode on a machine: lock state, sleep, restarts, clocks and daemons on one side, the
// ports on the other.

#include "keystrand-linux/Keystrand.h"

#include "tests/keystrand-linux/FakeUsbBus.h"
#include "tests/keystrand-linux/MachineDoubles.h"
#include "tests/support/TemporaryDirectory.h"

#include <gtest/gtest.h>

namespace keystrand::usb {
namespace {

using namespace std::chrono_literals;
using Lines = std::vector<std::string>;
using Said = LockState::Said;

constexpr std::int64_t kDate = Clocks::kDate;

class KeystrandTest : public testing::Test {
  protected:
    KeystrandTest() {
        bus.addRootHub(1, "pci0");
        bus.plug("1-1", aMouse());
        start();
    }

    /// The service, or the one after it.
    void start() {
        keystrand.reset();
        kernel = std::make_unique<KernelState>();
        poster.names.clear();
        keystrand =
            std::make_unique<Keystrand>(Keystrand::Parts{.kernel = *kernel,
                                                         .events = poster,
                                                         .clock = clocks,
                                                         .lockState = sessions,
                                                         .bus = bus,
                                                         .record = record,
                                                         .devices = devices,
                                                         .log = log,
                                                         .switches = [this] { return switches; },
                                                         .sleepAgain = [this] { ++asleepAgain; },
                                                         .rearm =
                                                             [] {
                                                             }},
                                        Keystrand::Settings{.period = period, .rules = rules});
        keystrand->start();
    }

    /// The machine goes off and on again; what lies in memory is gone, and so are the devices'
    /// numbers.
    void restartMachine(std::chrono::seconds off) {
        keystrand.reset();
        std::string problem;
        ASSERT_TRUE(record.remove(problem));
        bus.setParameterDefault(kAsTheControllerHasIt);
        clocks.date += off.count();
        clocks.boot = 10s;
        std::map<std::string, Plug> plugged;
        for (const char* port : {"1-1", "1-2", "1-3"}) {
            if (bus.isPlugged(port)) {
                bus.setRootHubDefault(1, kEverybody);
                bus.replug(port);
            }
        }
        bus.setRootHubDefault(1, kEverybody);
        sessions.answers = 0;
        start();
    }

    void pass(std::chrono::seconds time) {
        // As the loop does: at each time that was asked for, and at the end.
        const BootTime end = clocks.boot + time;
        for (int turn = 0; keystrand->nextWake() <= end; ++turn) {
            ASSERT_LT(turn, 1000);
            clocks.pass(std::chrono::ceil<std::chrono::seconds>(
                std::max(keystrand->nextWake(), clocks.boot) - clocks.boot));
            keystrand->wake();
        }
        clocks.pass(std::chrono::ceil<std::chrono::seconds>(end - clocks.boot));
        keystrand->wake();
    }

    /// The daemon's start: what it kept, and what the management says.
    void daemonStarts(const TimerState& kept, bool allowed = true) {
        const StateBytes state = encodeState(kept);
        std::vector<std::uint8_t> payload(wire::rm::kDaemonStartedPayloadSize);
        payload[wire::rm::kDaemonStartedAllowedOffset] = allowed ? 1 : 0;
        std::copy(state.begin(), state.end(),
                  payload.begin() + wire::rm::kDaemonStartedStateOffset);
        run(wire::rm::kKSTKernelControlRMDaemonStarted, payload);
    }
    void manage(bool allowed) {
        run(wire::rm::kKSTKernelControlRMSetAllowed, {static_cast<std::uint8_t>(allowed ? 1 : 0)});
    }
    void restoreFigures(const AnalyticsFigures& figures) {
        const AnalyticsBytes bytes = encodeFigures(figures);
        run(wire::rm::kKSTKernelControlRMRestoreAnalytics, {bytes.begin(), bytes.end()});
    }
    void run(std::uint32_t control, const std::vector<std::uint8_t>& payload) {
        const CommandResult result = keystrand->kernelControls().run(control, payload, 4096);
        ASSERT_EQ(result.status, kKernelSuccess);
        if (result.afterwards) {
            result.afterwards();
        }
    }
    /// The daemon reads each record that waits, and takes it over.
    void acknowledge() {
        for (const Registry::Record& each : kernel->registry.records()) {
            while (kernel->registry.find(each.name) != nullptr) {
                ASSERT_TRUE(kernel->registry.copy(each.name));
                std::vector<std::uint8_t> payload(wire::rm::kNotificationAckPayloadSize);
                std::copy(each.name.begin(), each.name.end(), payload.begin());
                run(wire::rm::kKSTKernelControlRMNotificationAck, payload);
            }
        }
    }
    /// What the daemon would keep: the state in the record that waits.
    std::optional<TimerRestarted> waitingState() {
        const auto* const property = kernel->registry.find(wire::rm::kTimerRestartedProperty);
        if (property == nullptr) {
            return std::nullopt;
        }
        return keystrandModelState(property->value);
    }
    static TimerRestarted keystrandModelState(const std::vector<std::uint8_t>& record) {
        TimerRestarted read;
        std::memcpy(&read.alarm, record.data() + 4, sizeof read.alarm);
        StateBytes state{};
        std::copy_n(record.begin() + 12, state.size(), state.begin());
        read.state = decodeState(state);
        return read;
    }
    bool isPosted(const std::string& name) const {
        return std::find(poster.names.begin(), poster.names.end(), name) != poster.names.end();
    }

    [[nodiscard]] bool isClosed() const { return bus.rootHubDefault(1) != kEverybody; }

    /// The usual beginning: the machine was unlocked by the first login.
    void begin() {
        daemonStarts({});
        sessions.say(Said::unlocked);
        ASSERT_FALSE(isClosed());
        poster.names.clear();
        log.lines.clear();
    }

    support::TemporaryDirectory directory;
    StateFile record{directory.file("gate"), StateFile::Durability::none};
    StateFile devices{directory.file("devices"), StateFile::Durability::synced};
    FakeUsbBus bus;
    Clocks clocks;
    Sessions sessions;
    Poster poster;
    Log log;
    PolicySwitches switches;
    GateRules rules;
    std::uint32_t period = 3600;
    int asleepAgain = 0;
    std::unique_ptr<KernelState> kernel;
    std::unique_ptr<Keystrand> keystrand;
};

TEST_F(KeystrandTest, ClosesAnHourAfterTheLockAndOpensWithTheUnlock) {
    begin();
    sessions.say(Said::locked);
    EXPECT_FALSE(isClosed());
    EXPECT_EQ(keystrand->status().untilRestricted, 3600s);
    pass(3599s);
    bus.plug("1-2", aMouse());
    EXPECT_TRUE(bus.isAuthorized("1-2"));
    EXPECT_FALSE(isClosed());
    pass(1s);
    EXPECT_TRUE(isClosed());
    EXPECT_TRUE(keystrand->status().restricted);
    bus.plug("1-3", aDisk());
    EXPECT_FALSE(bus.isAuthorized("1-3"));
    EXPECT_TRUE(bus.isAuthorized("1-1"));
    EXPECT_TRUE(bus.isAuthorized("1-2"));
    sessions.say(Said::unlocked);
    EXPECT_FALSE(isClosed());
    EXPECT_TRUE(bus.isAuthorized("1-3"));
}

TEST_F(KeystrandTest, GateIsClosedBeforeTheRecordSaysSo) {
    begin();
    sessions.say(Said::locked);
    poster.names.clear();
    const std::function<void()> check = [&] {
        EXPECT_EQ(poster.names, Lines());
    };
    bus.setMeanwhile(check);
    pass(3600s);
    EXPECT_TRUE(isPosted("KSTRMTimerRestarted"));
}

TEST_F(KeystrandTest, PeriodOfNothingClosesWithTheLock) {
    period = 0;
    start();
    begin();
    sessions.say(Said::locked);
    EXPECT_TRUE(isClosed());
}

TEST_F(KeystrandTest, FromTheStartItIsClosedUntilADaemonSaysWhatHolds) {
    EXPECT_TRUE(isClosed());
    bus.plug("1-2", aDisk());
    EXPECT_FALSE(bus.isAuthorized("1-2"));
    EXPECT_EQ(poster.names, Lines());
    daemonStarts({});
    // Locked since the start, for no longer.
    EXPECT_FALSE(isClosed());
    EXPECT_TRUE(bus.isAuthorized("1-2"));
    EXPECT_EQ(keystrand->status().untilRestricted, 3600s);
    EXPECT_EQ(waitingState()->state.standardModeStart, static_cast<std::uint64_t>(kDate));
}

TEST_F(KeystrandTest, UnlockEndsTheStartToo) {
    sessions.say(Said::unlocked);
    EXPECT_FALSE(isClosed());
    // Nothing is told before a daemon says what it kept, and that is not taken up any more.
    EXPECT_EQ(poster.names, Lines());
    daemonStarts({.version = 1, .standardModeStart = 5, .lockedInRestrictedMode = 1});
    EXPECT_FALSE(isClosed());
    ASSERT_TRUE(waitingState());
    EXPECT_EQ(waitingState()->state.standardModeStart, 0U);
    EXPECT_EQ(waitingState()->state.lockedInRestrictedMode, 0U);
}

TEST_F(KeystrandTest, RestrictedStartRefusesWhatCameWhileItWasOff) {
    begin();
    sessions.say(Said::locked);
    pass(3600s);
    const TimerState kept = waitingState()->state;
    bus.plug("1-2", aDisk());
    restartMachine(600s);
    ASSERT_TRUE(bus.isAuthorized("1-2"));
    daemonStarts(kept);
    EXPECT_TRUE(isClosed());
    EXPECT_FALSE(bus.isAuthorized("1-2"));
    EXPECT_TRUE(bus.isAuthorized("1-1"));
    sessions.say(Said::unlocked);
    EXPECT_TRUE(bus.isAuthorized("1-2"));
}

TEST_F(KeystrandTest, ServiceThatEndsWhileStartingLeavesTheStartToTheNext) {
    begin();
    sessions.say(Said::locked);
    pass(3600s);
    const TimerState kept = waitingState()->state;
    bus.plug("1-2", aDisk());
    restartMachine(600s);
    start();
    daemonStarts(kept);
    EXPECT_FALSE(bus.isAuthorized("1-2"));
    EXPECT_TRUE(bus.isAuthorized("1-1"));
}

TEST_F(KeystrandTest, TimerGoesOnOverARestartByTheDate) {
    begin();
    sessions.say(Said::locked);
    const TimerState kept = waitingState()->state;
    pass(1000s);
    restartMachine(2000s);
    daemonStarts(kept);
    EXPECT_FALSE(isClosed());
    EXPECT_EQ(keystrand->status().untilRestricted, 600s);
    restartMachine(600s);
    daemonStarts(kept);
    EXPECT_TRUE(isClosed());
}

TEST_F(KeystrandTest, SavedStartLaterThanNowIsAPeriodThatIsOver) {
    daemonStarts({.version = 1, .standardModeStart = static_cast<std::uint64_t>(kDate) + 1});
    EXPECT_TRUE(keystrand->status().restricted);
    EXPECT_TRUE(isClosed());
}

TEST_F(KeystrandTest, SecondDaemonChangesNothing) {
    begin();
    sessions.say(Said::locked);
    pass(3600s);
    daemonStarts({});
    EXPECT_TRUE(isClosed());
    EXPECT_TRUE(keystrand->status().restricted);
}

TEST_F(KeystrandTest, StateIsToldAfterTheFirstDaemonHasSaidWhatItKept) {
    daemonStarts({});
    EXPECT_EQ(poster.names, Lines{"KSTRMTimerRestarted"});
    ASSERT_TRUE(waitingState());
    EXPECT_EQ(waitingState()->alarm, static_cast<std::uint64_t>(kDate) + 3600);
}

TEST_F(KeystrandTest, SleepClosesWhateverTheTimerSays) {
    begin();
    sessions.say(Said::goingToSleep);
    EXPECT_TRUE(isClosed());
    EXPECT_EQ(sessions.answers, 1);
    clocks.pass(60s);
    bus.plug("1-2", aDisk());
    EXPECT_FALSE(bus.isAuthorized("1-2"));
    sessions.say(Said::awake);
    EXPECT_FALSE(isClosed());
    EXPECT_TRUE(bus.isAuthorized("1-2"));
}

TEST_F(KeystrandTest, AwakeAndLockedItOpensOnlyBeforeThePeriodIsOver) {
    begin();
    sessions.say(Said::locked);
    sessions.say(Said::goingToSleep);
    clocks.pass(3599s);
    sessions.say(Said::awake);
    EXPECT_FALSE(isClosed());
    sessions.say(Said::goingToSleep);
    clocks.pass(1s);
    sessions.say(Said::awake);
    EXPECT_TRUE(isClosed());
}

TEST_F(KeystrandTest, MachineThatWokeForTheAlarmAloneSleepsAgain) {
    begin();
    sessions.say(Said::locked);
    sessions.say(Said::goingToSleep);
    clocks.pass(3600s);
    sessions.say(Said::awake);
    EXPECT_TRUE(isClosed());
    pass(29s);
    EXPECT_EQ(asleepAgain, 0);
    pass(1s);
    EXPECT_EQ(asleepAgain, 1);
    // Once; and never when somebody is there.
    pass(100s);
    EXPECT_EQ(asleepAgain, 1);
}

TEST_F(KeystrandTest, MachineWhoseAlarmIsSeenBeforeTheWordSleepsAgain) {
    begin();
    sessions.say(Said::locked);
    sessions.say(Said::goingToSleep);
    // Timers go off as soon as it runs again; logind takes longer.
    pass(3600s);
    sessions.say(Said::locked);
    sessions.say(Said::awake);
    EXPECT_TRUE(isClosed());
    pass(30s);
    EXPECT_EQ(asleepAgain, 1);
    // It was restricted before: somebody has woken it.
    sessions.say(Said::goingToSleep);
    pass(3600s);
    sessions.say(Said::awake);
    pass(30s);
    EXPECT_EQ(asleepAgain, 1);
}

TEST_F(KeystrandTest, MachineThatNobodyLockedSleepsAgainToo) {
    begin();
    sessions.say(Said::goingToSleep);
    clocks.pass(3600s);
    sessions.say(Said::unlocked);
    sessions.say(Said::awake);
    EXPECT_TRUE(isClosed());
    pass(30s);
    EXPECT_EQ(asleepAgain, 1);
    acknowledge();
    sessions.say(Said::goingToSleep);
    // No other alarm wakes it.
    EXPECT_FALSE(waitingState());
    clocks.pass(3600s);
    sessions.say(Said::unlocked);
    sessions.say(Said::awake);
    EXPECT_FALSE(isClosed());
    pass(100s);
    EXPECT_EQ(asleepAgain, 1);
}

TEST_F(KeystrandTest, MachineThatCannotSleepAgainIsUnlockedAsItWas) {
    begin();
    sessions.say(Said::goingToSleep);
    clocks.pass(3600s);
    sessions.say(Said::awake);
    pass(30s);
    EXPECT_EQ(asleepAgain, 1);
    pass(29s);
    EXPECT_TRUE(isClosed());
    pass(1s);
    EXPECT_FALSE(isClosed());
    pass(3600s);
    EXPECT_FALSE(isClosed());
    EXPECT_EQ(asleepAgain, 1);
}

TEST_F(KeystrandTest, AnythingSaidEndsTheWaitForSleep) {
    for (const Said said : {Said::awake, Said::away, Said::unlocked}) {
        begin();
        sessions.say(Said::goingToSleep);
        clocks.pass(3600s);
        sessions.say(Said::awake);
        EXPECT_TRUE(isClosed());
        sessions.say(said);
        EXPECT_FALSE(isClosed());
        pass(60s);
        EXPECT_EQ(asleepAgain, 0);
    }
}

TEST_F(KeystrandTest, MachineThatAnAdministratorOpensStaysAwake) {
    begin();
    sessions.say(Said::goingToSleep);
    clocks.pass(3600s);
    sessions.say(Said::awake);
    keystrand->openFor(60s);
    pass(60s);
    EXPECT_EQ(asleepAgain, 0);
    EXPECT_FALSE(isClosed());
}

TEST_F(KeystrandTest, MachineThatIsWokenLongAfterItsAlarmStaysAwake) {
    for (const auto& [slept, asked] : {std::pair(3599s, 0), {3600s, 1}, {3900s, 1}, {3901s, 0}}) {
        begin();
        asleepAgain = 0;
        sessions.say(Said::locked);
        sessions.say(Said::goingToSleep);
        clocks.pass(slept);
        sessions.say(Said::awake);
        pass(30s);
        EXPECT_EQ(asleepAgain, asked) << slept.count();
        sessions.say(Said::unlocked);
    }
}

TEST_F(KeystrandTest, MachineThatSomebodyUsesStaysAwake) {
    begin();
    sessions.say(Said::locked);
    sessions.say(Said::goingToSleep);
    clocks.pass(3600s);
    sessions.say(Said::awake);
    sessions.say(Said::unlocked);
    pass(60s);
    EXPECT_EQ(asleepAgain, 0);
}

TEST_F(KeystrandTest, DateIsSetAndThePeriodStaysAsLong) {
    begin();
    sessions.say(Said::locked);
    pass(600s);
    constexpr std::int64_t kYear = 31'536'000;
    for (const std::int64_t step : {kYear, -2 * kYear, kYear}) {
        clocks.date += step;
        keystrand->clockWasSet();
        EXPECT_FALSE(isClosed()) << step;
        EXPECT_EQ(keystrand->status().untilRestricted, 3000s) << step;
        EXPECT_EQ(waitingState()->alarm, static_cast<std::uint64_t>(clocks.date) + 3000) << step;
    }
    EXPECT_TRUE(log.has("keystrand: the date was moved by 31536000 seconds"));
    pass(2999s);
    EXPECT_FALSE(isClosed());
    pass(1s);
    EXPECT_TRUE(isClosed());
}

TEST(CountedClockTest, ItsSecondsBeginWithTheDates) {
    Clocks machine;
    machine.boot = 100s + 500ms;
    machine.sinceTheSecond = 300ms;
    CountedClock clock(machine);
    EXPECT_EQ(clock.now(), Clocks::kDate);
    EXPECT_EQ(clock.whenIs(Clocks::kDate + 10), machine.boot + 9'700ms);
    machine.boot += 9'700ms - 1us;
    EXPECT_EQ(clock.now(), Clocks::kDate + 9);
    machine.boot += 1us;
    EXPECT_EQ(clock.now(), Clocks::kDate + 10);
    // Less than half a second is no step of the date.
    machine.date += 10;
    machine.sinceTheSecond = 499ms;
    EXPECT_EQ(clock.behind(), 0);
    machine.date += 2;
    EXPECT_EQ(clock.behind(), 2);
    clock.catchUp();
    EXPECT_EQ(clock.now(), Clocks::kDate + 12);
    EXPECT_EQ(clock.behind(), 0);
}

TEST_F(KeystrandTest, FiguresFromTheFutureAreKeptButTheirStay) {
    const auto future = static_cast<std::uint64_t>(kDate) + 1000;
    restoreFigures({.periodStart = future,
                    .restrictedInPeriod = 70,
                    .totalRestricted = 80,
                    .restrictedSince = future});
    daemonStarts({.version = 1, .standardModeStart = 5, .lockedInRestrictedMode = 1});
    EXPECT_TRUE(isClosed());
    pass(10s);
    sessions.say(Said::unlocked);
    const auto* const property = kernel->registry.find("KSTRMTimerRestartedAnalyticsCollected");
    ASSERT_NE(property, nullptr);
    EXPECT_EQ(property->value[4], 90);
}

TEST_F(KeystrandTest, ManagementSaysNo) {
    begin();
    sessions.say(Said::locked);
    pass(3600s);
    ASSERT_TRUE(isClosed());
    manage(false);
    EXPECT_FALSE(isClosed());
    EXPECT_TRUE(log.has("keystrand: restricted mode is switched off by the management"));
    manage(true);
    EXPECT_TRUE(isClosed());
    EXPECT_TRUE(log.has("keystrand: restricted mode is in force again"));
}

TEST_F(KeystrandTest, CommandLineSwitchesItOff) {
    switches.bootArgument = true;
    start();
    EXPECT_FALSE(isClosed());
    daemonStarts({.version = 1, .standardModeStart = 5, .lockedInRestrictedMode = 1});
    EXPECT_FALSE(isClosed());
    EXPECT_TRUE(log.has("keystrand: restricted mode is switched off by the kernel's command line"));
}

TEST_F(KeystrandTest, UserWithoutAPasswordSwitchesItOff) {
    begin();
    switches.passwordSet = false;
    sessions.say(Said::locked);
    pass(3600s);
    EXPECT_FALSE(isClosed());
    EXPECT_TRUE(log.has("keystrand: restricted mode is switched off: the user has no password"));
    switches.passwordSet = true;
    sessions.say(Said::locked);
    EXPECT_TRUE(isClosed());
}

TEST_F(KeystrandTest, AdministratorOpensForAWhile) {
    begin();
    sessions.say(Said::locked);
    pass(3600s);
    bus.plug("1-2", aDisk());
    keystrand->openFor(600s);
    EXPECT_FALSE(isClosed());
    EXPECT_TRUE(bus.isAuthorized("1-2"));
    EXPECT_EQ(keystrand->status().untilClosed, 600s);
    // Also for the service that follows.
    start();
    daemonStarts({.version = 1, .standardModeStart = 5, .lockedInRestrictedMode = 1});
    EXPECT_FALSE(isClosed());
    pass(599s);
    EXPECT_FALSE(isClosed());
    pass(1s);
    EXPECT_TRUE(isClosed());
    EXPECT_TRUE(bus.isAuthorized("1-2"));
    EXPECT_TRUE(log.has("keystrand: an administrator has opened the gate for 600 seconds"));
    EXPECT_TRUE(log.has("keystrand: the time for which the gate was opened is over"));
    keystrand->openFor(600s);
    EXPECT_FALSE(isClosed());
    keystrand->openFor(0s);
    EXPECT_TRUE(isClosed());
}

TEST_F(KeystrandTest, NextServiceGoesOnWithAClosedGate) {
    begin();
    sessions.say(Said::locked);
    pass(3600s);
    const TimerState kept = waitingState()->state;
    bus.plug("1-2", aDisk());
    start();
    EXPECT_TRUE(isClosed());
    bus.plug("1-3", aDisk());
    daemonStarts(kept);
    EXPECT_FALSE(bus.isAuthorized("1-2"));
    EXPECT_FALSE(bus.isAuthorized("1-3"));
    EXPECT_TRUE(bus.isAuthorized("1-1"));
    sessions.say(Said::unlocked);
    EXPECT_TRUE(bus.isAuthorized("1-2"));
    EXPECT_TRUE(bus.isAuthorized("1-3"));
    EXPECT_FALSE(isClosed());
}

TEST_F(KeystrandTest, RecordOfTypeOneThatNobodyTakesIsTold) {
    begin();
    sessions.say(Said::locked);
    pass(59s);
    const std::string line = "keystrand: the state was not taken over for a minute: is kstd there?";
    EXPECT_FALSE(log.has(line));
    pass(1s);
    EXPECT_TRUE(log.has(line));
}

TEST_F(KeystrandTest, ListenerIsAwayAndTheLastStateHolds) {
    begin();
    sessions.say(Said::away);
    EXPECT_FALSE(keystrand->status().locked);
    sessions.say(Said::locked);
    EXPECT_TRUE(keystrand->status().locked);
}

TEST_F(KeystrandTest, UnlockedMachineIsLeftAlone) {
    begin();
    acknowledge();
    pass(10s);
    EXPECT_FALSE(bus.isWatched());
    // Nothing but the figures' period, a day later.
    EXPECT_GE(keystrand->nextWake() - clocks.boot, 86000s);
}

} // namespace
} // namespace keystrand::usb
