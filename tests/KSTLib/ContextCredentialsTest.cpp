#include "KSTLib/ContextCredentials.h"

#include "tests/KSTLib/ContextFixture.h"
#include "tests/common/CredentialSamples.h"

#include <gtest/gtest.h>

#include <string>

namespace {

using support::asCredential;
using support::Bytes;
using support::credentialBytes;
using support::Lines;
using support::ScriptedGate;

/// A function that sends a credential, under its name.
struct CredentialFunction {
    const char* name;
    KSTStatus (*call)(KSTContextRef context, const KSTCredential* credential, KSTScope scope);
    std::uint8_t code;
    /// How often the serialisers pass a failure up.
    int levels;
};

const CredentialFunction kCredentialFunctions[] = {
    {"KSTContextAddCredentialWithScope", KSTContextAddCredentialWithScope, 5, 1},
    {"KSTContextRemoveCredentialsByValueAndScope", KSTContextRemoveCredentialsByValueAndScope, 6,
     2},
    {"KSTContextReplacePassphraseCredentialsWithScope",
     KSTContextReplacePassphraseCredentialsWithScope, 15, 2},
};

/// A function that sends a type or purpose and a scope.
struct NumberFunction {
    const char* name;
    KSTStatus (*call)(KSTContextRef context, std::uint32_t first, std::uint32_t second);
    std::uint8_t code;
};

const NumberFunction kRemoveFunctions[] = {
    {"KSTContextRemoveCredentialsByTypeAndScope", KSTContextRemoveCredentialsByTypeAndScope, 9},
    {"KSTContextRemovePassphraseCredentialsByPurposeAndScope",
     KSTContextRemovePassphraseCredentialsByPurposeAndScope, 16},
};

const NumberFunction kContainsFunctions[] = {
    {"KSTContextContainsCredentialTypeEx", KSTContextContainsCredentialTypeEx, 4},
    {"KSTContextContainsPassphraseCredentialWithPurpose",
     KSTContextContainsPassphraseCredentialWithPurpose, 13},
};

const Bytes kNoHandle(16);
constexpr const char* kScopeCheck = "context || scope == kKSTScopeGlobal";

class ContextCredentials : public support::ContextFixture {
  protected:
    /// Handle, credential, scope.
    static Bytes credentialPayload(const Bytes& handle, const Bytes& record, std::uint8_t scope) {
        return joined(joined(handle, record), {scope, 0, 0, 0});
    }

    Bytes passphrase = credentialBytes(2);
};

/// The global functions leave one byte of their context in the account.
class GlobalCredentials : public ContextCredentials {
  protected:
    void TearDown() override {
        gAllocatedBytes -= created;
        ContextCredentials::TearDown();
    }

    int created = 0;
};

} // namespace

TEST_F(ContextCredentials, CredentialFrames) {
    for (const CredentialFunction& function : kCredentialFunctions) {
        SCOPED_TRACE(function.name);
        EXPECT_EQ(function.call(context, asCredential(passphrase), 1), 0);
        EXPECT_EQ(function.call(nullptr, asCredential(passphrase), 2), 0);
        EXPECT_EQ(channel.structCalls.front().offeredSize.value_or(0), 0U);
        EXPECT_EQ(sent(), (std::vector<Bytes>{
                              frame(function.code, credentialPayload(kHandle, passphrase, 1)),
                              frame(function.code, credentialPayload(kNoHandle, passphrase, 2))}));
    }
    expectLogged({});
    EXPECT_EQ(printed(), "");
}

TEST_F(ContextCredentials, CredentialArguments) {
    for (const CredentialFunction& function : kCredentialFunctions) {
        SCOPED_TRACE(function.name);
        for (const KSTScope scope : {0U, 1U, 3U}) {
            EXPECT_EQ(function.call(nullptr, nullptr, scope), -3);
            expectLogged({failedCheck(kScopeCheck), returned(function.name, -3)});
        }
        EXPECT_EQ(function.call(nullptr, nullptr, 2), -3);
        expectLogged({failedCheck("credential"), returned(function.name, -3)});
    }
    EXPECT_TRUE(sent().empty());
}

