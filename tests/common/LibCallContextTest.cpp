#include "KSTLib/LibCall.h"
#include "KSTLib/RequirementSerialization.h"
#include "tests/common/CredentialSamples.h"
#include "tests/support/ContextlessTransport.h"
#include "tests/support/ScriptedGate.h"

#include <gtest/gtest.h>

namespace {

using support::asCredential;
using support::Bytes;
using support::ContextlessTransport;
using support::credentialBytes;
using support::Lines;
using support::ScriptedGate;

const Bytes kHandle = {1, 2, 3, 4, 5, 6, 7, 8, 9, 10, 11, 12, 13, 14, 15, 16};
/// A leaf of type 2 with four bytes of data.
const Bytes kLeaf = {2, 0, 0, 0, 1, 0, 0, 0, 2, 0, 0, 0, 4, 0, 0, 0, 0xaa, 0xbb, 0xcc, 0xdd};
constexpr const char* kPairCheck = "( (parametersCount > 0 && parameters != ((void*)0)) || "
                                   "((parametersCount == 0) && parameters == ((void*)0)) )";

/// Holds one context, whose handle is 1 to 16.
class LibCallContext : public support::LibraryFixture {
  protected:
    void SetUp() override {
        LibraryFixture::SetUp();
        transport.replyWith(createReply());
        ASSERT_EQ(LibCall_KSTContextCreate(ContextlessTransport::answer, &context, nullptr), 0);
        transport.calls.clear();
        transport.replyWith({});
    }

    void TearDown() override {
        EXPECT_TRUE(transport.contextWasNull);
        if (context != nullptr) {
            EXPECT_EQ(LibCall_KSTContextDelete(ContextlessTransport::answer, context, false), 0);
        }
        LibraryFixture::TearDown();
    }

    static Bytes createReply() {
        Bytes reply = kHandle;
        reply.push_back(33);
        return reply;
    }

    static std::string failedCheck(const std::string& condition, const std::string& value = "0x0") {
        std::string line = "KST: AssertMacros: ";
        line += condition;
        line += " (value: " + value + "),  file: common/LibCall:<n>\n";
        return line;
    }

    /// The log and standard output of one call of `function` that failed; both are emptied.
    void expectFailure(const char* function, KSTStatus status, const Lines& lines) {
        EXPECT_EQ(logged(), lines);
        log.clear();
        std::string line = "KST: LibCall_";
        line += function;
        line += ": returning, err = " + std::to_string(status) + ".\n";
        printedBefore += line;
        EXPECT_EQ(printed(), printedBefore);
    }

    /// The only call so far: code and payload, nothing offered.
    void expectSent(std::uint32_t code, const Bytes& payload) {
        ASSERT_EQ(transport.calls.size(), 1U);
        const auto& call = transport.calls.front();
        EXPECT_EQ(call.code, code);
        EXPECT_EQ(call.thirdByte, 0U);
        EXPECT_EQ(call.input, payload);
        EXPECT_EQ(call.output, nullptr);
        EXPECT_FALSE(call.offeredSize);
        transport.calls.clear();
    }

    KSTStatus add(KSTContextRef to, const KSTCredential* credential, KSTScope scope) {
        return LibCall_KSTContexAddCredentialWithScope(ContextlessTransport::answer, to, credential,
                                                       scope);
    }

    KSTStatus removeType(KSTContextRef from, std::uint32_t type, KSTScope scope) {
        return LibCall_KSTContexRemoveCredentialsByTypeAndScope(ContextlessTransport::answer, from,
                                                                type, scope);
    }

    KSTStatus verify(const char* policy, const KSTParameter* parameters = nullptr,
                     std::uint32_t count = 0) {
        return LibCall_KSTContextVerifyPolicyAndCopyRequirementEx(
            ContextlessTransport::answer, context, policy, true, parameters, count, 0x01020304,
            &satisfied, &requirement);
    }

    void expectNoAnswer() const {
        EXPECT_TRUE(satisfied);
        EXPECT_EQ(requirement, reinterpret_cast<KSTRequirement*>(0x10));
    }

    ContextlessTransport transport;
    KSTContextRef context = nullptr;
    bool satisfied = true;
    KSTRequirement* requirement = reinterpret_cast<KSTRequirement*>(0x10);
    std::string printedBefore;
};

} // namespace

