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

constexpr char kSetDataCheck[] =
    "KST: AssertMacros: (data && dataLength && dataLength <= 64) || (!data && !dataLength) "
    "(value: 0x0),  file: common/LibCall:<n>\n";

class SetVariable : public support::LibraryFixture {
  protected:
    KSTStatus set(const void* data, std::size_t length) {
        return LibCall_KSTSetEnvironmentVariable(support::ScriptedTransport::function, &transport,
                                                 0x01020304, data, length);
    }

    void expectRefused(const void* data, std::size_t length) {
        log.clear();
        EXPECT_EQ(set(data, length), kKSTErrorBadParameter);
        EXPECT_TRUE(transport.calls.empty());
        EXPECT_EQ(logged(), Lines{kSetDataCheck});
    }

    support::ScriptedTransport transport;
};

class GetVariable : public support::LibraryFixture {
  protected:
    KSTStatus get() {
        return LibCall_KSTGetEnvironmentVariable_Block(support::ScriptedTransport::function,
                                                       &transport, 0xfffefdfc, block);
    }

    support::ScriptedTransport transport;
    support::RecordingBlock block;
};

} // namespace

TEST_F(SetVariable, ExactPayload) {
    EXPECT_EQ(set("abc", 3), 0);
    ASSERT_EQ(transport.calls.size(), 1U);
    const auto& call = transport.calls.front();
    EXPECT_EQ(call.code, 24U);
    EXPECT_EQ(call.thirdByte, 0U);
    EXPECT_EQ(call.input, (Bytes{4, 3, 2, 1, 'a', 'b', 'c'}));
    EXPECT_EQ(call.output, nullptr);
    EXPECT_EQ(call.offeredSize, std::nullopt);
    EXPECT_TRUE(logged().empty());
    EXPECT_EQ(printed(), "");
}

TEST_F(SetVariable, WithoutData) {
    EXPECT_EQ(set(nullptr, 0), 0);
    ASSERT_EQ(transport.calls.size(), 1U);
    EXPECT_EQ(transport.calls.front().input, (Bytes{4, 3, 2, 1}));
}

TEST_F(SetVariable, LengthsAtTheirLimits) {
    const Bytes data(65, 0x77);
    for (const std::size_t length : {1U, 63U, 64U}) {
        EXPECT_EQ(set(data.data(), length), 0);
        EXPECT_EQ(transport.calls.back().input.size(), 4 + length);
        EXPECT_EQ(transport.calls.back().input.back(), 0x77);
    }
    transport.calls.clear();
    expectRefused(data.data(), 65);
}

TEST_F(SetVariable, LengthsThatDoNotMatchTheData) {
    const std::uint8_t byte = 0;
    expectRefused(&byte, 0);
    expectRefused(&byte, SIZE_MAX);
    expectRefused(nullptr, 1);
    expectRefused(nullptr, 64);
    expectRefused(nullptr, SIZE_MAX);
}

TEST_F(SetVariable, RefusalIsPrintedAndFlushed) {
    expectRefused(nullptr, 1);
    EXPECT_EQ(printed(), "KST: LibCall_KSTSetEnvironmentVariable: returning, err = -3.\n");
}

TEST_F(SetVariable, NoTransport) {
    EXPECT_EQ(LibCall_KSTSetEnvironmentVariable(nullptr, &transport, 1, "a", 1), -3);
    EXPECT_EQ(logged(), Lines{"KST: AssertMacros: transport (value: 0x0),  file: common/LibCall:"
                              "<n>\n"});
    EXPECT_EQ(printed(), "KST: LibCall_KSTSetEnvironmentVariable: returning, err = -3.\n");
}

TEST_F(SetVariable, NoTransportIsFoundBeforeBadData) {
    EXPECT_EQ(LibCall_KSTSetEnvironmentVariable(nullptr, nullptr, 1, nullptr, 1), -3);
    ASSERT_EQ(logged().size(), 1U);
    EXPECT_NE(logged().front().find("transport"), std::string::npos);
}

TEST_F(SetVariable, StatusesPassThrough) {
    std::string expected;
    Lines lines;
    for (const KSTStatus status : {std::numeric_limits<KSTStatus>::min(), -6007, -1110, -7, -5, -1,
                                   1, std::numeric_limits<KSTStatus>::max()}) {
        transport.status = status;
        EXPECT_EQ(set("a", 1), status);
        expected +=
            "KST: LibCall_KSTSetEnvironmentVariable: returning, err = " + std::to_string(status) +
            ".\n";
        lines.push_back(transportFailed(status, "LibCall"));
    }
    EXPECT_EQ(printed(), expected);
    EXPECT_EQ(logged(), lines);
}

