#include "tests/KSTLib/InterfaceInC.h"

#include "KSTLib/KSTLib.h"
#include "tests/KSTLib/ChannelFixture.h"

#include <gtest/gtest.h>

namespace {

using support::Bytes;

using InterfaceInC = support::ChannelFixture;

Bytes bytesOf(const Seen& seen) {
    return {seen.bytes, seen.bytes + seen.length};
}

} // namespace

TEST_F(InterfaceInC, BlockHasTheSameSize) {
    EXPECT_EQ(sizeOfDataBlockInC(), sizeof(KSTDataBlock));
    EXPECT_EQ(sizeOfDataBlockInC(), 2 * sizeof(void*));
}

TEST_F(InterfaceInC, KernelControl) {
    channel.reply = {5, 6, 7};
    Seen seen{};
    EXPECT_EQ(kernelControlFromC(7, "ab", 2, &seen), 0);
    EXPECT_EQ(channel.structCalls.back().input,
              (Bytes{'D', 'R', 'C', 'S', 26, 0, 0, 0, 7, 0, 0, 0, 'a', 'b'}));
    EXPECT_EQ(seen.calls, 1);
    EXPECT_EQ(bytesOf(seen), (Bytes{5, 6, 7}));
}

TEST_F(InterfaceInC, KernelControlWithoutBlock) {
    channel.reply = {5, 6, 7};
    EXPECT_EQ(kernelControlWithoutBlockFromC(7), 0);
    channel.structStatus = -9;
    EXPECT_EQ(kernelControlWithoutBlockFromC(7), -9);
}

TEST_F(InterfaceInC, EmptyReply) {
    Seen seen{};
    EXPECT_EQ(kernelControlFromC(7, nullptr, 0, &seen), 0);
    EXPECT_EQ(seen.calls, 1);
    EXPECT_EQ(seen.wasNull, 1);
    EXPECT_EQ(seen.length, 0U);
}

TEST_F(InterfaceInC, EnvironmentVariables) {
    EXPECT_EQ(setVariableFromC(3, "v", 1), 0);
    EXPECT_EQ(channel.structCalls.back().input,
              (Bytes{'D', 'R', 'C', 'S', 24, 0, 0, 0, 3, 0, 0, 0, 'v'}));
    EXPECT_EQ(setVariableFromC(3, "v", 65), kKSTErrorBadParameter);
    channel.reply = {'v'};
    Seen seen{};
    EXPECT_EQ(getVariableFromC(3, &seen), 0);
    EXPECT_EQ(bytesOf(seen), Bytes{'v'});
    EXPECT_EQ(getVariableWithoutBlockFromC(3), kKSTErrorBadParameter);
}

TEST_F(InterfaceInC, TransportAndBlockInC) {
    TransportInC transport{};
    transport.reply = "xyz";
    transport.replySize = 3;
    EXPECT_EQ(libCallSetFromC(&transport, "v", 1), 0);
    EXPECT_EQ(transport.code, 24U);
    EXPECT_EQ(bytesOf(transport.seen), (Bytes{1, 0, 0, 0, 'v'}));

    Seen seen{};
    EXPECT_EQ(libCallGetFromC(&transport, &seen), 0);
    EXPECT_EQ(transport.code, 25U);
    EXPECT_EQ(bytesOf(seen), (Bytes{'x', 'y', 'z'}));
    EXPECT_EQ(libCallControlFromC(&transport, &seen), 0);
    EXPECT_EQ(transport.code, 26U);
    EXPECT_EQ(seen.calls, 2);

    transport.status = -1110;
    EXPECT_EQ(libCallSetFromC(&transport, "v", 1), -1110);
    EXPECT_EQ(libCallGetFromC(&transport, &seen), -1110);
    EXPECT_EQ(seen.calls, 2);
    EXPECT_EQ(libCallControlFromC(&transport, &seen), -1110);
    EXPECT_EQ(seen.calls, 3);
}

TEST_F(InterfaceInC, FrameIsGivenBackAsItsHeaderSays) {
    const std::int64_t before = allocatedBytesInC();
    Bytes frame(11);
    EXPECT_EQ(buildCommandFromC(1, "abc", 3, frame.data()), 11U);
    EXPECT_EQ(frame, (Bytes{'D', 'R', 'C', 'S', 1, 0, 0, 0, 'a', 'b', 'c'}));
    EXPECT_EQ(allocatedBytesInC(), before);
}