TEST_F(LibCallContext, Create) {
    transport.replyWith(createReply());
    const std::int64_t before = gAllocatedBytes;
    KSTContextRef created = nullptr;
    std::uint8_t level = 0;
    ASSERT_EQ(LibCall_KSTContextCreate(ContextlessTransport::answer, &created, &level), 0);
    EXPECT_EQ(gAllocatedBytes, before + 16);
    EXPECT_EQ(level, 33);
    const auto& call = transport.calls.front();
    EXPECT_EQ(call.code, 1U);
    EXPECT_EQ(call.thirdByte, 0U);
    EXPECT_TRUE(call.input.empty());
    EXPECT_EQ(call.offeredSize, 17U);
    EXPECT_TRUE(call.outputWasZero);
    transport.calls.clear();
    EXPECT_EQ(LibCall_KSTContextDelete(ContextlessTransport::answer, created, true), 0);
    expectSent(2, kHandle);
    EXPECT_EQ(gAllocatedBytes, before);
    EXPECT_TRUE(logged().empty());
    EXPECT_EQ(printed(), "");
}

TEST_F(LibCallContext, CreateThatFails) {
    KSTContextRef created = context;
    std::uint8_t level = 99;
    EXPECT_EQ(LibCall_KSTContextCreate(nullptr, &created, &level), -3);
    expectFailure("KSTContextCreate", -3, {failedCheck("transport")});
    EXPECT_EQ(LibCall_KSTContextCreate(ContextlessTransport::answer, nullptr, &level), -3);
    expectFailure("KSTContextCreate", -3, {failedCheck("context")});
    EXPECT_TRUE(transport.calls.empty());
    for (const std::size_t size : {std::size_t{0}, std::size_t{16}, std::size_t{18}, SIZE_MAX}) {
        transport.reportedSize = size;
        EXPECT_EQ(LibCall_KSTContextCreate(ContextlessTransport::answer, &created, &level), -5);
        expectFailure("KSTContextCreate", -5,
                      {failedCheck("outputBufferSize == sizeof(outputBuffer)")});
    }
    transport.status = -9;
    EXPECT_EQ(LibCall_KSTContextCreate(ContextlessTransport::answer, &created, &level), -9);
    expectFailure("KSTContextCreate", -9, {failedCheck("err == 0 ", "0xfffffffffffffff7")});
    EXPECT_EQ(created, context);
    EXPECT_EQ(level, 99);
}

TEST_F(LibCallContext, CreateWithoutMemory) {
    transport.replyWith(createReply());
    const ScriptedGate gate(0);
    KSTContextRef created = context;
    std::uint8_t level = 99;
    EXPECT_EQ(LibCall_KSTContextCreate(ContextlessTransport::answer, &created, &level), -4);
    EXPECT_EQ(created, nullptr);
    EXPECT_EQ(level, 99);
    EXPECT_EQ(gate.asked, std::vector<std::size_t>{16});
    expectFailure("KSTContextCreate", -4, {failedCheck("*context")});
}

TEST_F(LibCallContext, DeleteWithoutDestroyingSendsNothing) {
    const ScriptedGate gate;
    EXPECT_EQ(LibCall_KSTContextDelete(ContextlessTransport::answer, context, false), 0);
    context = nullptr;
    EXPECT_TRUE(transport.calls.empty());
    EXPECT_EQ(gate.freed, std::vector<std::size_t>{16});
    EXPECT_TRUE(gate.everyFreeWasWiped);
}

TEST_F(LibCallContext, DeleteThatFailsKeepsTheContext) {
    EXPECT_EQ(LibCall_KSTContextDelete(nullptr, context, false), -3);
    expectFailure("KSTContextDelete", -3, {failedCheck("transport")});
    for (const bool destroy : {false, true}) {
        EXPECT_EQ(LibCall_KSTContextDelete(ContextlessTransport::answer, nullptr, destroy), -3);
        expectFailure("KSTContextDelete", -3, {failedCheck("context")});
    }
    EXPECT_TRUE(transport.calls.empty());
    transport.status = 12;
    EXPECT_EQ(LibCall_KSTContextDelete(ContextlessTransport::answer, context, true), 12);
    expectFailure("KSTContextDelete", 12, {failedCheck("err == 0 ", "0xc")});
    transport.status = 0;
    transport.calls.clear();
    EXPECT_EQ(LibCall_KSTContextDelete(ContextlessTransport::answer, context, true), 0);
    context = nullptr;
    expectSent(2, kHandle);
}

TEST_F(LibCallContext, AddCredential) {
    Bytes record = credentialBytes(12);
    Bytes payload = kHandle;
    support::append(payload, record);
    support::append(payload, {1, 0, 0, 0});
    EXPECT_EQ(add(context, asCredential(record), 1), 0);
    expectSent(5, payload);
    std::fill_n(payload.begin(), 16, std::uint8_t{0});
    payload[56] = 2;
    EXPECT_EQ(add(nullptr, asCredential(record), 2), 0);
    expectSent(5, payload);
    EXPECT_TRUE(logged().empty());
}

