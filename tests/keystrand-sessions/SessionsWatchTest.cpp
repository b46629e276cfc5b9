#include "keystrand-sessions/SessionsWatch.h"

#include "tests/keystrand-sessions/FakeLogind.h"
#include "tests/keystrand-sessions/Sessions.h"
#include "tests/keystrand/FakeTimers.h"

#include <gtest/gtest.h>

#include <set>
#include <string>
#include <utility>
#include <vector>

namespace keystrand::sessions {
namespace {

using std::chrono::milliseconds;
using std::chrono::minutes;
using std::chrono::seconds;

/// A keystrand that is there when the test says so.
class FakeLink : public KeystrandLink {
  public:
    void start(Handlers handlers) override { handlers_ = std::move(handlers); }
    [[nodiscard]] bool isConnected() const override { return isConnected_; }
    void say(Word word) override {
        if (isConnected_) {
            said_.push_back(word);
        }
    }

    void connect() {
        isConnected_ = true;
        handlers_.connected();
    }
    void answerClosed() { handlers_.closed(); }
    void hangUp() {
        isConnected_ = false;
        handlers_.lost();
    }

    [[nodiscard]] std::vector<Word> said() { return std::exchange(said_, {}); }

  private:
    Handlers handlers_;
    bool isConnected_ = false;
    std::vector<Word> said_;
};

using Words = std::vector<Word>;
using Lines = std::vector<std::string>;

class SessionsWatchTest : public testing::Test {
  protected:
    SessionsWatchTest() { watch_.start(); }

    /// A logind that began at 100, with somebody who has logged in, and a keystrand that was told.
    void startUnlocked() {
        logind_.startLogind(100);
        logind_.put(session_);
        logind_.happen();
        link_.connect();
        ASSERT_EQ(link_.said(), (Words{Word::unlocked, Word::awake}));
        ASSERT_TRUE(logind_.isSleepDelayed());
    }

    void put(const Session& session) {
        logind_.put(session);
        logind_.happen();
    }
    void prepareForSleep(bool isAboutTo) {
        logind_.prepareForSleep(isAboutTo);
        logind_.happen();
    }

    [[nodiscard]] Lines lines() { return std::exchange(lines_, {}); }