TEST_F(ContextCredentials, CredentialThatCannotBeWritten) {
    support::putU32(passphrase, 0, 13);
    const std::string failed3 = "0xfffffffffffffffd";
    for (const CredentialFunction& function : kCredentialFunctions) {
        SCOPED_TRACE(function.name);
        EXPECT_EQ(function.call(context, asCredential(passphrase), 1), -3);
        Lines lines = {serializerCheck("0")};
        for (int level = 0; level < function.levels; ++level) {
            lines.push_back(serializerCheck("err == 0 ", failed3));
        }
        lines.push_back(failedCheck("err == 0 ", failed3));
        lines.push_back(returned(function.name, -3));
        expectLogged(lines);
    }
    EXPECT_TRUE(sent().empty());
}

TEST_F(ContextCredentials, CredentialCommandsThatFail) {
    for (const CredentialFunction& function : kCredentialFunctions) {
        SCOPED_TRACE(function.name);
        answers[function.code].status = -9;
        const ScriptedGate gate;
        EXPECT_EQ(function.call(context, asCredential(passphrase), 1), -9);
        EXPECT_TRUE(gate.everyFreeWasWiped);
        EXPECT_EQ(gate.freed, (std::vector<std::size_t>{196, 188}));
        expectLogged({failedWith9(), failedWith9(), returned(function.name, -9)});
    }
    EXPECT_TRUE(channel.scalarCalls.empty());
}

TEST_F(ContextCredentials, CredentialCommandsWithEveryAllocationFailing) {
    for (const CredentialFunction& function : kCredentialFunctions) {
        SCOPED_TRACE(function.name);
        EXPECT_EQ(
            failEachAllocation([&] { return function.call(context, asCredential(passphrase), 1); }),
            2U);
        EXPECT_EQ(logged().front(), failedCheck("inputBuffer"));
        log.clear();
    }
}

TEST_F(ContextCredentials, NumberFrames) {
    for (const NumberFunction& function : kRemoveFunctions) {
        SCOPED_TRACE(function.name);
        EXPECT_EQ(function.call(context, 0x01020304, 1), 0);
        EXPECT_EQ(function.call(nullptr, 0xffffffff, 2), 0);
        EXPECT_EQ(channel.structCalls.front().offeredSize.value_or(0), 0U);
        EXPECT_EQ(sent(),
                  (std::vector<Bytes>{
                      frame(function.code, joined(kHandle, {4, 3, 2, 1, 1, 0, 0, 0})),
                      frame(function.code, joined(kNoHandle, {255, 255, 255, 255, 2, 0, 0, 0}))}));
    }
    expectLogged({});
}

TEST_F(ContextCredentials, NumbersThatFail) {
    for (const NumberFunction& function : kRemoveFunctions) {
        SCOPED_TRACE(function.name);
        EXPECT_EQ(function.call(nullptr, 1, 1), -3);
        expectLogged({failedCheck(kScopeCheck), returned(function.name, -3)});
        EXPECT_TRUE(sent().empty());
        EXPECT_EQ(failEachAllocation([&] { return function.call(context, 1, 1); }), 2U);
        EXPECT_EQ(logged().front(), failedCheck("inputBuffer"));
        log.clear();
        answers[function.code].status = -9;
        EXPECT_EQ(function.call(context, 1, 1), -9);
        expectLogged({failedWith9(), failedWith9(), returned(function.name, -9)});
        channel.structCalls.clear();
    }
}

TEST_F(ContextCredentials, ContainsAnswers) {
    const struct {
        Bytes reply;
        KSTStatus status;
    } kReplies[] = {
        {{0, 0, 0, 0}, -7}, {{1, 0, 0, 0}, 0}, {{0, 0, 0, 0x80}, 0}, {{0, 0, 1, 0}, 0},
        {{}, -7},           {{5}, 0},          {{0, 0, 0}, -7},
    };
    for (const NumberFunction& function : kContainsFunctions) {
        SCOPED_TRACE(function.name);
        for (const auto& reply : kReplies) {
            answers[function.code].reply = reply.reply;
            EXPECT_EQ(function.call(context, 0x01020304, 0x05060708), reply.status);
            const auto& call = channel.structCalls.front();
            EXPECT_EQ(call.offeredSize, 4U);
            EXPECT_TRUE(call.outputWasZero);
            EXPECT_EQ(sent(), std::vector<Bytes>{
                                  frame(function.code, joined(kHandle, {4, 3, 2, 1, 8, 7, 6, 5}))});
            expectLogged(reply.status == 0 ? Lines{} : Lines{returned(function.name, -7)});
        }
    }
}