TEST_F(LibCallContext, AddCredentialThatFails) {
    constexpr const char* kFunction = "KSTContexAddCredentialWithScope";
    Bytes record = credentialBytes(12);
    EXPECT_EQ(LibCall_KSTContexAddCredentialWithScope(nullptr, context, asCredential(record), 1),
              -3);
    expectFailure(kFunction, -3, {failedCheck("transport")});
    EXPECT_EQ(add(nullptr, nullptr, 1), -3);
    expectFailure(kFunction, -3, {failedCheck("context || scope == kKSTScopeGlobal")});
    EXPECT_EQ(add(context, nullptr, 1), -3);
    expectFailure(kFunction, -3, {failedCheck("credential")});
    support::putU32(record, 0, 13);
    EXPECT_EQ(add(context, asCredential(record), 1), -3);
    EXPECT_EQ(logged().back(), failedCheck("err == 0 ", "0xfffffffffffffffd"));
    EXPECT_EQ(logged().size(), 3U);
    log.clear();
    EXPECT_TRUE(transport.calls.empty());
    support::putU32(record, 0, 12);
    const ScriptedGate gate(0);
    EXPECT_EQ(add(context, asCredential(record), 1), -4);
    EXPECT_EQ(logged(), Lines{failedCheck("inputBuffer")});
    log.clear();
    transport.status = -9;
    EXPECT_EQ(add(context, asCredential(record), 1), -9);
    EXPECT_EQ(logged(), Lines{failedCheck("err == 0 ", "0xfffffffffffffff7")});
    EXPECT_EQ(gate.freed, std::vector<std::size_t>{60});
    EXPECT_TRUE(gate.everyFreeWasWiped);
}

TEST_F(LibCallContext, RemoveCredentialsByType) {
    Bytes payload = kHandle;
    support::append(payload, {4, 3, 2, 1, 1, 0, 0, 0});
    EXPECT_EQ(removeType(context, 0x01020304, 1), 0);
    expectSent(9, payload);
    std::fill_n(payload.begin(), 16, std::uint8_t{0});
    payload[20] = 2;
    EXPECT_EQ(removeType(nullptr, 0x01020304, 2), 0);
    expectSent(9, payload);
}

TEST_F(LibCallContext, RemoveCredentialsByTypeThatFails) {
    constexpr const char* kFunction = "KSTContexRemoveCredentialsByTypeAndScope";
    EXPECT_EQ(LibCall_KSTContexRemoveCredentialsByTypeAndScope(nullptr, nullptr, 1, 1), -3);
    expectFailure(kFunction, -3, {failedCheck("transport")});
    EXPECT_EQ(removeType(nullptr, 1, 3), -3);
    expectFailure(kFunction, -3, {failedCheck("context || scope == kKSTScopeGlobal")});
    EXPECT_TRUE(transport.calls.empty());
    transport.status = -9;
    EXPECT_EQ(removeType(context, 1, 1), -9);
    expectFailure(kFunction, -9, {failedCheck("err == 0 ", "0xfffffffffffffff7")});
    const ScriptedGate gate(0);
    EXPECT_EQ(removeType(context, 1, 1), -4);
    expectFailure(kFunction, -4, {failedCheck("inputBuffer")});
}

TEST_F(LibCallContext, VerifyPolicyReturnsTheRequirement) {
    Bytes reply(4);
    support::append(reply, kLeaf);
    transport.replyWith(reply);
    const KSTParameter parameter{3, "x", 1};
    ASSERT_EQ(verify("p", &parameter, 1), 0);
    EXPECT_FALSE(satisfied);
    ASSERT_NE(requirement, nullptr);
    EXPECT_EQ(requirement->type, 2U);
    DeallocRequirement(requirement);
    ASSERT_EQ(transport.calls.size(), 1U);
    const auto& call = transport.calls.front();
    EXPECT_EQ(call.code, 3U);
    Bytes payload = kHandle;
    support::append(payload, {'p', 0, 1, 4, 3, 2, 1, 1, 0, 0, 0, 3, 0, 0, 0, 1, 0, 0, 0, 'x'});
    EXPECT_EQ(call.input, payload);
    EXPECT_EQ(call.offeredSize, 4096U);
    EXPECT_TRUE(call.outputWasZero);
    EXPECT_TRUE(logged().empty());
    EXPECT_EQ(printed(), "");
}

TEST_F(LibCallContext, VerifyPolicyWithoutRequirement) {
    transport.replyWith({0, 0, 0, 0x80});
    ASSERT_EQ(verify("p"), 0);
    EXPECT_TRUE(satisfied);
    EXPECT_EQ(requirement, nullptr);
    // Nobody wants it, so nobody reads it.
    for (const std::size_t size : {7U, 4096U}) {
        satisfied = true;
        transport.replyWith(Bytes(size));
        ASSERT_EQ(LibCall_KSTContextVerifyPolicyAndCopyRequirementEx(ContextlessTransport::answer,
                                                                     context, "p", false, nullptr,
                                                                     0, 0, &satisfied, nullptr),
                  0);
        EXPECT_FALSE(satisfied);
    }
}

