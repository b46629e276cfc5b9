#include "base/ByteReader.h"

#include <gtest/gtest.h>

#include <array>
#include <vector>

namespace {

constexpr std::array<std::uint8_t, 8> kBytes{0xf1, 0xe2, 0xd3, 0xc4, 0xb5, 0xa6, 0x97, 0x88};

/// Reads an Integer from the first `length` of kBytes and checks what a read of one must do.
template <typename Integer, typename Read>
void expectIntegerAt(std::size_t length, Read read, Integer expected) {
    SCOPED_TRACE(length);
    // The bytes stand in memory of exactly their size, so that a sanitizer sees a read beyond them.
    const std::vector<std::uint8_t> bytes(kBytes.begin(),
                                          kBytes.begin() + static_cast<std::ptrdiff_t>(length));
    base::ByteReader reader(bytes);
    Integer value = 0x5a;
    if (length < sizeof(Integer)) {
        EXPECT_FALSE(read(reader, value));
        EXPECT_EQ(value, 0x5a);
        EXPECT_EQ(reader.left(), length);
        EXPECT_EQ(reader.rest().data(), bytes.data());
    } else {
        EXPECT_TRUE(read(reader, value));
        EXPECT_EQ(value, expected);
        EXPECT_EQ(reader.left(), length - sizeof(Integer));
        EXPECT_EQ(reader.rest().data(), bytes.data() + sizeof(Integer));
    }
}

} // namespace

TEST(ByteReader, U8AtEveryLength) {
    for (std::size_t length = 0; length <= kBytes.size(); ++length) {
        expectIntegerAt<std::uint8_t>(
            length, [](auto& reader, auto& value) { return reader.readU8(value); }, 0xf1);
    }
}

TEST(ByteReader, U16AtEveryLength) {
    for (std::size_t length = 0; length <= kBytes.size(); ++length) {
        expectIntegerAt<std::uint16_t>(
            length, [](auto& reader, auto& value) { return reader.readU16(value); }, 0xe2f1);
    }
}

TEST(ByteReader, U32AtEveryLength) {
    for (std::size_t length = 0; length <= kBytes.size(); ++length) {
        expectIntegerAt<std::uint32_t>(
            length, [](auto& reader, auto& value) { return reader.readU32(value); }, 0xc4d3e2f1);
    }
}

TEST(ByteReader, U64AtEveryLength) {
    for (std::size_t length = 0; length <= kBytes.size(); ++length) {
        expectIntegerAt<std::uint64_t>(
            length, [](auto& reader, auto& value) { return reader.readU64(value); },
            0x8897a6b5c4d3e2f1);
    }
}

TEST(ByteReader, IntegersFollowEachOtherWithoutGaps) {
    const std::array<std::uint8_t, 15> bytes{1, 2, 0, 3, 0, 0, 0, 4, 0, 0, 0, 0, 0, 0, 0x80};
    base::ByteReader reader(bytes);
    std::uint8_t first = 0;
    std::uint16_t second = 0;
    std::uint32_t third = 0;
    std::uint64_t fourth = 0;
    ASSERT_TRUE(reader.readU8(first) && reader.readU16(second) && reader.readU32(third) &&
                reader.readU64(fourth));
    EXPECT_EQ(first, 1U);
    EXPECT_EQ(second, 2U);
    EXPECT_EQ(third, 3U);
    EXPECT_EQ(fourth, 0x8000000000000004U);
    EXPECT_EQ(reader.left(), 0U);
}

TEST(ByteReader, ExtremeIntegers) {
    const std::array<std::uint8_t, 16> bytes{0xff, 0xff, 0xff, 0xff, 0xff, 0xff, 0xff, 0xff};
    base::ByteReader reader(bytes);
    std::uint64_t value = 1;
    ASSERT_TRUE(reader.readU64(value));
    EXPECT_EQ(value, UINT64_MAX);
    ASSERT_TRUE(reader.readU64(value));
    EXPECT_EQ(value, 0U);
}

