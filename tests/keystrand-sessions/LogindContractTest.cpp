// What every Logind must do: the one in memory, and the real one on a message bus.

#include "base/Concat.h"
#include "tests/keystrand-sessions/BusMachine.h"
#include "tests/keystrand-sessions/FakeLogind.h"
#include "tests/keystrand-sessions/Sessions.h"

#include <gtest/gtest.h>

#include <map>
#include <memory>
#include <string>
#include <utility>
#include <vector>

namespace keystrand::sessions {
namespace {

/// Notes what it is told.
class Recorder : public LogindListener {
  public:
    void isThere(const LogindProcess& process, const std::vector<Session>& sessions,
                 bool isPreparingForSleep) override {
        processes.push_back(process);
        std::string line = isPreparingForSleep ? "there, about to sleep" : "there";
        for (const Session& session : sessions) {
            last[session.id] = session;
            line += base::concat(", ", session.id, session.isHintSet ? " locked" : "");
        }
        told.push_back(line);
    }
    void isAway() override { told.emplace_back("away"); }
    void sessionIs(const Session& session) override {
        last[session.id] = session;
        told.push_back(base::concat(session.id, session.isActive ? "" : " behind",
                                    session.isHintSet ? " locked" : "",
                                    session.state == "closing" ? " closing" : ""));
    }
    void sessionIsGone(const std::string& id) override {
        told.push_back(base::concat(id, " gone"));
    }
    void prepareForSleep(bool isAboutTo) override {
        told.emplace_back(isAboutTo ? "about to sleep" : "awake");
    }

    std::vector<std::string> told;
    std::map<std::string, Session> last;
    std::vector<LogindProcess> processes;
};

using Told = std::vector<std::string>;

template <typename Machine>
class LogindContractTest : public testing::Test {
  protected:
    void start() {
        machine_.logind().start(listener_);
        EXPECT_EQ(listener_.told, Told{}) << "not from within the call";
    }

    /// What was told since the last call, as soon as it is as much as is expected.
    Told told(std::size_t expected) {
        EXPECT_TRUE(machine_.happenUntil([&] { return listener_.told.size() >= expected; }));
        return std::exchange(listener_.told, {});
    }

