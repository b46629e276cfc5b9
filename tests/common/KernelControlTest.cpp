#include "KSTLib/LibCall.h"
#include "tests/support/LibraryFixture.h"
#include "tests/support/RecordingBlock.h"
#include "tests/support/ScriptedTransport.h"

#include <gtest/gtest.h>

#include <limits>
#include <vector>

namespace {

using Bytes = std::vector<std::uint8_t>;
using Lines = std::vector<std::string>;

constexpr char kDataCheck[] =
    "KST: AssertMacros: (data && dataLength && dataLength <= 256) || (!data && !dataLength) "
    "(value: 0x0),  file: common/LibCallBlock:<n>\n";
constexpr char kSizeCheck[] = "KST: AssertMacros: outSize <= sizeof(outBuffer) (value: 0x0),  "
                              "file: common/LibCallBlock:<n>\n";

class KernelControl : public support::LibraryFixture {
  protected:
    KSTStatus control(const void* data, std::size_t length, KSTDataBlock resultBlock) {
        return LibCall_KSTKernelControl_Block(support::ScriptedTransport::function, &transport,
                                              0x80000007, data, length, resultBlock);
    }

    void expectRefused(const void* data, std::size_t length) {
        log.clear();
        EXPECT_EQ(control(data, length, block), kKSTErrorBadParameter);
        EXPECT_TRUE(transport.calls.empty());
        EXPECT_TRUE(block.calls.empty());
        EXPECT_EQ(logged(), Lines{kDataCheck});
    }

    void expectBlockGotNothing() {
        ASSERT_EQ(block.calls.size(), 1U);
        EXPECT_TRUE(block.calls.front().wasNull);
        EXPECT_EQ(block.calls.front().length, 0U);
    }

    support::ScriptedTransport transport;
    support::RecordingBlock block;
};

} // namespace

TEST_F(KernelControl, ExactRequest) {
    EXPECT_EQ(control("xyz", 3, block), 0);
    ASSERT_EQ(transport.calls.size(), 1U);
    const auto& call = transport.calls.front();
    EXPECT_EQ(call.code, 26U);
    EXPECT_EQ(call.thirdByte, 0U);
    EXPECT_EQ(call.input, (Bytes{7, 0, 0, 0x80, 'x', 'y', 'z'}));
    EXPECT_NE(call.output, nullptr);
    EXPECT_EQ(call.offeredSize, 256U);
    EXPECT_TRUE(call.outputWasZero);
    EXPECT_TRUE(logged().empty());
    EXPECT_EQ(printed(), "");
}

TEST_F(KernelControl, WithoutData) {
    EXPECT_EQ(control(nullptr, 0, nullptr), 0);
    ASSERT_EQ(transport.calls.size(), 1U);
    EXPECT_EQ(transport.calls.front().input, (Bytes{7, 0, 0, 0x80}));
}

TEST_F(KernelControl, LengthsAtTheirLimits) {
    const Bytes data(257, 0x77);
    for (const std::size_t length : {1U, 255U, 256U}) {
        EXPECT_EQ(control(data.data(), length, nullptr), 0);
        EXPECT_EQ(transport.calls.back().input.size(), 4 + length);
        EXPECT_EQ(transport.calls.back().input.back(), 0x77);
    }
    transport.calls.clear();
    expectRefused(data.data(), 257);
}

TEST_F(KernelControl, LengthsThatDoNotMatchTheData) {
    const std::uint8_t byte = 0;
    expectRefused(&byte, 0);
    expectRefused(&byte, SIZE_MAX);
    expectRefused(nullptr, 1);
    expectRefused(nullptr, 256);
    expectRefused(nullptr, SIZE_MAX);
}

TEST_F(KernelControl, RefusalIsPrintedAndFlushed) {
    expectRefused(nullptr, 1);
    EXPECT_EQ(printed(), "KST: LibCall_KSTKernelControl_Block: returning, err = -3.\n");
}

TEST_F(KernelControl, NoTransport) {
    EXPECT_EQ(LibCall_KSTKernelControl_Block(nullptr, &transport, 1, nullptr, 1, block), -3);
    EXPECT_TRUE(block.calls.empty());
    EXPECT_EQ(logged(), Lines{"KST: AssertMacros: transport (value: 0x0),  file: "
                              "common/LibCallBlock:<n>\n"});
    EXPECT_EQ(printed(), "KST: LibCall_KSTKernelControl_Block: returning, err = -3.\n");
}

