#include "KSTLib/PolicyVerification.h"
#include "tests/KSTLib/ContextFixture.h"

#include <gtest/gtest.h>

namespace {

using support::Bytes;
using support::Lines;
using support::ScriptedGate;

class AclParsing : public support::ContextFixture {
  protected:
    struct Call {
        KSTStatus status;
        bool wasNull;
        std::size_t length;
        Bytes bytes;
    };

    KSTStatus parse(const void* acl, std::size_t length) {
        calls.clear();
        return KSTParseAclAndCopyConstraintCharacteristics(
            acl, length, [this](KSTStatus status, const void* data, std::size_t size) {
                const auto* bytes = static_cast<const std::uint8_t*>(data);
                calls.push_back({status, data == nullptr, size,
                                 data == nullptr ? Bytes() : Bytes(bytes, bytes + size)});
            });
    }

    /// The block has learned of a failure.
    void expectTold(KSTStatus status, std::size_t length) {
        ASSERT_EQ(calls.size(), 1U);
        EXPECT_EQ(calls.front().status, status);
        EXPECT_TRUE(calls.front().wasNull);
        EXPECT_EQ(calls.front().length, length);
    }

    std::vector<Call> calls;
};

constexpr const char* kFunction = "KSTParseAclAndCopyConstraintCharacteristics";

} // namespace

TEST_F(AclParsing, FrameHasWhatWasWritten) {
    answers[20].reply = {7, 8, 9};
    EXPECT_EQ(parse("acl", 3), 0);
    const auto& call = channel.structCalls.front();
    EXPECT_EQ(call.offeredSize, 4096U);
    EXPECT_TRUE(call.outputWasZero);
    EXPECT_EQ(sent(),
              std::vector<Bytes>{frame(20, joined(Bytes(16), {3, 0, 0, 0, 'a', 'c', 'l', 0, 0, 0, 0,
                                                              0, 0, 0, 0, 0, 0, 0, 0}))});
    ASSERT_EQ(calls.size(), 1U);
    EXPECT_EQ(calls.front().status, 0);
    EXPECT_EQ(calls.front().bytes, (Bytes{7, 8, 9}));
    expectLogged({});
}

TEST_F(AclParsing, ReplySizes) {
    for (const std::size_t size : {0U, 1U, 4095U, 4096U}) {
        answers[20].reply = Bytes(size, 0x66);
        const ScriptedGate gate;
        EXPECT_EQ(parse("a", 1), 0);
        ASSERT_EQ(calls.size(), 1U);
        EXPECT_EQ(calls.front().bytes, answers[20].reply);
        EXPECT_EQ(calls.front().wasNull, size == 0);
        EXPECT_EQ(calls.front().length, size);
        // The payload has room for four bytes more than are written.
        EXPECT_EQ(gate.asked, (std::vector<std::size_t>{37, 4096, 8 + 33, size}));
        EXPECT_TRUE(gate.everyFreeWasWiped);
        EXPECT_EQ(gate.freed.size(), 4U);
    }
    answers[20].reply = Bytes(4097);
    EXPECT_EQ(parse("a", 1), -5);
    expectTold(-5, 4096);
    expectLogged({failedCheck("replySize <= offeredSize"),
                  failedCheck("err == 0 ", "0xfffffffffffffffb"), returned(kFunction, -5)});
}

TEST_F(AclParsing, SizeOfTheReplyStaysOnEarlyFailures) {
    EXPECT_EQ(parse(nullptr, 1), -3);
    expectTold(-3, 4096);
    EXPECT_EQ(parse("a", 0), -3);
    expectTold(-3, 4096);
    expectLogged({failedCheck("acl && aclLength"), returned(kFunction, -3),
                  failedCheck("acl && aclLength"), returned(kFunction, -3)});
    EXPECT_EQ(parse("a", std::size_t{1} << 32U), -3);
    expectTold(-3, 4096);
    expectLogged({failedCheck("aclLength <= UINT32_MAX"), returned(kFunction, -3)});
    EXPECT_EQ(KSTParseAclAndCopyConstraintCharacteristics(nullptr, 0, nullptr), -3);
    expectLogged({failedCheck("acl && aclLength"), returned(kFunction, -3)});
    for (const std::size_t length : {std::size_t{1}, std::size_t{1} << 32U}) {
        EXPECT_EQ(KSTParseAclAndCopyConstraintCharacteristics("a", length, nullptr), -3);
        expectLogged({failedCheck("processConstraintCharacteristics"), returned(kFunction, -3)});
    }
    EXPECT_TRUE(sent().empty());
}

TEST_F(AclParsing, ListWhoseSizeWraps) {
    EXPECT_EQ(parse("a", 0xffffffff), -3);
    expectTold(-3, 4096);
    expectLogged({serializerCheck("*outSize >= requiredSize"),
                  failedCheck("err == 0 ", "0xfffffffffffffffd"), returned(kFunction, -3)});
    EXPECT_TRUE(sent().empty());
}

TEST_F(AclParsing, CommandThatFails) {
    answers[20].status = -9;
    EXPECT_EQ(parse("a", 1), -9);
    expectTold(-9, 4096);
    expectLogged({failedWith9(), failedWith9(), returned(kFunction, -9)});
}

TEST_F(AclParsing, AbsentService) {
    kst::installPlatform({log, registry, channel});
    registry.present = false;
    EXPECT_EQ(parse("a", 1), -5);
    expectTold(-5, 4096);
    expectLogged({failedCheck("service"), failedCheck("err == 0 ", "0xfffffffffffffffb"),
                  returned(kFunction, -5)});
}

TEST_F(AclParsing, EveryAllocationFails) {
    answers[20].reply = {7, 8, 9};
    const char* const kChecks[] = {"inputBuffer", "outputBuffer", "cmd", "output"};
    std::size_t refused = 0;
    EXPECT_EQ(failEachAllocation([&] {
                  log.clear();
                  const KSTStatus status = parse("a", 1);
                  if (status != 0) {
                      expectTold(-4, refused == 3 ? 3 : 4096);
                      EXPECT_EQ(logged().front(), failedCheck(kChecks[refused++]));
                  }
                  return status;
              }),
              4U);
}