TEST(ByteReader, BytesThatFitExactly) {
    base::ByteReader reader(kBytes);
    std::array<std::uint8_t, 8> out{};
    EXPECT_TRUE(reader.readBytes(out.data(), out.size()));
    EXPECT_EQ(out, kBytes);
    EXPECT_EQ(reader.left(), 0U);
}

TEST(ByteReader, OneByteMoreThanThereIs) {
    base::ByteReader reader(kBytes);
    std::array<std::uint8_t, 9> out{};
    EXPECT_FALSE(reader.readBytes(out.data(), 9));
    EXPECT_EQ(out, (std::array<std::uint8_t, 9>{}));
    std::span<const std::uint8_t> span;
    EXPECT_FALSE(reader.readSpan(span, 9));
    EXPECT_EQ(span.data(), nullptr);
    std::string_view text = "kept";
    EXPECT_FALSE(reader.readText(text, 9));
    EXPECT_EQ(text, "kept");
    EXPECT_FALSE(reader.skip(9));
    EXPECT_EQ(reader.left(), 8U);
}

TEST(ByteReader, LengthsThatWouldWrapAnAddition) {
    base::ByteReader reader(kBytes);
    ASSERT_TRUE(reader.skip(4));
    std::span<const std::uint8_t> span;
    std::string_view text;
    std::uint8_t out = 0;
    for (const std::size_t length : {SIZE_MAX, SIZE_MAX - 3, SIZE_MAX - 7, SIZE_MAX / 2}) {
        EXPECT_FALSE(reader.readBytes(&out, length));
        EXPECT_FALSE(reader.readSpan(span, length));
        EXPECT_FALSE(reader.readText(text, length));
        EXPECT_FALSE(reader.skip(length));
    }
    EXPECT_EQ(reader.left(), 4U);
}

TEST(ByteReader, NullOfLengthZero) {
    base::ByteReader reader(nullptr, 0);
    std::span<const std::uint8_t> span = kBytes;
    std::string_view text = "replaced";
    std::uint8_t byte = 0x5a;
    EXPECT_TRUE(reader.readBytes(nullptr, 0));
    EXPECT_TRUE(reader.readSpan(span, 0));
    EXPECT_TRUE(span.empty());
    EXPECT_TRUE(reader.readText(text, 0));
    EXPECT_TRUE(text.empty());
    EXPECT_TRUE(reader.skip(0));
    EXPECT_FALSE(reader.skip(1));
    EXPECT_FALSE(reader.readU8(byte));
    EXPECT_EQ(byte, 0x5a);
    EXPECT_TRUE(reader.rest().empty());
}

TEST(ByteReader, NothingIsReadToNull) {
    base::ByteReader reader(kBytes);
    EXPECT_TRUE(reader.readBytes(nullptr, 0));
    EXPECT_EQ(reader.left(), 8U);
}

TEST(ByteReader, SpansAndTextsPointIntoTheBuffer) {
    base::ByteReader reader(kBytes);
    std::span<const std::uint8_t> span;
    std::string_view text;
    ASSERT_TRUE(reader.readSpan(span, 3));
    ASSERT_TRUE(reader.readText(text, 2));
    EXPECT_EQ(span.data(), kBytes.data());
    EXPECT_EQ(span.size(), 3U);
    EXPECT_EQ(static_cast<const void*>(text.data()), kBytes.data() + 3);
    EXPECT_EQ(text, "\xc4\xb5");
    EXPECT_EQ(reader.rest().data(), kBytes.data() + 5);
    EXPECT_EQ(reader.rest().size(), 3U);
}

TEST(ByteReader, ReadsOnAfterARefusal) {
    base::ByteReader reader(kBytes.data(), 3);
    std::uint32_t tooWide = 0;
    std::uint16_t value = 0;
    std::uint8_t last = 0;
    EXPECT_FALSE(reader.readU32(tooWide));
    EXPECT_TRUE(reader.readU16(value));
    EXPECT_EQ(value, 0xe2f1U);
    EXPECT_TRUE(reader.readU8(last));
    EXPECT_EQ(last, 0xd3U);
    EXPECT_FALSE(reader.readU8(last));
}
