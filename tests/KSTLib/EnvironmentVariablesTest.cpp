#include "KSTLib/KSTLib.h"
#include "tests/KSTLib/ChannelFixture.h"
#include "tests/support/RecordingBlock.h"
#include "tests/support/ScriptedGate.h"

#include <gtest/gtest.h>

#include <limits>

namespace {

using support::Bytes;
using support::Lines;

constexpr char kSetDataCheck[] =
    "KST: AssertMacros: (data && dataLength && dataLength <= 64) || (!data && !dataLength) "
    "(value: 0x0),  file: common/LibCall:<n>\n";

class EnvironmentVariables : public support::ChannelFixture {
  protected:
    void expectSetRefused(const void* data, std::size_t length) {
        log.clear();
        EXPECT_EQ(KSTSetEnvironmentVariable(1, data, length), kKSTErrorBadParameter);
        EXPECT_TRUE(channel.structCalls.empty());
        EXPECT_EQ(logged(), (Lines{kSetDataCheck,
                                   "KSTLib: KSTSetEnvironmentVariable: returning, err = -3.\n"}));
    }

    support::RecordingBlock block;
};

} // namespace

TEST_F(EnvironmentVariables, SetSendsThisFrame) {
    EXPECT_EQ(KSTSetEnvironmentVariable(0x01020304, "val", 3), 0);
    ASSERT_EQ(channel.structCalls.size(), 1U);
    const auto& call = channel.structCalls.front();
    EXPECT_EQ(call.input, (Bytes{'D', 'R', 'C', 'S', 24, 0, 0, 0, 4, 3, 2, 1, 'v', 'a', 'l'}));
    EXPECT_EQ(call.output, nullptr);
    EXPECT_EQ(call.offeredSize.value_or(0), 0U);
    EXPECT_TRUE(logged().empty());
    EXPECT_EQ(printed(), "");
}

TEST_F(EnvironmentVariables, SetLengthsAtTheirLimits) {
    const Bytes data(65, 0x22);
    EXPECT_EQ(KSTSetEnvironmentVariable(1, nullptr, 0), 0);
    EXPECT_EQ(channel.structCalls.back().input.size(), 12U);
    EXPECT_EQ(KSTSetEnvironmentVariable(1, data.data(), 1), 0);
    EXPECT_EQ(channel.structCalls.back().input.size(), 13U);
    EXPECT_EQ(KSTSetEnvironmentVariable(1, data.data(), 64), 0);
    EXPECT_EQ(channel.structCalls.back().input.size(), 76U);
    channel.structCalls.clear();
    expectSetRefused(data.data(), 65);
    expectSetRefused(data.data(), 0);
    expectSetRefused(nullptr, 64);
}

TEST_F(EnvironmentVariables, SetTakesNoReply) {
    channel.reportedSize = 1;
    EXPECT_EQ(KSTSetEnvironmentVariable(1, "a", 1), kKSTErrorUnexpected);
    EXPECT_EQ(logged(),
              (Lines{failedCheck("replySize <= offeredSize"), transportFailed(-5, "LibCall"),
                     "KSTLib: KSTSetEnvironmentVariable: returning, err = -5.\n"}));
    EXPECT_EQ(printed(), "KST: LibCall_KSTSetEnvironmentVariable: returning, err = -5.\n");
}

TEST_F(EnvironmentVariables, GetSendsThisFrame) {
    channel.reply = {'v', 'a', 'l'};
    EXPECT_EQ(KSTGetEnvironmentVariable(5, block), 0);
    ASSERT_EQ(channel.structCalls.size(), 1U);
    const auto& call = channel.structCalls.front();
    EXPECT_EQ(call.input, (Bytes{'D', 'R', 'C', 'S', 25, 0, 0, 0, 5, 0, 0, 0}));
    EXPECT_EQ(call.offeredSize, 64U);
    EXPECT_TRUE(call.outputWasZero);
    ASSERT_EQ(block.calls.size(), 1U);
    EXPECT_EQ(block.calls.front().bytes, channel.reply);
    EXPECT_TRUE(logged().empty());
}

