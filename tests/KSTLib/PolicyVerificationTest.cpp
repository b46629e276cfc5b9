#include "KSTLib/PolicyVerification.h"

#include "tests/KSTLib/ContextFixture.h"

#include <gtest/gtest.h>

#include <optional>

namespace {

using support::Bytes;
using support::Lines;
using support::ScriptedGate;

/// An unsatisfied answer with all-of two markers.
const Bytes kUnmet = {0, 0, 0, 0, 4, 0, 0, 0, 1, 0, 0, 0, 2, 0, 0, 0, 20, 0, 0,
                      0, 2, 0, 0, 0, 1, 0, 0, 0, 0, 0, 0, 0, 0, 0, 0, 0,  0, 0,
                      0, 0, 3, 0, 0, 0, 0, 0, 0, 0, 0, 0, 0, 0, 0, 0, 0,  0};
const Bytes kSatisfied = {1, 0, 0, 0};

/// Keeps what both kinds of block are called with.
class RecordingPolicyBlock {
  public:
    struct Call {
        KSTStatus status;
        bool satisfied;
        /// None when there was no requirement.
        std::optional<std::uint32_t> type;

        bool operator==(const Call& other) const {
            return status == other.status && satisfied == other.satisfied && type == other.type;
        }
    };

    void operator()(bool satisfied, const KSTRequirement* requirement) {
        (*this)(0, satisfied, requirement);
    }
    void operator()(KSTStatus status, bool satisfied, const KSTRequirement* requirement) {
        calls.push_back({status, satisfied,
                         requirement == nullptr ? std::nullopt : std::optional(requirement->type)});
    }

    std::vector<Call> calls;
};

using Call = RecordingPolicyBlock::Call;

class PolicyVerification : public support::ContextFixture {
  protected:
    void SetUp() override {
        ContextFixture::SetUp();
        answers[3].reply = kUnmet;
        answers[11].reply = kUnmet;
    }

    /// The payload of policy "p".
    static Bytes policyPayload(const Bytes& handle, std::uint8_t preflight, const Bytes& rest) {
        return joined(joined(handle, {'p', 0, preflight}), rest);
    }

    /// What the block of the last call was told; it must have been told once.
    Call told() {
        EXPECT_EQ(block.calls.size(), 1U);
        const Call call = block.calls.empty() ? Call{4711, false, {}} : block.calls.back();
        block.calls.clear();
        return call;
    }

    KSTStatus verifyEx(const char* policy, const KSTParameter* parameters = nullptr,
                       std::uint32_t count = 0) {
        KSTContextVerifyPolicyEx(context, policy, false, parameters, count, 7, block);
        const Call call = told();
        if (call.status != 0) {
            EXPECT_FALSE(call.satisfied);
            EXPECT_FALSE(call.type);
        }
        return call.status;
    }

    KSTStatus verifyAcl(const void* constraint, std::size_t length,
                        const KSTParameter* parameters = nullptr, std::uint32_t count = 0) {
        KSTContextVerifyAclConstraint(context, constraint, length, true, parameters, count, 7,
                                      block);
        return told().status;
    }

    RecordingPolicyBlock block;
};

constexpr Call kTold3{-3, false, {}};
const std::string kFailed3 = "0xfffffffffffffffd";
constexpr const char* kEx = "KSTContextVerifyPolicyEx";
constexpr const char* kAcl = "KSTContextVerifyAclConstraint";

} // namespace

TEST_F(PolicyVerification, PlainFrame) {
    EXPECT_EQ(KSTContextVerifyPolicy(context, "p", block), 0);
    EXPECT_EQ(told(), (Call{0, false, 4}));
    const auto& call = channel.structCalls.front();
    EXPECT_EQ(call.offeredSize, 4096U);
    EXPECT_TRUE(call.outputWasZero);
    EXPECT_EQ(sent(), std::vector<Bytes>{frame(3, policyPayload(kHandle, 0, Bytes(8)))});
    for (const bool preflight : {false, true}) {
        EXPECT_EQ(KSTContextVerifyPolicyWithPreflight(context, "p", preflight, block), 0);
        EXPECT_EQ(told(), (Call{0, false, 4}));
        EXPECT_EQ(sent(), std::vector<Bytes>{
                              frame(3, policyPayload(kHandle, preflight ? 1 : 0, Bytes(8)))});
    }
    expectLogged({});
}

TEST_F(PolicyVerification, FrameWithEverything) {
    const KSTParameter parameter{3, "x", 1};
    KSTContextVerifyPolicyEx(context, "p", true, &parameter, 1, 0x01020304, block);
    EXPECT_EQ(told(), (Call{0, false, 4}));
    EXPECT_EQ(
        sent(),
        std::vector<Bytes>{frame(
            3, policyPayload(kHandle, 1, {4, 3, 2, 1, 1, 0, 0, 0, 3, 0, 0, 0, 1, 0, 0, 0, 'x'}))});
    expectLogged({});
}