TEST_F(ContextCredentials, ContainsThatFails) {
    for (const NumberFunction& function : kContainsFunctions) {
        SCOPED_TRACE(function.name);
        // Not even for the global scope.
        EXPECT_EQ(function.call(nullptr, 1, 2), -3);
        expectLogged({failedCheck("context"), returned(function.name, -3)});
        EXPECT_TRUE(sent().empty());
        answers[function.code].reply = {1, 0, 0, 0, 0};
        EXPECT_EQ(function.call(context, 1, 2), -5);
        expectLogged({failedCheck("replySize <= offeredSize"),
                      failedCheck("err == 0 ", "0xfffffffffffffffb"), returned(function.name, -5)});
        answers[function.code].reply = {1, 0, 0, 0};
        EXPECT_EQ(failEachAllocation([&] { return function.call(context, 1, 1); }), 2U);
        EXPECT_EQ(logged().front(), failedCheck("inputBuffer"));
        log.clear();
        answers[function.code].status = -9;
        EXPECT_EQ(function.call(context, 1, 1), -9);
        expectLogged({failedWith9(), failedWith9(), returned(function.name, -9)});
        channel.structCalls.clear();
    }
}

TEST_F(ContextCredentials, ShortNamesMeanTheContextAlone) {
    kst::gLogLevel = 30;
    answers[4].reply = {1, 0, 0, 0};
    EXPECT_EQ(KSTContextAddCredential(context, asCredential(passphrase)), 0);
    EXPECT_EQ(KSTContextRemoveCredentialsByType(context, 3), 0);
    EXPECT_EQ(KSTContextRemoveCredentialsByValue(context, asCredential(passphrase)), 0);
    EXPECT_EQ(KSTContextContainsCredentialType(context, 3), 0);
    kst::gLogLevel = 40;
    EXPECT_EQ(sent(), (std::vector<Bytes>{frame(5, credentialPayload(kHandle, passphrase, 1)),
                                          frame(9, joined(kHandle, {3, 0, 0, 0, 1, 0, 0, 0})),
                                          frame(6, credentialPayload(kHandle, passphrase, 1)),
                                          frame(4, joined(kHandle, {3, 0, 0, 0, 0, 0, 0, 0}))}));
    expectLogged({called("KSTContextAddCredential"), called("KSTContextAddCredentialWithScope"),
                  returned("KSTContextAddCredentialWithScope", 0),
                  called("KSTContextRemoveCredentialsByType"),
                  called("KSTContextRemoveCredentialsByTypeAndScope"),
                  returned("KSTContextRemoveCredentialsByTypeAndScope", 0),
                  called("KSTContextRemoveCredentialsByValue"),
                  called("KSTContextRemoveCredentialsByValueAndScope"),
                  returned("KSTContextRemoveCredentialsByValueAndScope", 0),
                  called("KSTContextContainsCredentialType"),
                  called("KSTContextContainsCredentialTypeEx"),
                  returned("KSTContextContainsCredentialTypeEx", 0)});
    EXPECT_EQ(KSTContextAddCredential(nullptr, asCredential(passphrase)), -3);
    EXPECT_EQ(KSTContextContainsCredentialType(nullptr, 1), -3);
}

TEST_F(ContextCredentials, AbsentService) {
    kst::installPlatform({log, registry, channel});
    registry.present = false;
    const Lines checks = {failedCheck("service"), failedCheck("err == 0 ", "0xfffffffffffffffb")};
    const ScriptedGate gate;
    for (const CredentialFunction& function : kCredentialFunctions) {
        EXPECT_EQ(function.call(context, asCredential(passphrase), 1), -5);
        expectLogged({checks[0], checks[1], returned(function.name, -5)});
    }
    const auto expectAbsent = [&](const NumberFunction& function) {
        EXPECT_EQ(function.call(context, 1, 1), -5);
        expectLogged({checks[0], checks[1], returned(function.name, -5)});
    };
    for (const NumberFunction& function : kRemoveFunctions) {
        expectAbsent(function);
    }
    for (const NumberFunction& function : kContainsFunctions) {
        expectAbsent(function);
    }
    EXPECT_TRUE(gate.asked.empty());
}