    const Session one_ = userSession("1", 500);
    const Session two_ = behind(userSession("2", 600));
    Machine machine_;
    Recorder listener_;
};

using Machines = testing::Types<FakeLogind, BusMachine>;

struct MachineNames {
    template <typename Machine>
    static std::string GetName(int) {
        return std::is_same_v<Machine, BusMachine> ? "Bus" : "Fake";
    }
};
TYPED_TEST_SUITE(LogindContractTest, Machines, MachineNames);

TYPED_TEST(LogindContractTest, TellsAllThatIsThere) {
    Session other = this->two_;
    other.seat = "";
    other.isRemote = true;
    other.sessionClass = "background";
    other.state = "closing";
    this->machine_.put(this->one_);
    this->machine_.put(other);
    this->machine_.startLogind(100);
    this->start();
    EXPECT_EQ(this->told(1), Told{"there, 1, 2"});
    EXPECT_EQ(this->listener_.last["1"], this->one_);
    EXPECT_EQ(this->listener_.last["2"], other);
    EXPECT_EQ(this->listener_.processes[0].started, 100U);
    EXPECT_NE(this->listener_.processes[0].uniqueName, "");
}

TYPED_TEST(LogindContractTest, TellsEachChangeOfAHint) {
    this->machine_.put(this->one_);
    this->machine_.startLogind(100);
    this->start();
    this->told(1);
    this->machine_.put(locked(this->one_));
    this->machine_.put(this->one_);
    this->machine_.put(this->one_);
    this->machine_.put(locked(this->one_));
    EXPECT_EQ(this->told(3), (Told{"1 locked", "1", "1 locked"})) << "also of those in a row";
    EXPECT_EQ(this->listener_.last["1"], locked(this->one_));
}

TYPED_TEST(LogindContractTest, TellsWhoComesToTheFront) {
    this->machine_.put(this->one_);
    this->machine_.put(this->two_);
    this->machine_.startLogind(100);
    this->start();
    this->told(1);
    Session first = this->one_;
    first.isActive = false;
    Session second = this->two_;
    second.isActive = true;
    this->machine_.put(first);
    this->machine_.put(second);
    EXPECT_EQ(this->told(2), (Told{"1 behind", "2"}));
}

TYPED_TEST(LogindContractTest, TellsWhoComesAndGoes) {
    this->machine_.startLogind(100);
    this->start();
    EXPECT_EQ(this->told(1), Told{"there"});
    this->machine_.put(this->one_);
    EXPECT_EQ(this->told(1), Told{"1"});
    EXPECT_EQ(this->listener_.last["1"], this->one_);
    this->machine_.put(locked(this->one_));
    EXPECT_EQ(this->told(1), Told{"1 locked"});
    this->machine_.remove("1");
    EXPECT_EQ(this->told(1), Told{"1 gone"});
}

TYPED_TEST(LogindContractTest, TellsThatASessionCloses) {
    this->machine_.put(this->one_);
    this->machine_.startLogind(100);
    this->start();
    this->told(1);
    Session closing = this->one_;
    closing.state = "closing";
    this->machine_.put(closing);
    EXPECT_EQ(this->told(1), Told{"1 closing"});
}

TYPED_TEST(LogindContractTest, TellsOfAnotherProcess) {
    this->machine_.put(this->one_);
    this->machine_.startLogind(100);
    this->start();
    this->told(1);
    this->machine_.put(locked(this->one_));
    EXPECT_EQ(this->told(1), Told{"1 locked"});
    this->machine_.startLogind(1000);
    EXPECT_EQ(this->told(2), (Told{"away", "there, 1"}));
    EXPECT_EQ(this->listener_.processes[1].started, 1000U);
    EXPECT_NE(this->listener_.processes[1].uniqueName, this->listener_.processes[0].uniqueName);
    this->machine_.put(locked(this->one_));
    EXPECT_EQ(this->told(1), Told{"1 locked"});
}

TYPED_TEST(LogindContractTest, WhatHappensWhileItIsAwayIsToldThen) {
    this->machine_.put(this->one_);
    this->machine_.startLogind(100);
    this->start();
    this->told(1);
    this->machine_.stopLogind();
    EXPECT_EQ(this->told(1), Told{"away"});
    this->machine_.put(this->two_);
    this->machine_.startLogind(1000);
    EXPECT_EQ(this->told(1), Told{"there, 1, 2"});
}

TYPED_TEST(LogindContractTest, OneThatComesLateIsFound) {
    this->start();
    this->machine_.put(this->one_);
    this->machine_.startLogind(100);
    EXPECT_EQ(this->told(1), Told{"there, 1"});
}

TYPED_TEST(LogindContractTest, OneThatDoesNotSayWhenItStartedIsTold) {
    this->machine_.startLogind(std::nullopt);
    this->start();
    EXPECT_EQ(this->told(1), Told{"there"});
    EXPECT_EQ(this->listener_.processes[0].started, std::nullopt);
}

TYPED_TEST(LogindContractTest, BusThatGoesAndComesIsLogindThatDoes) {
    this->machine_.put(this->one_);
    this->machine_.startLogind(100);
    this->start();
    this->told(1);
    this->machine_.stopBus();
    EXPECT_EQ(this->told(1), Told{"away"});
    this->machine_.startBus();
    this->machine_.startLogind(1000);
    EXPECT_EQ(this->told(1), Told{"there, 1"});
    this->machine_.put(locked(this->one_));
    EXPECT_EQ(this->told(1), Told{"1 locked"});
}

TYPED_TEST(LogindContractTest, TellsOfSleep) {
    this->machine_.startLogind(100);
    this->start();
    this->told(1);
    this->machine_.prepareForSleep(true);
    this->machine_.prepareForSleep(false);
    EXPECT_EQ(this->told(2), (Told{"about to sleep", "awake"}));
}

TYPED_TEST(LogindContractTest, TellsOfSleepThatHasBegun) {
    this->machine_.startLogind(100);
    this->machine_.prepareForSleep(true);
    this->start();
    EXPECT_EQ(this->told(1), Told{"there, about to sleep"});
}

TYPED_TEST(LogindContractTest, DelaysSleepUntilItIsLet) {
    this->machine_.startLogind(100);
    this->start();
    this->told(1);
    EXPECT_FALSE(this->machine_.isSleepDelayed());
    this->machine_.logind().delaySleep();
    EXPECT_TRUE(this->machine_.happenUntil([&] { return this->machine_.isSleepDelayed(); }));
    this->machine_.logind().delaySleep();
    this->machine_.logind().letSleep();
    EXPECT_TRUE(this->machine_.happenUntil([&] { return !this->machine_.isSleepDelayed(); }));
    this->machine_.logind().letSleep();
    this->machine_.logind().delaySleep();
    EXPECT_TRUE(this->machine_.happenUntil([&] { return this->machine_.isSleepDelayed(); }));
}

TYPED_TEST(LogindContractTest, DelayHoldsOnEveryLogindThatComes) {
    this->start();
    this->machine_.logind().delaySleep();
    EXPECT_FALSE(this->machine_.isSleepDelayed());
    this->machine_.startLogind(100);
    EXPECT_TRUE(this->machine_.happenUntil([&] { return this->machine_.isSleepDelayed(); }));
    this->told(1);
    this->machine_.startLogind(1000);
    this->told(2);
    EXPECT_TRUE(this->machine_.happenUntil([&] { return this->machine_.isSleepDelayed(); }));
}

// The real one alone.

class BusLogindTest : public LogindContractTest<BusMachine> {
  protected:
    void startWithOne() {
        machine_.put(one_);
        machine_.startLogind(100);
        start();
        EXPECT_EQ(told(1), Told{"there, 1"});
    }