TEST_F(PolicyVerification, AclFrameHasWhatWasWritten) {
    const KSTParameter parameter{3, "x", 1};
    KSTContextVerifyAclConstraint(context, "acl", 3, true, &parameter, 1, 0x01020304, block);
    EXPECT_EQ(told(), (Call{0, false, 4}));
    const Bytes rest = {3, 0, 0, 0, 'a', 'c', 'l', 1, 4, 3, 2, 1,  1,
                        0, 0, 0, 3, 0,   0,   0,   1, 0, 0, 0, 'x'};
    EXPECT_EQ(channel.structCalls.front().offeredSize, 4096U);
    EXPECT_EQ(sent(), std::vector<Bytes>{frame(11, joined(kHandle, rest))});
    expectLogged({});
}

TEST_F(PolicyVerification, GlobalFrames) {
    KSTGlobalContextVerifyPolicy("p", true, nullptr, 0, block);
    EXPECT_EQ(told(), (Call{0, false, 4}));
    EXPECT_EQ(sent(), (std::vector<Bytes>{frame(1, {}),
                                          frame(3, policyPayload(kOtherHandle, 1,
                                                                 {255, 255, 255, 255, 0, 0, 0, 0})),
                                          frame(2, kOtherHandle)}));
    expectLogged({});
    gAllocatedBytes -= 1;
}

TEST_F(PolicyVerification, Answers) {
    const struct {
        Bytes reply;
        Call told;
    } kAnswers[] = {
        {kSatisfied, {0, true, {}}},
        {{0, 0, 0, 0x80}, {0, true, {}}},
        {kUnmet, {0, false, 4}},
        // Satisfied with a tree, and bytes behind it.
        {{1, 0, 0, 0, 2, 0, 0, 0, 0, 0, 0, 0, 0, 0, 0, 0, 0, 0, 0, 0, 9, 9}, {0, true, 2}},
    };
    for (const auto& answer : kAnswers) {
        answers[3].reply = answer.reply;
        answers[11].reply = answer.reply;
        EXPECT_EQ(KSTContextVerifyPolicy(context, "p", block), 0);
        EXPECT_EQ(told(), answer.told);
        KSTContextVerifyPolicyEx(context, "p", false, nullptr, 0, 0, block);
        EXPECT_EQ(told(), answer.told);
        KSTContextVerifyAclConstraint(context, "a", 1, false, nullptr, 0, 0, block);
        EXPECT_EQ(told(), answer.told);
    }
    expectLogged({});
}

TEST_F(PolicyVerification, AnswersThatCannotBeRead) {
    for (const Bytes& reply : {Bytes{}, Bytes(3, 1)}) {
        answers[3].reply = reply;
        EXPECT_EQ(KSTContextVerifyPolicy(context, "p", block), -5);
        expectLogged({failedCheck("reqBufferSize >= sizeof(uint32_t)"),
                      returned("KSTContextVerifyPolicy", -5)});
        EXPECT_EQ(verifyEx("p"), -5);
        expectLogged({failedCheck("reqBufferSize >= sizeof(uint32_t)"), returned(kEx, -5)});
    }
    for (const Bytes& reply : {Bytes(4), Bytes{1, 0, 0, 0, 9}}) {
        answers[3].reply = reply;
        answers[11].reply = reply;
        const Lines lines = {serializerCheck("size >= sizeof(KSTRequirement)"),
                             failedCheck("err == 0 ", kFailed3)};
        EXPECT_EQ(verifyEx("p"), -3);
        expectLogged({lines[0], lines[1], returned(kEx, -3)});
        EXPECT_EQ(verifyAcl("a", 1), -3);
        expectLogged({lines[0], lines[1], returned(kAcl, -3)});
    }
    answers[3].reply = Bytes(4097);
    EXPECT_EQ(verifyEx("p"), -5);
    expectLogged({failedCheck("replySize <= offeredSize"),
                  failedCheck("err == 0 ", "0xfffffffffffffffb"), returned(kEx, -5)});
}

TEST_F(PolicyVerification, EveryTruncationOfAnAnswer) {
    for (std::size_t length = 4; length < kUnmet.size(); ++length) {
        SCOPED_TRACE(length);
        answers[3].reply = Bytes(kUnmet.begin(), kUnmet.begin() + static_cast<long>(length));
        const std::int64_t before = gAllocatedBytes;
        EXPECT_EQ(verifyEx("p"), -3);
        EXPECT_EQ(gAllocatedBytes, before);
    }
}

