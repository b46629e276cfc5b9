// One function of the library waits for the kernel side once in all, however much it sends.

#include "tests/KSTLib/KernelServerFixture.h"

#include <gtest/gtest.h>

#include <cerrno>

namespace {

using support::Packet;

constexpr KSTStatus kTimedOut = -1000 - ETIMEDOUT;

class Deadline : public support::KernelServerFixture {
  protected:
    /// The kernel side says nothing to that code.
    void silence(int silent) {
        setCallLimit(kLimit);
        handle = [silent](const Peer&, int code, const Packet&) {
            return code == silent;
        };
    }

    /// Each request has the patience of the connection, which is far longer: what takes less had
    /// one limit for all.
    static void expectWithin(const std::function<void()>& call) {
        const auto begin = std::chrono::steady_clock::now();
        call();
        EXPECT_LT(std::chrono::steady_clock::now() - begin, kPatient);
    }

    /// The next call has a connection of its own and its own answer.
    void expectTheNextCallWorks() {
        handle = nullptr;
        setCallLimit(kPatient);
        KSTContextRef context = openContext();
        ASSERT_NE(context, nullptr);
        EXPECT_EQ(ask(context, "yes"), 1);
        EXPECT_EQ(ask(context, "no"), 0);
        EXPECT_EQ(KSTContextDelete(context, false), 0);
    }

  private:
    /// Room enough for the answers that come before the silence, however slow the machine is.
    static constexpr std::chrono::milliseconds kLimit{500};
};

} // namespace

TEST_F(Deadline, LevelIsNotAskedForOverAConnectionThatTheFailureEnded) {
    silence(1);
    KSTContextRef context = nullptr;
    expectWithin([&] { EXPECT_EQ(KSTContextCreate(&context), kTimedOut); });
    EXPECT_EQ(context, nullptr);
    EXPECT_EQ(commands(), (std::vector<int>{1}));
    // It ended with the call, not with the next one.
    EXPECT_TRUE(await(kEnd));
    expectTheNextCallWorks();
}

TEST_F(Deadline, LevelIsAskedForAfterAnyOtherFailure) {
    handle = [](const Peer& peer, int code, const Packet& request) {
        if (code == 1) {
            peer.send(support::reply(request, -9, 0, ""));
        }
        return code == 1;
    };
    KSTContextRef context = nullptr;
    EXPECT_EQ(KSTContextCreate(&context), -9);
    EXPECT_EQ(commands(), (std::vector<int>{1, kLogLevel}));
}

TEST_F(Deadline, HangUpLeavesTheLevelToo) {
    handle = [](const Peer& peer, int code, const Packet& request) {
        if (code == 1) {
            Packet malformed = support::reply(request, 0, 0, "");
            malformed[0] = 'X';
            peer.send(malformed);
        }
        return code == 1;
    };
    KSTContextRef context = nullptr;
    EXPECT_EQ(KSTContextCreate(&context), -1000 - EPROTO);
    EXPECT_EQ(commands(), (std::vector<int>{1}));
    expectTheNextCallWorks();
}

TEST_F(Deadline, WrongArgumentAsksForTheLevelWithinTheSameTime) {
    expectTheNextCallWorks();
    silence(kLogLevel);
    expectWithin([] { EXPECT_EQ(KSTContextCreate(nullptr), -3); });
    EXPECT_EQ(commands().back(), kLogLevel);
    expectTheNextCallWorks();
}

TEST_F(Deadline, LookupAndOpening) {
    for (const int silent : {kFind, kOpen}) {
        silence(silent);
        KSTContextRef context = nullptr;
        expectWithin([&] { EXPECT_EQ(KSTContextCreate(&context), kTimedOut); });
        EXPECT_TRUE(commands().empty());
    }
    expectTheNextCallWorks();
}

TEST_F(Deadline, TemporaryContextIsDeletedBehindACommandWithoutAnAnswer) {
    KSTCredential* credential = nullptr;
    ASSERT_EQ(KSTCredentialCreate(kKSTCredentialTypePassphraseEntered, &credential), 0);
    silence(5);
    expectWithin([&] { EXPECT_EQ(KSTGlobalContextAddCredential(credential), kTimedOut); });
    KSTCredentialDelete(credential);
    ASSERT_TRUE(await(2));
    ASSERT_TRUE(await(kEnd));
    const std::vector<Seen> arrived = seen();
    ASSERT_GE(arrived.size(), 3U);
    const auto last = arrived.end() - 3;
    EXPECT_EQ(last[0].code, 5);
    EXPECT_EQ(last[1].code, 2);
    EXPECT_EQ(last[1].connection, last[0].connection);
    EXPECT_EQ(last[2].code, kEnd);
    EXPECT_EQ(last[2].connection, last[0].connection);
    gAllocatedBytes -= 1;
    expectTheNextCallWorks();
}

TEST_F(Deadline, TemporaryContextOfACallWithASlowBlockIsDeletedUnwaited) {
    std::atomic<bool> answersDeletion = false;
    handle = [&](const Peer& peer, int code, const Packet& request) {
        if (code == 2) {
            // Late, and nobody's.
            peer.send(support::reply(request, -7, 0, ""));
            answersDeletion = true;
        }
        return code == 2;
    };
    KSTStatus status = -1;
    KSTGlobalContextVerifyPolicy("yes", false, nullptr, 0,
                                 [&](KSTStatus err, bool, const KSTRequirement*) {
                                     status = err;
                                     outlastTheCall();
                                 });
    EXPECT_EQ(status, 0);
    ASSERT_TRUE(await(2));
    ASSERT_TRUE(await(kEnd));
    EXPECT_TRUE(answersDeletion);
    gAllocatedBytes -= 1;
    expectTheNextCallWorks();
}

TEST_F(Deadline, CallFromABlockHasTimeOfItsOwn) {
    KSTContextRef context = openContext();
    int answer = -1;
    EXPECT_EQ(KSTContextVerifyPolicy(context, "yes",
                                     [&](bool, const KSTRequirement*) {
                                         outlastTheCall();
                                         answer = ask(context, "yes");
                                     }),
              0);
    EXPECT_EQ(answer, 1);
    EXPECT_EQ(KSTContextDelete(context, true), 0);
}