TEST_F(LibCallContext, VerifyPolicyWithBadArguments) {
    constexpr const char* kFunction = "KSTContextVerifyPolicyAndCopyRequirementEx";
    const auto call = [&](KSTTransport over, KSTContextRef with, const char* policy,
                          const KSTParameter* parameters, std::uint32_t count, bool* out) {
        return LibCall_KSTContextVerifyPolicyAndCopyRequirementEx(
            over, with, policy, false, parameters, count, 0, out, &requirement);
    };
    const KSTParameter parameter{};
    EXPECT_EQ(call(nullptr, nullptr, nullptr, nullptr, 1, nullptr), -3);
    expectFailure(kFunction, -3, {failedCheck("transport")});
    EXPECT_EQ(call(ContextlessTransport::answer, nullptr, nullptr, nullptr, 1, nullptr), -3);
    expectFailure(kFunction, -3, {failedCheck("context")});
    EXPECT_EQ(call(ContextlessTransport::answer, context, nullptr, nullptr, 1, nullptr), -3);
    expectFailure(kFunction, -3, {failedCheck(kPairCheck)});
    EXPECT_EQ(call(ContextlessTransport::answer, context, nullptr, &parameter, 0, nullptr), -3);
    expectFailure(kFunction, -3, {failedCheck(kPairCheck)});
    EXPECT_EQ(call(ContextlessTransport::answer, context, nullptr, nullptr, 0, nullptr), -3);
    expectFailure(kFunction, -3, {failedCheck("policyId")});
    EXPECT_EQ(call(ContextlessTransport::answer, context, "p", nullptr, 0, nullptr), -3);
    expectFailure(kFunction, -3, {failedCheck("policySatisfied")});
    // One parameter stands for eleven: they are counted before they are looked at.
    EXPECT_EQ(verify("p", &parameter, 11), -3);
    expectFailure(kFunction, -3, {failedCheck("parametersCount <= 10")});
    EXPECT_EQ(verify(std::string(129, 'p').c_str()), -3);
    expectFailure(kFunction, -3,
                  {"KST: AssertMacros: policyLength <= 128 (value: 0x0),  file: "
                   "common/LibSerialization:<n>\n",
                   failedCheck("err == 0 ", "0xfffffffffffffffd")});
    EXPECT_TRUE(transport.calls.empty());
    expectNoAnswer();
}

TEST_F(LibCallContext, VerifyPolicyReplies) {
    constexpr const char* kFunction = "KSTContextVerifyPolicyAndCopyRequirementEx";
    for (const std::size_t size : {0U, 3U}) {
        transport.replyWith(Bytes(size, 1));
        EXPECT_EQ(verify("p"), -5);
        expectFailure(kFunction, -5, {failedCheck("reqBufferSize >= sizeof(uint32_t)")});
    }
    transport.reply = Bytes(4096, 1);
    for (const std::size_t size : {std::size_t{4097}, SIZE_MAX}) {
        transport.reportedSize = size;
        EXPECT_EQ(verify("p"), -5);
        expectFailure(kFunction, -5, {failedCheck("reqBufferSize <= 4096")});
    }
    transport.replyWith({0, 0, 0, 0});
    EXPECT_EQ(verify("p"), -3);
    expectFailure(kFunction, -3,
                  {"KST: AssertMacros: size >= sizeof(KSTRequirement) (value: 0x0),  file: "
                   "common/LibSerialization:<n>\n",
                   failedCheck("err == 0 ", "0xfffffffffffffffd")});
    transport.status = -9;
    EXPECT_EQ(verify("p"), -9);
    expectFailure(kFunction, -9, {failedCheck("err == 0 ", "0xfffffffffffffff7")});
    expectNoAnswer();
}

TEST_F(LibCallContext, VerifyPolicyWithEveryAllocationFailing) {
    Bytes reply(4);
    support::append(reply, kLeaf);
    transport.replyWith(reply);
    const std::int64_t before = gAllocatedBytes;
    std::size_t refused = 0;
    for (KSTStatus status = -4; status != 0; ++refused) {
        const ScriptedGate gate(refused);
        status = verify("p");
        EXPECT_TRUE(status == 0 || status == -4) << status;
        if (status != 0) {
            EXPECT_EQ(gAllocatedBytes, before);
            EXPECT_TRUE(gate.everyFreeWasWiped);
            expectNoAnswer();
        }
    }
    EXPECT_GE(refused, 4U);
    DeallocRequirement(requirement);
}