TEST_F(PolicyVerification, PlainArguments) {
    const auto expectRefused = [this](KSTStatus status, const char* check) {
        EXPECT_EQ(status, -3);
        expectLogged({failedCheck(check), returned("KSTContextVerifyPolicy", -3)});
    };
    expectRefused(KSTContextVerifyPolicy(nullptr, nullptr, nullptr), "context");
    expectRefused(KSTContextVerifyPolicy(context, nullptr, nullptr), "policyId");
    expectRefused(KSTContextVerifyPolicy(context, "p", nullptr), "processRequirement");
    EXPECT_EQ(KSTContextVerifyPolicyWithPreflight(nullptr, "p", true, block), -3);
    EXPECT_TRUE(block.calls.empty());
    EXPECT_TRUE(sent().empty());
}

TEST_F(PolicyVerification, BlockLearnsOfBadArguments) {
    KSTContextVerifyPolicyEx(nullptr, nullptr, false, nullptr, 0, 0, block);
    EXPECT_EQ(told(), kTold3);
    expectLogged({failedCheck("context"), returned(kEx, -3)});
    KSTContextVerifyPolicyEx(context, nullptr, false, nullptr, 0, 0, block);
    EXPECT_EQ(told(), kTold3);
    expectLogged({failedCheck("policyId"), returned(kEx, -3)});
    KSTContextVerifyPolicyEx(context, "p", false, nullptr, 0, 0, nullptr);
    expectLogged({failedCheck("processRequirement"), returned(kEx, -3)});
    KSTContextVerifyAclConstraint(nullptr, nullptr, 0, false, nullptr, 0, 0, block);
    EXPECT_EQ(told(), kTold3);
    expectLogged({failedCheck("context"), returned(kAcl, -3)});
    for (const auto& [constraint, length] :
         {std::pair<const char*, std::size_t>{nullptr, 1}, {"a", 0}}) {
        EXPECT_EQ(verifyAcl(constraint, length), -3);
        expectLogged({failedCheck("aclConstraint && aclConstraintLength"), returned(kAcl, -3)});
    }
    for (const std::size_t length : {std::size_t{1}, std::size_t{1} << 32U}) {
        KSTContextVerifyAclConstraint(context, "a", length, false, nullptr, 0, 0, nullptr);
        expectLogged({failedCheck("processRequirement"), returned(kAcl, -3)});
    }
    EXPECT_EQ(verifyAcl("a", std::size_t{1} << 32U), -3);
    expectLogged({failedCheck("aclConstraintLength <= UINT32_MAX"), returned(kAcl, -3)});
    EXPECT_TRUE(sent().empty());
}

TEST_F(PolicyVerification, WhatAPayloadCannotCarry) {
    const Lines tail = {failedCheck("err == 0 ", kFailed3), returned(kEx, -3)};
    EXPECT_EQ(verifyEx(std::string(129, 'p').c_str()), -3);
    expectLogged({serializerCheck("policyLength <= 128"), tail[0], tail[1]});
    const std::vector<KSTParameter> eleven(11, {3, "x", 1});
    EXPECT_EQ(verifyEx("p", eleven.data(), 11), -3);
    expectLogged({failedCheck("parametersCount <= 10"), tail[1]});
    EXPECT_EQ(verifyEx("p", eleven.data(), 0), -3);
    EXPECT_EQ(logged().size(), 3U);
    log.clear();
    EXPECT_EQ(verifyAcl("a", 1, eleven.data(), 11), -3);
    expectLogged({serializerCheck("parametersCount <= 10"), tail[0], returned(kAcl, -3)});
    EXPECT_TRUE(sent().empty());
    EXPECT_EQ(verifyEx(std::string(128, 'p').c_str(), eleven.data(), 10), 0);
    EXPECT_EQ(verifyAcl("a", 1, eleven.data(), 10), 0);
}

TEST_F(PolicyVerification, ConstraintWhoseSizeWraps) {
    // The announced size is 33 more without its 33rd bit; the constraint is never read.
    for (const std::size_t length : {0xfffffffeU, 0xffffffffU}) {
        EXPECT_EQ(verifyAcl("a", length), -3);
        expectLogged({serializerCheck("*outSize >= requiredSize"),
                      failedCheck("err == 0 ", kFailed3), returned(kAcl, -3)});
    }
    EXPECT_TRUE(sent().empty());
}

TEST_F(PolicyVerification, CommandsThatFail) {
    answers[3].status = -9;
    answers[11].status = -9;
    EXPECT_EQ(KSTContextVerifyPolicy(context, "p", block), -9);
    EXPECT_TRUE(block.calls.empty());
    expectLogged({failedWith9(), failedWith9(), returned("KSTContextVerifyPolicy", -9)});
    EXPECT_EQ(verifyEx("p"), -9);
    expectLogged({failedWith9(), failedWith9(), returned(kEx, -9)});
    EXPECT_EQ(verifyAcl("a", 1), -9);
    expectLogged({failedWith9(), failedWith9(), returned(kAcl, -9)});
    EXPECT_TRUE(channel.scalarCalls.empty());
}

