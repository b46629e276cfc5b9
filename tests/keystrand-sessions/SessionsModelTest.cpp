#include "keystrand-sessions/SessionsModel.h"

#include "tests/keystrand-sessions/Sessions.h"

#include <gtest/gtest.h>

#include <string>
#include <utility>
#include <vector>

namespace keystrand::sessions {
namespace {

/// A logind that began at 100, and another one after it, at 1000.
const LogindProcess kFirst{":1.5", 100};
const LogindProcess kSecond{":1.9", 1000};
constexpr MonotonicTime kBeforeFirst = 50;
constexpr MonotonicTime kOnFirst = 500;
constexpr MonotonicTime kOnSecond = 1500;

TEST(SessionsModelTest, NothingKnownIsLocked) {
    EXPECT_TRUE(SessionsModel().isLocked());
}

TEST(SessionsModelTest, NobodyIsLocked) {
    SessionsModel model;
    model.logindIs(kFirst, {});
    EXPECT_TRUE(model.isLocked());
}

TEST(SessionsModelTest, HintOfTheActiveSessionLocksAndUnlocks) {
    SessionsModel model;
    model.logindIs(kFirst, {userSession("1", kOnFirst)});
    EXPECT_FALSE(model.isLocked());
    model.sessionIs(locked(userSession("1", kOnFirst)));
    EXPECT_TRUE(model.isLocked());
    model.sessionIs(userSession("1", kOnFirst));
    EXPECT_FALSE(model.isLocked());
}

TEST(SessionsModelTest, LoginUnlocksAndLogoutLocks) {
    SessionsModel model;
    model.logindIs(kFirst, {});
    model.sessionIs(userSession("1", kOnFirst));
    EXPECT_FALSE(model.isLocked());
    model.sessionIsGone("2");
    EXPECT_FALSE(model.isLocked());
    model.sessionIsGone("1");
    EXPECT_TRUE(model.isLocked());
}

TEST(SessionsModelTest, OnlyAUsersActiveLocalSessionOnASeatCounts) {
    const std::vector<std::pair<const char*, void (*)(Session&)>> changes = {
        {"not active",
         [](Session& session) {
             session.isActive = false;
         }},
        {"remote",
         [](Session& session) {
             session.isRemote = true;
         }},
        {"no seat",
         [](Session& session) {
             session.seat.clear();
         }},
        {"closing",
         [](Session& session) {
             session.state = "closing";
         }},
        {"greeter",
         [](Session& session) {
             session.sessionClass = "greeter";
         }},
        {"lock-screen",
         [](Session& session) {
             session.sessionClass = "lock-screen";
         }},
        {"background",
         [](Session& session) {
             session.sessionClass = "background";
         }},
        {"manager",
         [](Session& session) {
             session.sessionClass = "manager";
         }},
        {"no class",
         [](Session& session) {
             session.sessionClass.clear();
         }},
        {"hint",
         [](Session& session) {
             session.isHintSet = true;
         }},
    };
    for (const auto& [what, change] : changes) {
        SessionsModel model;
        Session session = userSession("1", kOnFirst);
        model.logindIs(kFirst, {session});
        EXPECT_FALSE(model.isLocked());
        change(session);
        model.sessionIs(session);
        EXPECT_TRUE(model.isLocked()) << what;
        model.logindIs(kFirst, {session});
        EXPECT_TRUE(model.isLocked()) << what << ", from the start";
    }
}

TEST(SessionsModelTest, StatesBesideClosingCount) {
    for (const std::string state : {"opening", "online", "active"}) {
        SessionsModel model;
        Session session = userSession("1", kOnFirst);
        session.state = state;
        model.logindIs(kFirst, {session});
        EXPECT_FALSE(model.isLocked()) << state;
    }
}

TEST(SessionsModelTest, AnyUnlockedSeatUnlocks) {
    const auto at = [](Session session, const std::string& seat) {
        session.seat = seat;
        return session;
    };
    SessionsModel model;
    const Session here = userSession("1", kOnFirst);
    const Session there = at(userSession("2", kOnFirst), "seat1");
    model.logindIs(kFirst, {here, there});
    EXPECT_FALSE(model.isLocked());
    model.sessionIs(locked(here));
    EXPECT_FALSE(model.isLocked()) << "somebody works at the other seat";
    model.sessionIs(locked(there));
    EXPECT_TRUE(model.isLocked());
    model.sessionIs(here);
    EXPECT_FALSE(model.isLocked());
    Session greeter = at(userSession("3", kOnFirst), "seat1");
    greeter.sessionClass = "greeter";
    model.sessionIsGone("2");
    model.sessionIs(greeter);
    EXPECT_FALSE(model.isLocked()) << "a seat that is free does not lock the one that is used";
}

TEST(SessionsModelTest, SwitchingUsersShowsTheStateOfWhoIsInFront) {
    SessionsModel model;
    const Session first = userSession("1", kOnFirst);
    const Session second = userSession("2", kOnFirst);
    model.logindIs(kFirst, {first, behind(locked(second))});
    EXPECT_FALSE(model.isLocked());
    model.sessionIs(behind(first));
    EXPECT_TRUE(model.isLocked());
    model.sessionIs(locked(second));
    EXPECT_TRUE(model.isLocked()) << "the first one is unlocked, and not in front";
    model.sessionIs(second);
    EXPECT_FALSE(model.isLocked());
    model.sessionIs(behind(second));
    model.sessionIs(locked(first));
    EXPECT_TRUE(model.isLocked());
}

TEST(SessionsModelTest, ForgottenHintStaysLocked) {
    SessionsModel model;
    const Session session = userSession("1", kOnFirst);
    model.logindIs(kFirst, {locked(session)});
    model.logindIs(kSecond, {session});
    EXPECT_TRUE(model.isLocked());
    model.sessionIs(behind(session));
    model.sessionIs(session);
    EXPECT_TRUE(model.isLocked()) << "another change says nothing about the hint";
    model.sessionIs(locked(session));
    EXPECT_TRUE(model.isLocked());
    model.sessionIs(session);
    EXPECT_FALSE(model.isLocked()) << "set and cleared on this logind";
}

TEST(SessionsModelTest, ForgottenHintIsRememberedOverEveryRestart) {
    SessionsModel model;
    const Session session = userSession("1", kOnFirst);
    model.logindIs(kFirst, {locked(session)});
    model.logindIs(kSecond, {session});
    model.logindIs({":1.12", 2000}, {session});
    EXPECT_TRUE(model.isLocked());
}

TEST(SessionsModelTest, NewLoginUnlocksBesideAForgottenHint) {
    SessionsModel model;
    const Session session = userSession("1", kOnFirst);
    model.logindIs(kFirst, {locked(session)});
    model.logindIs(kSecond, {session});
    model.sessionIs(behind(session));
    model.sessionIs(userSession("2", kOnSecond));
    EXPECT_FALSE(model.isLocked());
    model.sessionIsGone("2");
    model.sessionIs(session);
    EXPECT_TRUE(model.isLocked());
}

TEST(SessionsModelTest, UnlockedStaysUnlockedOverARestart) {
    SessionsModel model;
    const Session session = userSession("1", kOnFirst);
    model.logindIs(kFirst, {session});
    model.logindIs(kSecond, {session});
    EXPECT_FALSE(model.isLocked());
    model.sessionIs(locked(session));
    EXPECT_TRUE(model.isLocked());
    model.logindIs({":1.12", 2000}, {session});
    EXPECT_TRUE(model.isLocked()) << "locked on the second, forgotten by the third";
}

TEST(SessionsModelTest, UnlockedBehindAnotherStaysUnlockedOverARestart) {
    SessionsModel model;
    const Session session = userSession("1", kOnFirst);
    model.logindIs(kFirst, {behind(session)});
    model.logindIs(kSecond, {behind(session)});
    model.sessionIs(session);
    EXPECT_FALSE(model.isLocked());
}

TEST(SessionsModelTest, SetHintHoldsOnAnyLogind) {
    SessionsModel model;
    const Session session = userSession("1", kOnFirst);
    model.logindIs(kFirst, {session});
    model.logindIs(kSecond, {locked(session)});
    EXPECT_TRUE(model.isLocked());
    model.sessionIs(session);
    EXPECT_FALSE(model.isLocked());
}

TEST(SessionsModelTest, SessionOlderThanLogindIsLockedAtFirst) {
    SessionsModel model;
    const Session session = userSession("1", kBeforeFirst);
    model.logindIs(kFirst, {session});
    EXPECT_TRUE(model.isLocked()) << "its hint may have been forgotten";
    model.sessionIs(session);
    EXPECT_TRUE(model.isLocked());
    model.sessionIs(locked(session));
    model.sessionIs(session);
    EXPECT_FALSE(model.isLocked());
}

TEST(SessionsModelTest, SessionOfTheMomentAtWhichLogindStartedIsNotYounger) {
    for (const MonotonicTime created : {99U, 100U, 101U}) {
        SessionsModel model;
        model.logindIs(kFirst, {userSession("1", created)});
        EXPECT_EQ(model.isLocked(), created <= 100) << created;
    }
}

TEST(SessionsModelTest, LogindThatDoesNotSayWhenItStartedIsTrustedWithNewSessions) {
    const LogindProcess process{":1.5", std::nullopt};
    SessionsModel model;
    model.logindIs(process, {userSession("1", kOnFirst)});
    EXPECT_TRUE(model.isLocked());
    model.sessionIs(userSession("2", kOnFirst + 1));
    EXPECT_FALSE(model.isLocked());
    model.sessionIs(locked(userSession("2", kOnFirst + 1)));
    model.logindIs(process, {userSession("2", kOnFirst + 1)});
    EXPECT_TRUE(model.isLocked()) << "it may be another one of the same name";
}

TEST(SessionsModelTest, SameLogindSeenAgainKeepsWhatIsKnown) {
    SessionsModel model;
    const Session old = userSession("1", kBeforeFirst);
    model.logindIs(kFirst, {old});
    model.sessionIs(locked(old));
    model.logindIs(kFirst, {locked(old)});
    EXPECT_TRUE(model.isLocked());
    model.logindIs(kFirst, {old});
    EXPECT_FALSE(model.isLocked()) << "it was cleared on the same logind, which nobody heard";
}

TEST(SessionsModelTest, NameAloneIsNotTheSameLogind) {
    SessionsModel model;
    const Session session = userSession("1", kOnFirst);
    model.logindIs(kFirst, {locked(session)});
    model.logindIs({kFirst.uniqueName, 1000}, {session});
    EXPECT_TRUE(model.isLocked()) << "a new bus gives the same names again";
}

TEST(SessionsModelTest, AnotherSessionOfTheSameNumberIsAnother) {
    SessionsModel model;
    model.logindIs(kFirst, {userSession("1", kOnFirst)});
    model.logindIs(kSecond, {userSession("1", kOnFirst + 1)});
    EXPECT_TRUE(model.isLocked()) << "not the one that was seen unlocked";
    model.sessionIs(userSession("1", kOnSecond));
    EXPECT_FALSE(model.isLocked()) << "a new login";
}

TEST(SessionsModelTest, LogindAwayTooLongLocksUntilTheHintIsSetAndCleared) {
    SessionsModel model;
    const Session session = userSession("1", kOnFirst);
    model.logindIs(kFirst, {session});
    model.logindWasAwayTooLong();
    EXPECT_TRUE(model.isLocked());
    model.logindIs(kSecond, {session});
    EXPECT_TRUE(model.isLocked());
    model.sessionIs(locked(session));
    model.sessionIs(session);
    EXPECT_FALSE(model.isLocked());
}

TEST(SessionsModelTest, SameLogindAfterTooLongIsBelieved) {
    SessionsModel model;
    const Session session = userSession("1", kOnFirst);
    model.logindIs(kFirst, {session});
    model.logindWasAwayTooLong();
    model.logindIs(kFirst, {session});
    EXPECT_FALSE(model.isLocked()) << "it has forgotten nothing";
}

} // namespace
} // namespace keystrand::sessions