TEST_F(KernelControl, ReplySizes) {
    for (const std::size_t size : {1U, 255U, 256U}) {
        transport.reply = Bytes(size, 0x44);
        transport.reportedSize = size;
        EXPECT_EQ(control(nullptr, 0, block), 0);
        ASSERT_FALSE(block.calls.empty());
        EXPECT_EQ(block.calls.back().bytes, transport.reply);
    }
    EXPECT_EQ(block.calls.size(), 3U);
}

TEST_F(KernelControl, ReplyOfNoBytesIsANullPointer) {
    transport.reportedSize = 0;
    EXPECT_EQ(control(nullptr, 0, block), 0);
    expectBlockGotNothing();
}

TEST_F(KernelControl, NullBlockIsNotCalled) {
    transport.reply = {1, 2, 3};
    transport.reportedSize = 3;
    EXPECT_EQ(control("a", 1, nullptr), 0);
    transport.status = -9;
    EXPECT_EQ(control("a", 1, nullptr), -9);
    EXPECT_EQ(transport.calls.size(), 2U);
}

TEST_F(KernelControl, FailureThatSetNoSizeGivesTheWholeBuffer) {
    transport.status = -1110;
    EXPECT_EQ(control("a", 1, block), -1110);
    ASSERT_EQ(block.calls.size(), 1U);
    EXPECT_EQ(block.calls.front().bytes, Bytes(256, 0));
    EXPECT_EQ(printed(), "KST: LibCall_KSTKernelControl_Block: returning, err = -1110.\n");
    EXPECT_EQ(logged(), Lines{transportFailed(-1110, "LibCallBlock")});
}

TEST_F(KernelControl, FailureThatSetASizeGivesThatMuch) {
    transport.status = 5;
    transport.reply = {1, 2, 3, 4};
    transport.reportedSize = 3;
    EXPECT_EQ(control("a", 1, block), 5);
    ASSERT_EQ(block.calls.size(), 1U);
    EXPECT_EQ(block.calls.front().bytes, (Bytes{1, 2, 3}));
}

TEST_F(KernelControl, FailureThatSetTheSizeToNothing) {
    transport.status = -1;
    transport.reportedSize = 0;
    EXPECT_EQ(control("a", 1, block), -1);
    expectBlockGotNothing();
}

TEST_F(KernelControl, MoreThanWasOfferedIsRefusedBeforeAnyUse) {
    for (const std::size_t size : {std::size_t{257}, std::size_t{1} << 32U, SIZE_MAX}) {
        log.clear();
        block.calls.clear();
        transport.reportedSize = size;
        EXPECT_EQ(control("a", 1, block), kKSTErrorUnexpected);
        EXPECT_EQ(logged(), Lines{kSizeCheck});
        expectBlockGotNothing();
    }
}

TEST_F(KernelControl, FailureThatClaimsMoreThanWasOfferedKeepsItsStatus) {
    transport.status = -1104;
    transport.reportedSize = 257;
    EXPECT_EQ(control("a", 1, block), -1104);
    expectBlockGotNothing();
    EXPECT_EQ(logged(), Lines{transportFailed(-1104, "LibCallBlock")});
}

TEST_F(KernelControl, StatusesPassThrough) {
    for (const KSTStatus status : {std::numeric_limits<KSTStatus>::min(), -6007, -1110, -7, -5, -1,
                                   1, std::numeric_limits<KSTStatus>::max()}) {
        transport.status = status;
        EXPECT_EQ(control("a", 1, block), status);
        EXPECT_EQ(logged(), Lines{transportFailed(status, "LibCallBlock")});
        log.clear();
    }
    EXPECT_EQ(block.calls.size(), 8U);
    EXPECT_NE(printed().find("err = -2147483648.\n"), std::string::npos);
    EXPECT_NE(printed().find("err = 2147483647.\n"), std::string::npos);
}

TEST_F(KernelControl, OneReplyIsNotSeenByTheNextCall) {
    transport.reply = Bytes(256, 0x44);
    transport.reportedSize = 256;
    EXPECT_EQ(control(nullptr, 0, nullptr), 0);
    transport.reply.clear();
    EXPECT_EQ(control(nullptr, 0, block), 0);
    EXPECT_TRUE(transport.calls.back().outputWasZero);
    EXPECT_EQ(block.calls.front().bytes, Bytes(256, 0));
}
