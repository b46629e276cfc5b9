#include "base/ByteWriter.h"

#include "base/ByteReader.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <array>
#include <vector>

namespace {

using testing::Each;
using testing::ElementsAre;

constexpr std::uint8_t kUntouched = 0xaa;

/// Writes an Integer into a buffer of every size around its own and checks what a write must do.
template <typename Integer, typename Write>
void expectIntegerAtEveryCapacity(Write write, const std::vector<std::uint8_t>& expected) {
    for (std::size_t capacity = 0; capacity <= sizeof(Integer) + 2; ++capacity) {
        SCOPED_TRACE(capacity);
        std::vector<std::uint8_t> buffer(capacity, kUntouched);
        base::ByteWriter writer(buffer);
        if (capacity < sizeof(Integer)) {
            EXPECT_FALSE(write(writer));
            EXPECT_EQ(writer.written(), 0U);
            EXPECT_EQ(writer.left(), capacity);
            EXPECT_THAT(buffer, Each(kUntouched));
        } else {
            EXPECT_TRUE(write(writer));
            EXPECT_EQ(writer.written(), sizeof(Integer));
            EXPECT_EQ(writer.left(), capacity - sizeof(Integer));
            std::vector<std::uint8_t> whole = expected;
            whole.resize(capacity, kUntouched);
            EXPECT_EQ(buffer, whole);
        }
    }
}

} // namespace

TEST(ByteWriter, U8AtEveryCapacity) {
    expectIntegerAtEveryCapacity<std::uint8_t>([](auto& writer) { return writer.writeU8(0xf1); },
                                               {0xf1});
}

TEST(ByteWriter, U16AtEveryCapacity) {
    expectIntegerAtEveryCapacity<std::uint16_t>(
        [](auto& writer) { return writer.writeU16(0xe2f1); }, {0xf1, 0xe2});
}

TEST(ByteWriter, U32AtEveryCapacity) {
    expectIntegerAtEveryCapacity<std::uint32_t>(
        [](auto& writer) { return writer.writeU32(0xc4d3e2f1); }, {0xf1, 0xe2, 0xd3, 0xc4});
}

TEST(ByteWriter, U64AtEveryCapacity) {
    expectIntegerAtEveryCapacity<std::uint64_t>(
        [](auto& writer) { return writer.writeU64(0x8897a6b5c4d3e2f1); },
        {0xf1, 0xe2, 0xd3, 0xc4, 0xb5, 0xa6, 0x97, 0x88});
}

TEST(ByteWriter, BytesThatFitExactly) {
    std::array<std::uint8_t, 3> buffer{};
    base::ByteWriter writer(buffer);
    const std::array<std::uint8_t, 3> data{7, 8, 9};
    EXPECT_TRUE(writer.writeBytes(data.data(), data.size()));
    EXPECT_EQ(buffer, data);
    EXPECT_EQ(writer.left(), 0U);
    EXPECT_EQ(writer.written(), 3U);
}

TEST(ByteWriter, OneByteMoreThanThereIsRoom) {
    std::array<std::uint8_t, 3> buffer{kUntouched, kUntouched, kUntouched};
    base::ByteWriter writer(buffer);
    const std::array<std::uint8_t, 4> data{6, 7, 8, 9};
    EXPECT_FALSE(writer.writeBytes(data.data(), data.size()));
    EXPECT_FALSE(writer.writeText("four"));
    EXPECT_THAT(buffer, Each(kUntouched));
    EXPECT_EQ(writer.left(), 3U);
    EXPECT_EQ(writer.written(), 0U);
}

TEST(ByteWriter, LengthsThatWouldWrapAnAddition) {
    std::array<std::uint8_t, 4> buffer{};
    base::ByteWriter writer(buffer);
    ASSERT_TRUE(writer.writeU8(1));
    const std::uint8_t byte = 0;
    EXPECT_FALSE(writer.writeBytes(&byte, SIZE_MAX));
    EXPECT_FALSE(writer.writeBytes(&byte, SIZE_MAX - 1));
    EXPECT_FALSE(writer.writeBytes(&byte, SIZE_MAX / 2));
    EXPECT_EQ(writer.left(), 3U);
}

TEST(ByteWriter, NullOfLengthZero) {
    base::ByteWriter nowhere(nullptr, 0);
    EXPECT_TRUE(nowhere.writeBytes(nullptr, 0));
    EXPECT_TRUE(nowhere.writeText({}));
    EXPECT_FALSE(nowhere.writeU8(1));
    EXPECT_EQ(nowhere.written(), 0U);

    std::array<std::uint8_t, 2> buffer{kUntouched, kUntouched};
    base::ByteWriter writer(buffer);
    EXPECT_TRUE(writer.writeBytes(nullptr, 0));
    EXPECT_THAT(buffer, Each(kUntouched));
    EXPECT_EQ(writer.left(), 2U);
}

TEST(ByteWriter, FieldsFollowEachOtherWithoutGaps) {
    std::array<std::uint8_t, 10> buffer{};
    base::ByteWriter writer(buffer);
    ASSERT_TRUE(writer.writeU8(1) && writer.writeU16(2) && writer.writeText("ab") &&
                writer.writeU32(3) && writer.writeU8(0xff));
    EXPECT_THAT(buffer, ElementsAre(1, 2, 0, 'a', 'b', 3, 0, 0, 0, 0xff));
    EXPECT_EQ(writer.written(), 10U);
}

TEST(ByteWriter, WritesOnAfterARefusal) {
    std::array<std::uint8_t, 3> buffer{};
    base::ByteWriter writer(buffer);
    EXPECT_FALSE(writer.writeU32(0xffffffff));
    EXPECT_TRUE(writer.writeU16(0x0201));
    EXPECT_TRUE(writer.writeU8(3));
    EXPECT_FALSE(writer.writeU8(4));
    EXPECT_THAT(buffer, ElementsAre(1, 2, 3));
}

TEST(ByteWriter, ReaderTakesBackWhatWasWritten) {
    for (unsigned shift = 0; shift < 64; ++shift) {
        for (const std::uint64_t value :
             {(std::uint64_t{1} << shift) - 1, std::uint64_t{1} << shift}) {
            std::array<std::uint8_t, 15> buffer{};
            base::ByteWriter writer(buffer);
            ASSERT_TRUE(writer.writeU64(value) &&
                        writer.writeU32(static_cast<std::uint32_t>(value)) &&
                        writer.writeU16(static_cast<std::uint16_t>(value)) &&
                        writer.writeU8(static_cast<std::uint8_t>(value)));
            base::ByteReader reader(buffer);
            std::uint64_t u64 = 0;
            std::uint32_t u32 = 0;
            std::uint16_t u16 = 0;
            std::uint8_t u8 = 0;
            ASSERT_TRUE(reader.readU64(u64) && reader.readU32(u32) && reader.readU16(u16) &&
                        reader.readU8(u8));
            EXPECT_EQ(u64, value);
            EXPECT_EQ(u32, value & 0xffffffffU);
            EXPECT_EQ(u16, value & 0xffffU);
            EXPECT_EQ(u8, value & 0xffU);
        }
    }
}
