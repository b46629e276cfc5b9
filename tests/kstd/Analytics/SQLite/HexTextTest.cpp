#include "kstd/Analytics/SQLite/DatabaseTexts.h"

#include <gtest/gtest.h>

#include <cstddef>

namespace kstd {
namespace {

using platform::Bytes;

Bytes counting(std::size_t size) {
    Bytes bytes(size);
    for (std::size_t i = 0; i < size; ++i) {
        bytes[i] = static_cast<std::uint8_t>(i);
    }
    return bytes;
}

TEST(HexText, ABlankStandsBetweenGroupsOfFourBytes) {
    const std::string texts[] = {
        "",
        "00",
        "0001",
        "000102",
        "00010203",
        "00010203 04",
        "00010203 0405",
        "00010203 040506",
        "00010203 04050607",
        "00010203 04050607 08",
    };
    for (std::size_t size = 0; size < std::size(texts); ++size) {
        EXPECT_EQ(RXHexString(counting(size)), texts[size]);
    }
    EXPECT_EQ(RXHexString(counting(8)).size(), 17U);
    EXPECT_EQ(RXHexString(counting(9)).size(), 20U);
}

TEST(HexText, TheHighNibbleComesFirst) {
    const Bytes bytes = {0x0f, 0xf0, 0x9a, 0xbc, 0xde, 0xff, 0x00};
    EXPECT_EQ(RXHexString(bytes), "0ff09abc deff00");
    EXPECT_EQ(RXLowercaseHexStringWithoutSpaces(bytes), "0ff09abcdeff00");
    EXPECT_EQ(RXUppercaseHexStringWithoutSpaces(bytes), "0FF09ABCDEFF00");
    EXPECT_EQ(RXLowercaseHexStringWithoutSpaces({}), "");
    EXPECT_EQ(RXUppercaseHexStringWithoutSpaces({}), "");
}

TEST(HexText, EveryByteComesBackFromEveryForm) {
    const Bytes bytes = counting(256);
    EXPECT_EQ(RXDataWithHexString(RXHexString(bytes)), bytes);
    EXPECT_EQ(RXDataWithHexString(RXLowercaseHexStringWithoutSpaces(bytes)), bytes);
    EXPECT_EQ(RXDataWithHexString(RXUppercaseHexStringWithoutSpaces(bytes), true), bytes);
}

TEST(HexText, OnlyDigitsOfTheChosenCaseAreRead) {
    struct Case {
        std::string_view text;
        Bytes lowercase;
        Bytes uppercase;
    };
    const Case cases[] = {
        {"", {}, {}},
        {"1", {}, {}},
        {"12", {0x12}, {0x12}},
        {"123", {0x12}, {0x12}},
        {"ab", {0xab}, {}},
        {"AB", {}, {0xab}},
        {"aB1C2d", {0xa1, 0x2d}, {0xb1, 0xc2}},
        {" 1 2\t3,4\n", {0x12, 0x34}, {0x12, 0x34}},
        {"0x1g/:@`f0", {0x01, 0xf0}, {0x01}},
        {std::string_view("1\0002", 3), {0x12}, {0x12}},
        {"\xff\x80z-", {}, {}},
    };
    for (const Case& given : cases) {
        SCOPED_TRACE(given.text);
        EXPECT_EQ(RXDataWithHexString(given.text), given.lowercase);
        EXPECT_EQ(RXDataWithHexString(given.text, true), given.uppercase);
    }
}

} // namespace
} // namespace kstd