TEST_F(SetVariable, NothingIsWrittenWithoutALog) {
    kst::setLibraryLog(nullptr);
    EXPECT_EQ(set(nullptr, 1), -3);
    EXPECT_TRUE(logged().empty());
    EXPECT_EQ(printed(), "KST: LibCall_KSTSetEnvironmentVariable: returning, err = -3.\n");
}

TEST_F(GetVariable, ExactRequest) {
    EXPECT_EQ(get(), 0);
    ASSERT_EQ(transport.calls.size(), 1U);
    const auto& call = transport.calls.front();
    EXPECT_EQ(call.code, 25U);
    EXPECT_EQ(call.thirdByte, 0U);
    EXPECT_EQ(call.input, (Bytes{0xfc, 0xfd, 0xfe, 0xff}));
    EXPECT_NE(call.output, nullptr);
    EXPECT_EQ(call.offeredSize, 64U);
    EXPECT_TRUE(call.outputWasZero);
    EXPECT_TRUE(logged().empty());
    EXPECT_EQ(printed(), "");
}

TEST_F(GetVariable, ReplySizes) {
    for (const std::size_t size : {1U, 63U, 64U}) {
        transport.reply = Bytes(size, 0x33);
        transport.reportedSize = size;
        EXPECT_EQ(get(), 0);
        ASSERT_FALSE(block.calls.empty());
        EXPECT_EQ(block.calls.back().bytes, transport.reply);
        EXPECT_EQ(block.calls.back().length, size);
    }
    EXPECT_EQ(block.calls.size(), 3U);
}

TEST_F(GetVariable, ReplyOfNoBytesIsANullPointer) {
    transport.reportedSize = 0;
    EXPECT_EQ(get(), 0);
    ASSERT_EQ(block.calls.size(), 1U);
    EXPECT_TRUE(block.calls.front().wasNull);
    EXPECT_EQ(block.calls.front().length, 0U);
}

TEST_F(GetVariable, MoreThanWasOfferedIsRefusedBeforeAnyUse) {
    for (const std::size_t size : {std::size_t{65}, std::size_t{1} << 32U, SIZE_MAX}) {
        log.clear();
        transport.reportedSize = size;
        EXPECT_EQ(get(), kKSTErrorUnexpected);
        EXPECT_EQ(logged(), Lines{"KST: AssertMacros: outSize <= sizeof(outBuffer) (value: 0x0),  "
                                  "file: common/LibCallBlock:<n>\n"});
    }
    EXPECT_TRUE(block.calls.empty());
}

TEST_F(GetVariable, FailureDoesNotCallTheBlock) {
    Lines lines;
    for (const KSTStatus status : {std::numeric_limits<KSTStatus>::min(), -1110, -5, 1}) {
        transport.status = status;
        transport.reply = {1, 2, 3};
        transport.reportedSize = 3;
        EXPECT_EQ(get(), status);
        lines.push_back(transportFailed(status, "LibCallBlock"));
    }
    EXPECT_TRUE(block.calls.empty());
    EXPECT_EQ(logged(), lines);
    EXPECT_EQ(printed(),
              "KST: LibCall_KSTGetEnvironmentVariable_Block: returning, err = -2147483648.\n"
              "KST: LibCall_KSTGetEnvironmentVariable_Block: returning, err = -1110.\n"
              "KST: LibCall_KSTGetEnvironmentVariable_Block: returning, err = -5.\n"
              "KST: LibCall_KSTGetEnvironmentVariable_Block: returning, err = 1.\n");
}

TEST_F(GetVariable, NullBlock) {
    EXPECT_EQ(LibCall_KSTGetEnvironmentVariable_Block(support::ScriptedTransport::function,
                                                      &transport, 1, nullptr),
              -3);
    EXPECT_TRUE(transport.calls.empty());
    EXPECT_EQ(logged(), Lines{"KST: AssertMacros: processVariable (value: 0x0),  file: "
                              "common/LibCallBlock:<n>\n"});
    EXPECT_EQ(printed(), "KST: LibCall_KSTGetEnvironmentVariable_Block: returning, err = -3.\n");
}

TEST_F(GetVariable, NoTransportIsFoundBeforeANullBlock) {
    EXPECT_EQ(LibCall_KSTGetEnvironmentVariable_Block(nullptr, nullptr, 1, nullptr), -3);
    EXPECT_EQ(logged(), Lines{"KST: AssertMacros: transport (value: 0x0),  file: "
                              "common/LibCallBlock:<n>\n"});
}
