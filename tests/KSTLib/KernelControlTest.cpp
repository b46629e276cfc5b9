#include "KSTLib/KSTLib.h"
#include "tests/KSTLib/ChannelFixture.h"
#include "tests/support/RecordingBlock.h"
#include "tests/support/ScriptedGate.h"

#include <gtest/gtest.h>

#include <limits>

namespace {

using support::Bytes;
using support::Lines;

constexpr char kDataCheck[] =
    "KST: AssertMacros: (data && dataLength && dataLength <= 256) || (!data && !dataLength) "
    "(value: 0x0),  file: common/LibCallBlock:<n>\n";
constexpr char kBadParameter[] = "KSTLib: KSTKernelControl: returning, err = -3.\n";

class LibraryKernelControl : public support::ChannelFixture {
  protected:
    void expectRefused(const void* data, std::size_t length) {
        log.clear();
        EXPECT_EQ(KSTKernelControl(7, data, length, block), kKSTErrorBadParameter);
        EXPECT_TRUE(registry.classesAsked.empty());
        EXPECT_TRUE(channel.structCalls.empty());
        EXPECT_TRUE(block.calls.empty());
        EXPECT_EQ(logged(), (Lines{kDataCheck, kBadParameter}));
    }

    support::RecordingBlock block;
};

} // namespace

TEST_F(LibraryKernelControl, ExactFrame) {
    EXPECT_EQ(KSTKernelControl(7, "abc", 3, nullptr), 0);
    ASSERT_EQ(channel.structCalls.size(), 1U);
    const auto& call = channel.structCalls.front();
    EXPECT_EQ(call.selector, 0U);
    EXPECT_EQ(call.input, (Bytes{'D', 'R', 'C', 'S', 26, 0, 0, 0, 7, 0, 0, 0, 'a', 'b', 'c'}));
    EXPECT_EQ(call.offeredSize, 256U);
    EXPECT_TRUE(call.outputWasZero);
    EXPECT_TRUE(logged().empty());
    EXPECT_EQ(printed(), "");
}

TEST_F(LibraryKernelControl, WithoutDataTheFrameHas12Bytes) {
    EXPECT_EQ(KSTKernelControl(0xfffefdfc, nullptr, 0, nullptr), 0);
    EXPECT_EQ(channel.structCalls.front().input,
              (Bytes{'D', 'R', 'C', 'S', 26, 0, 0, 0, 0xfc, 0xfd, 0xfe, 0xff}));
}

TEST_F(LibraryKernelControl, LengthsAtTheirLimits) {
    const Bytes data(257, 0x11);
    EXPECT_EQ(KSTKernelControl(7, data.data(), 256, nullptr), 0);
    EXPECT_EQ(channel.structCalls.front().input.size(), 268U);
    channel.structCalls.clear();
    registry.classesAsked.clear();
    expectRefused(data.data(), 257);
    expectRefused(data.data(), 0);
    expectRefused(nullptr, 1);
}

TEST_F(LibraryKernelControl, RefusalIsPrinted) {
    expectRefused(nullptr, 1);
    EXPECT_EQ(printed(), "KST: LibCall_KSTKernelControl_Block: returning, err = -3.\n");
}

TEST_F(LibraryKernelControl, AbsentServiceGivesExactlyTheseLines) {
    registry.present = false;
    EXPECT_EQ(KSTKernelControl(6, Bytes(32).data(), 32, nullptr), kKSTErrorUnexpected);
    EXPECT_EQ(logged(),
              (Lines{"KSTLib: AssertMacros: service (value: 0x0),  file: KSTLib/KSTLib:<n>\n",
                     transportFailed(-5, "LibCallBlock"),
                     "KSTLib: KSTKernelControl: returning, err = -5.\n"}));
    EXPECT_EQ(printed(), "KST: LibCall_KSTKernelControl_Block: returning, err = -5.\n");
}

TEST_F(LibraryKernelControl, AbsentServiceGivesTheBlockTheWholeBuffer) {
    registry.present = false;
    EXPECT_EQ(KSTKernelControl(6, nullptr, 0, block), kKSTErrorUnexpected);
    ASSERT_EQ(block.calls.size(), 1U);
    EXPECT_EQ(block.calls.front().bytes, Bytes(256, 0));
}