TEST_F(GlobalCredentials, SendThroughATemporaryContext) {
    EXPECT_EQ(KSTGlobalContextAddCredential(asCredential(passphrase)), 0);
    EXPECT_EQ(sent(), (std::vector<Bytes>{frame(1, {}),
                                          frame(5, credentialPayload(kOtherHandle, passphrase, 2)),
                                          frame(2, kOtherHandle)}));
    EXPECT_EQ(KSTGlobalContextRemoveCredentialsByType(3), 0);
    EXPECT_EQ(sent(), (std::vector<Bytes>{frame(1, {}),
                                          frame(9, joined(kOtherHandle, {3, 0, 0, 0, 2, 0, 0, 0})),
                                          frame(2, kOtherHandle)}));
    expectLogged({});
    created = 2;
}

TEST_F(GlobalCredentials, ContextGoesWhenTheCommandFails) {
    answers[5].status = -9;
    answers[9].status = -9;
    const std::int64_t before = gAllocatedBytes;
    EXPECT_EQ(KSTGlobalContextAddCredential(asCredential(passphrase)), -9);
    EXPECT_EQ(sent().back(), frame(2, kOtherHandle));
    expectLogged({failedWith9(), failedWith9(), returned("KSTContextAddCredentialWithScope", -9),
                  returned("KSTGlobalContextAddCredential", -9)});
    EXPECT_EQ(KSTGlobalContextRemoveCredentialsByType(1), -9);
    EXPECT_EQ(sent().back(), frame(2, kOtherHandle));
    EXPECT_EQ(gAllocatedBytes, before + 2);
    created = 2;
}

TEST_F(GlobalCredentials, ContextThatCannotBeDestroyedGoesAlone) {
    channel.scalars = {40};
    answers[2].status = -9;
    const std::int64_t before = gAllocatedBytes;
    EXPECT_EQ(KSTGlobalContextAddCredential(asCredential(passphrase)), 0);
    EXPECT_EQ(gAllocatedBytes, before + 1);
    EXPECT_EQ(sent().size(), 3U);
    expectLogged({failedWith9(), failedWith9(), returned("KSTContextDelete", -9)});
    created = 1;
}

TEST_F(GlobalCredentials, ContextThatCannotBeCreated) {
    channel.scalars = {40};
    EXPECT_EQ(KSTGlobalContextAddCredential(nullptr), -3);
    expectLogged({failedCheck("credential"), returned("KSTGlobalContextAddCredential", -3)});
    EXPECT_TRUE(sent().empty());
    answers[1].status = -9;
    EXPECT_EQ(KSTGlobalContextAddCredential(asCredential(passphrase)), -9);
    expectLogged({failedWith9(), failedWith9(), returned("KSTContextCreate", -9), failedWith9(),
                  returned("KSTGlobalContextAddCredential", -9)});
    EXPECT_EQ(KSTGlobalContextRemoveCredentialsByType(1), -9);
    EXPECT_EQ(sent(), (std::vector<Bytes>{frame(1, {}), frame(1, {})}));
}

TEST_F(GlobalCredentials, EveryAllocationFails) {
    channel.scalars = {40};
    std::size_t allocations = 0;
    for (bool isThrough = false; !isThrough; ++allocations) {
        const ScriptedGate gate(allocations);
        const std::int64_t before = gAllocatedBytes;
        channel.structCalls.clear();
        const KSTStatus status = KSTGlobalContextAddCredential(asCredential(passphrase));
        isThrough = gate.asked.size() <= allocations;
        // The last allocation is the deletion's, which changes nothing about the result.
        EXPECT_EQ(status, allocations < 4 ? -4 : 0);
        // Only a context that was there leaves its byte.
        EXPECT_EQ(gAllocatedBytes - before, allocations < 2 ? 0 : 1);
        created += allocations < 2 ? 0 : 1;
    }
    EXPECT_EQ(allocations, 6U);
}