TEST_F(PolicyVerification, AbsentService) {
    kst::installPlatform({log, registry, channel});
    registry.present = false;
    const Lines checks = {failedCheck("service"), failedCheck("err == 0 ", "0xfffffffffffffffb")};
    EXPECT_EQ(verifyEx("p"), -5);
    expectLogged({checks[0], checks[1], returned(kEx, -5)});
    EXPECT_EQ(verifyAcl("a", 1), -5);
    expectLogged({checks[0], checks[1], returned(kAcl, -5)});
}

TEST_F(PolicyVerification, GlobalThatFails) {
    channel.scalars = {40};
    KSTGlobalContextVerifyPolicy(nullptr, false, nullptr, 0, block);
    EXPECT_EQ(told(), kTold3);
    EXPECT_EQ(sent().back(), frame(2, kOtherHandle));
    expectLogged(
        {failedCheck("policyId"), returned(kEx, -3), returned("KSTGlobalContextVerifyPolicy", -3)});
    KSTGlobalContextVerifyPolicy("p", false, nullptr, 0, nullptr);
    expectLogged({failedCheck("processRequirement"), returned(kEx, -3),
                  returned("KSTGlobalContextVerifyPolicy", -3)});
    answers[1].status = -9;
    KSTGlobalContextVerifyPolicy("p", false, nullptr, 0, block);
    EXPECT_EQ(told(), (Call{-9, false, {}}));
    expectLogged({failedWith9(), failedWith9(), returned("KSTContextCreate", -9), failedWith9(),
                  returned("KSTGlobalContextVerifyPolicy", -9)});
    KSTGlobalContextVerifyPolicy("p", false, nullptr, 0, nullptr);
    gAllocatedBytes -= 2;
}

TEST_F(PolicyVerification, EveryAllocationFails) {
    // Payload, reply, frame, and the three nodes of the requirement with what reading them takes.
    EXPECT_GE(failEachAllocation([this] { return verifyEx("p"); }), 6U);
    EXPECT_GE(failEachAllocation([this] { return verifyAcl("a", 1); }), 6U);
    const char* const kChecks[] = {"inputBuffer", "reqBuffer", "cmd"};
    log.clear();
    for (std::size_t i = 0; i < 3; ++i) {
        const ScriptedGate gate(i);
        EXPECT_EQ(verifyEx("p"), -4);
        EXPECT_EQ(logged().front(), failedCheck(kChecks[i]));
        log.clear();
    }
}

TEST_F(PolicyVerification, GlobalWithEveryAllocationFailing) {
    channel.scalars = {40};
    std::size_t refused = 0;
    int created = 0;
    for (bool isThrough = false; !isThrough; ++refused) {
        const ScriptedGate gate(refused);
        const std::int64_t before = gAllocatedBytes;
        KSTGlobalContextVerifyPolicy("p", false, nullptr, 0, block);
        isThrough = gate.asked.size() <= refused;
        // Context, frame, payload, reply, frame and three nodes; then the deletion's frame, which
        // changes nothing about the answer.
        EXPECT_EQ(told(), refused < 8 ? (Call{-4, false, {}}) : (Call{0, false, 4})) << refused;
        // Only a context that was there leaves its byte.
        EXPECT_EQ(gAllocatedBytes - before, refused < 2 ? 0 : 1);
        created += refused < 2 ? 0 : 1;
        EXPECT_TRUE(gate.everyFreeWasWiped);
    }
    EXPECT_EQ(refused, 10U);
    gAllocatedBytes -= created;
}

TEST_F(PolicyVerification, EntriesAndExitsAtLowLevel) {
    kst::gLogLevel = 30;
    EXPECT_EQ(KSTContextVerifyPolicy(context, "p", block), 0);
    EXPECT_EQ(KSTContextVerifyPolicyWithPreflight(context, "p", true, block), 0);
    KSTContextVerifyPolicyEx(context, "p", false, nullptr, 0, 0, block);
    KSTContextVerifyAclConstraint(context, "a", 1, false, nullptr, 0, 0, block);
    kst::gLogLevel = 40;
    Lines lines;
    for (const char* function :
         {"KSTContextVerifyPolicy", "KSTContextVerifyPolicyWithPreflight", kEx, kAcl}) {
        lines.push_back(called(function));
        lines.push_back(returned(function, 0));
    }
    expectLogged(lines);
}
