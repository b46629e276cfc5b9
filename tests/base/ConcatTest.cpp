#include "base/Concat.h"

#include <gtest/gtest.h>

#include <cstdint>
#include <limits>

namespace {

using base::concat;
using base::Hex;

enum Unscoped { kMinusThree = -3 };

template <typename Part>
concept CanBeAppended = requires(std::string& text, Part part) {
    base::append(text, part);
};

} // namespace

TEST(Concat, NothingIsEmpty) {
    EXPECT_EQ(concat(), "");
    EXPECT_EQ(concat("", std::string(), std::string_view()), "");
}

TEST(Concat, TextsAndCharacters) {
    EXPECT_EQ(concat("a", std::string("b"), std::string_view("c"), 'd'), "abcd");
    EXPECT_EQ(concat(std::string_view("zero\0inside", 11)).size(), 11U);
}

TEST(Concat, IntegersAtTheirEnds) {
    EXPECT_EQ(concat(0), "0");
    EXPECT_EQ(concat(-1, ' ', 1U), "-1 1");
    EXPECT_EQ(concat(std::numeric_limits<std::int32_t>::min()), "-2147483648");
    EXPECT_EQ(concat(std::numeric_limits<std::int64_t>::min()), "-9223372036854775808");
    EXPECT_EQ(concat(std::numeric_limits<std::int64_t>::max()), "9223372036854775807");
    EXPECT_EQ(concat(std::numeric_limits<std::uint64_t>::max()), "18446744073709551615");
}

TEST(Concat, SmallIntegersAreNumbersNotCharacters) {
    EXPECT_EQ(concat(std::uint8_t{65}, ' ', std::int8_t{-65}), "65 -65");
}

TEST(Concat, HexadecimalIsLowerCaseWithoutPrefix) {
    EXPECT_EQ(concat(Hex{0}), "0");
    EXPECT_EQ(concat("0x", Hex{0xABCDEF}), "0xabcdef");
    EXPECT_EQ(concat(Hex{std::numeric_limits<std::uint64_t>::max()}), "ffffffffffffffff");
    EXPECT_EQ(concat(Hex{static_cast<std::uint64_t>(std::int64_t{-5})}), "fffffffffffffffb");
}

// Each of these once became one character, through a conversion to char.
TEST(Concat, WhatIsNoTextAndNoIntegerDoesNotCompile) {
    EXPECT_FALSE(CanBeAppended<bool>);
    EXPECT_FALSE(CanBeAppended<double>);
    EXPECT_FALSE(CanBeAppended<Unscoped>);
    EXPECT_TRUE(CanBeAppended<char>);
    EXPECT_TRUE(CanBeAppended<std::uint8_t>);
    EXPECT_EQ(concat(static_cast<int>(kMinusThree)), "-3");
}

TEST(BoundedText, TakesWhatItHasRoomFor) {
    base::BoundedText<6> text;
    EXPECT_EQ(text.view(), "");
    base::append(text, "ab");
    base::append(text, 12);
    base::append(text, 'c');
    EXPECT_EQ(text.view(), "ab12c");
    base::append(text, "de");
    EXPECT_EQ(text.view(), "ab12cd");
    base::append(text, 'e');
    base::append(text, Hex{255});
    base::append(text, "");
    EXPECT_EQ(text.view(), "ab12cd");
}