TEST_F(LibraryKernelControl, NextCallTriesTheOpenAgain) {
    registry.present = false;
    EXPECT_EQ(KSTKernelControl(6, nullptr, 0, nullptr), kKSTErrorUnexpected);
    registry.present = true;
    EXPECT_EQ(KSTKernelControl(6, nullptr, 0, nullptr), 0);
    EXPECT_EQ(registry.classesAsked.size(), 2U);
    EXPECT_EQ(channel.structCalls.size(), 1U);
}

TEST_F(LibraryKernelControl, ReplyGoesToTheBlock) {
    for (const std::size_t size : {0U, 1U, 255U, 256U}) {
        channel.reply = Bytes(size, 0x77);
        EXPECT_EQ(KSTKernelControl(7, nullptr, 0, block), 0);
        EXPECT_EQ(block.calls.back().bytes, channel.reply);
        EXPECT_EQ(block.calls.back().length, size);
        EXPECT_EQ(block.calls.back().wasNull, size == 0);
    }
    EXPECT_EQ(block.calls.size(), 4U);
}

TEST_F(LibraryKernelControl, ReplyBeyondWhatWasOffered) {
    channel.reportedSize = 257;
    EXPECT_EQ(KSTKernelControl(7, nullptr, 0, block), kKSTErrorUnexpected);
    EXPECT_EQ(logged(),
              (Lines{failedCheck("replySize <= offeredSize"), transportFailed(-5, "LibCallBlock"),
                     "KSTLib: KSTKernelControl: returning, err = -5.\n"}));
    ASSERT_EQ(block.calls.size(), 1U);
    EXPECT_EQ(block.calls.front().length, 256U);
}

TEST_F(LibraryKernelControl, StatusesPassThrough) {
    for (const KSTStatus status : {std::numeric_limits<KSTStatus>::min(), -6006, -1110, -7, -1, 1,
                                   std::numeric_limits<KSTStatus>::max()}) {
        log.clear();
        channel.structStatus = status;
        EXPECT_EQ(KSTKernelControl(7, "a", 1, block), status);
        ASSERT_EQ(logged().size(), 3U);
        EXPECT_EQ(logged()[1], transportFailed(status, "LibCallBlock"));
        EXPECT_EQ(logged().back(),
                  "KSTLib: KSTKernelControl: returning, err = " + std::to_string(status) + ".\n");
        EXPECT_EQ(block.calls.back().length, 256U);
    }
}

TEST_F(LibraryKernelControl, EachAllocationFailedInTurn) {
    std::size_t refused = 0;
    for (; refused < 10; ++refused) {
        const support::ScriptedGate gate(refused);
        log.clear();
        const std::int64_t before = gAllocatedBytes;
        const KSTStatus status = KSTKernelControl(7, "a", 1, nullptr);
        EXPECT_EQ(gAllocatedBytes, before);
        if (gate.asked.size() <= refused) {
            EXPECT_EQ(status, 0);
            break;
        }
        EXPECT_EQ(status, kKSTErrorOutOfMemory);
        EXPECT_EQ(logged(), (Lines{failedCheck("cmd"), transportFailed(-4, "LibCallBlock"),
                                   "KSTLib: KSTKernelControl: returning, err = -4.\n"}));
        EXPECT_TRUE(channel.structCalls.empty());
    }
    EXPECT_EQ(refused, 1U);
    EXPECT_EQ(channel.structCalls.size(), 1U);
}

TEST_F(LibraryKernelControl, BlockMayCallTheLibrary) {
    int depth = 0;
    const auto outer = [&](const void*, std::size_t) {
        ++depth;
        EXPECT_EQ(KSTKernelControl(2, nullptr, 0, [&](const void*, std::size_t) { ++depth; }), 0);
    };
    EXPECT_EQ(KSTKernelControl(1, nullptr, 0, outer), 0);
    EXPECT_EQ(depth, 2);
    EXPECT_EQ(channel.structCalls.size(), 2U);
    EXPECT_EQ(channel.opens.size(), 1U);
}

TEST_F(LibraryKernelControl, WithoutAPlatform) {
    kst::removePlatform();
    EXPECT_EQ(KSTKernelControl(1, nullptr, 0, nullptr), kKSTErrorUnexpected);
    EXPECT_TRUE(logged().empty());
    EXPECT_EQ(printed(), "KST: LibCall_KSTKernelControl_Block: returning, err = -5.\n");
}
