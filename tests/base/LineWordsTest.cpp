#include "base/LineWords.h"

#include <gtest/gtest.h>

#include <cstdint>
#include <string>
#include <vector>

namespace base {
namespace {

TEST(LineWordsTest, WordsNumbersAndBytesInTheirOrder) {
    LineWords words("device 255 - 00ff6b - x");
    EXPECT_EQ(words.word(), "device");
    EXPECT_EQ(words.number<std::uint8_t>(), 255);
    EXPECT_EQ(words.wordOrNothing(), "");
    EXPECT_EQ(words.bytes(), std::string("\x00\xffk", 3));
    EXPECT_EQ(words.bytes(), "");
    EXPECT_FALSE(words.isDone());
    EXPECT_EQ(words.wordOrNothing(), "x");
    EXPECT_TRUE(words.isDone());
}

TEST(LineWordsTest, WhatIsMissingOrTooMuchSpoilsTheLine) {
    for (const char* const line : {"", "a", "a b ", "a  b", " a b", "a b c"}) {
        LineWords words(line);
        words.word();
        words.word();
        EXPECT_FALSE(words.isDone()) << '"' << line << '"';
    }
}

TEST(LineWordsTest, OneSpoiltWordIsEnough) {
    LineWords words("256 7");
    EXPECT_EQ(words.number<std::uint8_t>(), 0);
    EXPECT_EQ(words.number<std::uint8_t>(), 7);
    EXPECT_FALSE(words.isDone());

    LineWords checked("a");
    EXPECT_EQ(checked.word(), "a");
    checked.require(false);
    checked.require(true);
    EXPECT_FALSE(checked.isDone());
}

TEST(LineWordsTest, BytesAreDigitsInPairs) {
    for (const char* const line : {"0", "0g", "g0", "000", "--", "0x"}) {
        LineWords words(line);
        words.bytes();
        EXPECT_FALSE(words.isDone()) << line;
    }
}

TEST(LineWordsTest, HexWordIsReadBack) {
    for (const std::string& bytes :
         {std::string(), std::string("-"), std::string("a \n\0\xff", 5)}) {
        const std::string line = hexWord(bytes);
        LineWords words(line);
        EXPECT_EQ(words.bytes(), bytes);
        EXPECT_TRUE(words.isDone());
    }
    EXPECT_EQ(hexWord(""), "-");
}

TEST(LineWordsTest, LinesEndWithANewline) {
    EXPECT_EQ(linesOf(""), std::vector<std::string_view>());
    EXPECT_EQ(linesOf("a b\n\nc\n"), (std::vector<std::string_view>{"a b", "", "c"}));
    EXPECT_EQ(linesOf("a\nb"), std::nullopt);
}

} // namespace
} // namespace base