TEST_F(EnvironmentVariables, GetReplySizes) {
    for (const std::size_t size : {0U, 1U, 63U, 64U}) {
        channel.reply = Bytes(size, 0x77);
        EXPECT_EQ(KSTGetEnvironmentVariable(5, block), 0);
        EXPECT_EQ(block.calls.back().length, size);
        EXPECT_EQ(block.calls.back().wasNull, size == 0);
    }
    EXPECT_EQ(block.calls.size(), 4U);
    channel.reportedSize = 65;
    EXPECT_EQ(KSTGetEnvironmentVariable(5, block), kKSTErrorUnexpected);
    EXPECT_EQ(block.calls.size(), 4U);
}

TEST_F(EnvironmentVariables, GetWithoutABlockSendsNothing) {
    EXPECT_EQ(KSTGetEnvironmentVariable(5, nullptr), kKSTErrorBadParameter);
    EXPECT_TRUE(registry.classesAsked.empty());
    EXPECT_TRUE(channel.structCalls.empty());
    EXPECT_EQ(logged(), (Lines{"KST: AssertMacros: processVariable (value: 0x0),  file: "
                               "common/LibCallBlock:<n>\n",
                               "KSTLib: KSTGetEnvironmentVariable: returning, err = -3.\n"}));
    EXPECT_EQ(printed(), "KST: LibCall_KSTGetEnvironmentVariable_Block: returning, err = -3.\n");
}

TEST_F(EnvironmentVariables, FailuresPassThrough) {
    for (const KSTStatus status : {std::numeric_limits<KSTStatus>::min(), -1110, -7, 1}) {
        log.clear();
        channel.structStatus = status;
        EXPECT_EQ(KSTSetEnvironmentVariable(5, "a", 1), status);
        EXPECT_EQ(KSTGetEnvironmentVariable(5, block), status);
        ASSERT_EQ(logged().size(), 6U);
        const std::string end = ": returning, err = " + std::to_string(status) + ".\n";
        EXPECT_EQ(logged()[1], transportFailed(status, "LibCall"));
        EXPECT_EQ(logged()[2], "KSTLib: KSTSetEnvironmentVariable" + end);
        EXPECT_EQ(logged()[4], transportFailed(status, "LibCallBlock"));
        EXPECT_EQ(logged()[5], "KSTLib: KSTGetEnvironmentVariable" + end);
    }
    EXPECT_TRUE(block.calls.empty());
}

TEST_F(EnvironmentVariables, AbsentService) {
    registry.present = false;
    EXPECT_EQ(KSTSetEnvironmentVariable(5, "a", 1), kKSTErrorUnexpected);
    EXPECT_EQ(KSTGetEnvironmentVariable(5, block), kKSTErrorUnexpected);
    EXPECT_TRUE(block.calls.empty());
    EXPECT_EQ(logged(), (Lines{failedCheck("service"), transportFailed(-5, "LibCall"),
                               "KSTLib: KSTSetEnvironmentVariable: returning, err = -5.\n",
                               failedCheck("service"), transportFailed(-5, "LibCallBlock"),
                               "KSTLib: KSTGetEnvironmentVariable: returning, err = -5.\n"}));
}

TEST_F(EnvironmentVariables, FailedAllocation) {
    for (const bool isSet : {true, false}) {
        const support::ScriptedGate gate(0);
        EXPECT_EQ(isSet ? KSTSetEnvironmentVariable(5, "a", 1)
                        : KSTGetEnvironmentVariable(5, block),
                  kKSTErrorOutOfMemory);
        EXPECT_EQ(gate.asked.size(), 1U);
    }
    EXPECT_TRUE(channel.structCalls.empty());
    EXPECT_TRUE(block.calls.empty());
}

TEST_F(EnvironmentVariables, EntriesAndExitsAtLowLevel) {
    kst::gLogLevel = 30;
    EXPECT_EQ(KSTSetEnvironmentVariable(5, "a", 1), 0);
    EXPECT_EQ(KSTGetEnvironmentVariable(5, block), 0);
    EXPECT_EQ(logged(), (Lines{"KSTLib: KSTSetEnvironmentVariable: called.\n",
                               "KSTLib: KSTSetEnvironmentVariable: returning, err = 0.\n",
                               "KSTLib: KSTGetEnvironmentVariable: called.\n",
                               "KSTLib: KSTGetEnvironmentVariable: returning, err = 0.\n"}));
}