    /// Whatever was sent before has been heard when this has.
    void awaitEnd() {
        machine_.prepareForSleep(false);
        EXPECT_EQ(told(1), Told{"awake"});
    }
};

TEST_F(BusLogindTest, ChangeToldBySomebodyElseCountsForNothing) {
    startWithOne();
    machine_.pretend(locked(one_));
    awaitEnd();
}

TEST_F(BusLogindTest, ClosingIsSeenInTheFilesAlone) {
    startWithOne();
    Session closing = one_;
    closing.state = "closing";
    machine_.putIntoFile(closing);
    EXPECT_EQ(told(1), Told{"1 closing"});
}

TEST_F(BusLogindTest, FileThatChangedNothingIsNoNews) {
    startWithOne();
    const unsigned before = machine_.questions();
    machine_.touchFile();
    EXPECT_TRUE(machine_.happenUntil([&] { return machine_.questions() > before; }));
    awaitEnd();
}

TEST_F(BusLogindTest, RefusedDelayIsALineOnce) {
    machine_.refuseDelays(true);
    startWithOne();
    machine_.logind().delaySleep();
    EXPECT_TRUE(machine_.happenUntil([&] { return !machine_.lines().empty(); }));
    machine_.logind().delaySleep();
    EXPECT_TRUE(machine_.happenUntil([&] { return machine_.delaysAsked() == 2; }));
    awaitEnd();
    EXPECT_EQ(machine_.lines(),
              Told{"sleep cannot be delayed until USB is closed: Permission denied"});
    machine_.refuseDelays(false);
    machine_.logind().delaySleep();
    EXPECT_TRUE(machine_.happenUntil([&] { return machine_.isSleepDelayed(); }));
}

TEST_F(BusLogindTest, DelayThatComesWhenNobodyWantsItIsLetGo) {
    startWithOne();
    machine_.logind().delaySleep();
    machine_.logind().letSleep();
    EXPECT_TRUE(machine_.happenUntil([&] { return machine_.delaysAsked() == 1; }));
    EXPECT_TRUE(machine_.happenUntil([&] { return !machine_.isSleepDelayed(); }));
}

TEST_F(BusLogindTest, LogindThatDoesNotAnswerIsAskedAgain) {
    machine_.failToList(true);
    machine_.put(one_);
    machine_.startLogind(100);
    start();
    unsigned seconds = 0;
    EXPECT_TRUE(machine_.happenUntil([&] { return ++seconds > 50; }));
    EXPECT_EQ(listener_.told, Told{});
    machine_.failToList(false);
    EXPECT_EQ(told(1), Told{"there, 1"});
}

TEST_F(BusLogindTest, NothingWaitsForTimeWhenAllIsThere) {
    startWithOne();
    EXPECT_EQ(machine_.timers.running(), 0U);
}

TEST(BusLogindWithoutBusTest, BusThatComesLateIsFound) {
    BusMachine machine(BusMachine::At::later);
    Recorder listener;
    machine.logind().start(listener);
    machine.timers.pass(std::chrono::seconds(10));
    EXPECT_EQ(machine.lines(), Told{"the message bus cannot be reached, and is tried again and "
                                    "again: No such file or directory."});
    machine.startBus();
    machine.startLogind(100);
    EXPECT_TRUE(machine.happenUntil([&] { return !listener.told.empty(); }));
    EXPECT_EQ(listener.told, Told{"there"});
    EXPECT_EQ(machine.lines().size(), 1U);
}

} // namespace
} // namespace keystrand::sessions