    const Session session_ = userSession("1", 200);
    FakeLogind logind_;
    FakeLink link_;
    FakeTimers timers_;
    Lines lines_;
    SessionsWatch watch_{logind_, link_, timers_, [this](SessionsLine, const std::string& line) {
                             lines_.push_back(line);
                         }};
};

TEST_F(SessionsWatchTest, ConnectionIsToldTheStateAndThatTheMachineIsAwake) {
    logind_.put(session_);
    logind_.startLogind(500);
    logind_.happen();
    link_.connect();
    EXPECT_EQ(link_.said(), (Words{Word::locked, Word::awake})) << "it is older than logind";
    put(locked(session_));
    EXPECT_EQ(link_.said(), Words{});
    put(session_);
    EXPECT_EQ(link_.said(), Words{Word::unlocked});
    link_.hangUp();
    link_.connect();
    EXPECT_EQ(link_.said(), (Words{Word::unlocked, Word::awake}));
    EXPECT_EQ(lines(), Lines{});
}

TEST_F(SessionsWatchTest, ConnectionIsToldNothingBeforeTheStateIsKnown) {
    link_.connect();
    EXPECT_EQ(link_.said(), Words{});
    logind_.startLogind(100);
    logind_.happen();
    EXPECT_EQ(link_.said(), (Words{Word::locked, Word::awake}));
}

TEST_F(SessionsWatchTest, NoLogindForAMinuteAfterTheStartIsLocked) {
    link_.connect();
    timers_.pass(minutes(1) - milliseconds(1));
    EXPECT_EQ(link_.said(), Words{});
    EXPECT_EQ(lines(), Lines{});
    timers_.pass(milliseconds(1));
    EXPECT_EQ(link_.said(), (Words{Word::locked, Word::awake}));
    EXPECT_EQ(lines(), Lines{"logind was away for a minute; the machine counts as locked."});
}

TEST_F(SessionsWatchTest, OnlyChangesAreTold) {
    startUnlocked();
    put(locked(session_));
    EXPECT_EQ(link_.said(), Words{Word::locked});
    put(behind(locked(session_)));
    EXPECT_EQ(link_.said(), Words{});
    put(userSession("2", 300));
    EXPECT_EQ(link_.said(), Words{Word::unlocked});
    logind_.remove("2");
    logind_.happen();
    EXPECT_EQ(link_.said(), Words{Word::locked});
}

TEST_F(SessionsWatchTest, LogindAwayKeepsTheStateForAMinute) {
    startUnlocked();
    logind_.stopLogind();
    logind_.happen();
    EXPECT_EQ(lines(), Lines{"logind is away; the machine stays unlocked until it is back, for a "
                             "minute at the most."});
    timers_.pass(minutes(1) - milliseconds(1));
    EXPECT_EQ(link_.said(), Words{});
    timers_.pass(milliseconds(1));
    EXPECT_EQ(link_.said(), Words{Word::locked});
    EXPECT_EQ(lines(), Lines{"logind was away for a minute; the machine counts as locked."});
    logind_.startLogind(1000);
    logind_.happen();
    EXPECT_EQ(lines(), Lines{"logind is back."});
    EXPECT_EQ(link_.said(), Words{}) << "the session stays locked";
    EXPECT_EQ(timers_.running(), 0U);
}

TEST_F(SessionsWatchTest, LogindRestartedInTimeChangesNothing) {
    startUnlocked();
    logind_.startLogind(1000);
    logind_.happen();
    timers_.pass(minutes(5));
    EXPECT_EQ(link_.said(), Words{});
    put(locked(session_));
    EXPECT_EQ(link_.said(), Words{Word::locked});
    logind_.startLogind(2000);
    logind_.happen();
    EXPECT_EQ(link_.said(), Words{}) << "the hint is forgotten, and the machine stays locked";
    EXPECT_EQ(lines(), (Lines{"logind is away; the machine stays unlocked until it is back, for a "
                              "minute at the most.",
                              "logind is back.", "logind is away; the machine stays locked.",
                              "logind is back."}));
    EXPECT_EQ(timers_.running(), 0U) << "nothing wakes the process";
}

TEST_F(SessionsWatchTest, SleepWaitsForTheAnswer) {
    startUnlocked();
    prepareForSleep(true);
    EXPECT_EQ(link_.said(), Words{Word::goingToSleep});
    EXPECT_TRUE(logind_.isSleepDelayed());
    link_.answerClosed();
    EXPECT_FALSE(logind_.isSleepDelayed());
    EXPECT_EQ(timers_.running(), 0U);
    prepareForSleep(false);
    EXPECT_EQ(link_.said(), (Words{Word::unlocked, Word::awake}));
    EXPECT_TRUE(logind_.isSleepDelayed()) << "the next time, too";
    EXPECT_EQ(lines(), Lines{});
}

TEST_F(SessionsWatchTest, SleepDoesNotWaitLongerThanFourSeconds) {
    startUnlocked();
    prepareForSleep(true);
    timers_.pass(seconds(4) - milliseconds(1));
    EXPECT_TRUE(logind_.isSleepDelayed());
    EXPECT_EQ(lines(), Lines{});
    timers_.pass(milliseconds(1));
    EXPECT_FALSE(logind_.isSleepDelayed());
    EXPECT_EQ(lines(), Lines{"keystrand does not answer; the machine goes to sleep without it."});
    link_.answerClosed();
    prepareForSleep(false);
    EXPECT_TRUE(logind_.isSleepDelayed());
}

TEST_F(SessionsWatchTest, WhatHappensOnTheWayToSleepIsTold) {
    startUnlocked();
    prepareForSleep(true);
    put(locked(session_));
    EXPECT_EQ(link_.said(), (Words{Word::goingToSleep, Word::locked}));
    link_.answerClosed();
    prepareForSleep(false);
    EXPECT_EQ(link_.said(), (Words{Word::locked, Word::awake}));
}

TEST_F(SessionsWatchTest, SleepThatWasCalledOffIsWaking) {
    startUnlocked();
    prepareForSleep(true);
    prepareForSleep(false);
    EXPECT_EQ(link_.said(), (Words{Word::goingToSleep, Word::unlocked, Word::awake}));
    timers_.pass(minutes(1));
    EXPECT_TRUE(logind_.isSleepDelayed());
    EXPECT_EQ(lines(), Lines{});
}

TEST_F(SessionsWatchTest, SleepDoesNotWaitForNobody) {
    startUnlocked();
    link_.hangUp();
    EXPECT_TRUE(logind_.isSleepDelayed());
    prepareForSleep(true);
    EXPECT_FALSE(logind_.isSleepDelayed());
    EXPECT_EQ(lines(), Lines{"the machine goes to sleep, and keystrand is not there to be told."});
    link_.connect();
    EXPECT_EQ(link_.said(), (Words{Word::unlocked, Word::goingToSleep}));
    link_.answerClosed();
    prepareForSleep(false);
    EXPECT_EQ(link_.said(), (Words{Word::unlocked, Word::awake}));
    EXPECT_TRUE(logind_.isSleepDelayed());
}

TEST_F(SessionsWatchTest, SleepDoesNotWaitForWhoHangsUp) {
    startUnlocked();
    prepareForSleep(true);
    link_.hangUp();
    EXPECT_FALSE(logind_.isSleepDelayed());
    EXPECT_EQ(timers_.running(), 0U);
}

TEST_F(SessionsWatchTest, AnswerWithoutAQuestionLetsNothingGo) {
    startUnlocked();
    link_.answerClosed();
    EXPECT_TRUE(logind_.isSleepDelayed());
}

TEST_F(SessionsWatchTest, LogindThatIsFoundOnTheWayToSleepIsToldOf) {
    logind_.startLogind(100);
    logind_.prepareForSleep(true);
    logind_.happen();
    link_.connect();
    EXPECT_EQ(link_.said(), (Words{Word::locked, Word::goingToSleep}));
    logind_.startLogind(1000);
    logind_.happen();
    EXPECT_EQ(link_.said(), (Words{Word::locked, Word::awake})) << "the new one knows of no sleep";
}

TEST(SessionsLineClasses, EachClassIsInItsPlaceWithAnIdentifierOfItsOwn) {
    std::set<std::string_view> identifiers;
    for (std::size_t i = 0; i < kSessionsLineClasses.size(); ++i) {
        EXPECT_EQ(static_cast<std::size_t>(kSessionsLineClasses[i].about), i);
        EXPECT_EQ(kSessionsLineClasses[i].messageId.size(), 32U);
        identifiers.insert(kSessionsLineClasses[i].messageId);
    }
    EXPECT_EQ(identifiers.size(), kSessionsLineClasses.size());
    EXPECT_EQ(static_cast<std::size_t>(SessionsLine::noBus) + 1, kSessionsLineClasses.size());
}

} // namespace
} // namespace keystrand::sessions
