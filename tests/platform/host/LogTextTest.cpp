#include "platform/host/LogText.h"

#include <gtest/gtest.h>

#include <cstdio>
#include <string>

namespace {

using platform::printableLine;

TEST(LogTextTest, PlainTextStaysAsItIs) {
    EXPECT_EQ(printableLine("kstd: main: Entering the main runloop."),
              "kstd: main: Entering the main runloop.");
}

TEST(LogTextTest, EmptyTextIsAnEmptyLine) {
    EXPECT_EQ(printableLine(""), "");
    EXPECT_EQ(printableLine("\n"), "");
}

TEST(LogTextTest, OneNewlineAtTheEndIsDropped) {
    EXPECT_EQ(printableLine("text\n"), "text");
}

TEST(LogTextTest, OtherNewlinesAreShown) {
    EXPECT_EQ(printableLine("text\n\n"), "text\\n");
    EXPECT_EQ(printableLine("first\nsecond\n"), "first\\nsecond");
    EXPECT_EQ(printableLine("\ntext"), "\\ntext");
}

TEST(LogTextTest, OnlyTheFinalNewlineOfALineEndIsDropped) {
    EXPECT_EQ(printableLine("text\r\n"), "text\\r");
}

TEST(LogTextTest, EachControlCharacterIsShown) {
    for (int code = 0; code < 0x20; ++code) {
        const char character = static_cast<char>(code);
        std::string expected;
        switch (character) {
        case '\n':
            expected = "\\n";
            break;
        case '\r':
            expected = "\\r";
            break;
        case '\t':
            expected = "\\t";
            break;
        default: {
            constexpr char kDigits[] = "0123456789abcdef";
            expected = std::string("\\x") + kDigits[code / 16] + kDigits[code % 16];
        }
        }
        EXPECT_EQ(printableLine(std::string("a") + character + "b"), "a" + expected + "b") << code;
    }
    EXPECT_EQ(printableLine("a\x7f"), "a\\x7f");
}

TEST(LogTextTest, NeighboursOfControlCharactersStayAsTheyAre) {
    EXPECT_EQ(printableLine(" ~"), " ~");
}

TEST(LogTextTest, CharactersBeyondAsciiStayAsTheyAre) {
    EXPECT_EQ(printableLine("Schl\xc3\xbcssel \xf0\x9f\x94\x91"),
              "Schl\xc3\xbcssel \xf0\x9f\x94\x91");
}

std::string utf8(unsigned character) {
    const auto rest = [character](unsigned shift) {
        return static_cast<char>(0x80U | ((character >> shift) & 0x3fU));
    };
    if (character < 0x800) {
        return {static_cast<char>(0xc0U | (character >> 6U)), rest(0)};
    }
    return {static_cast<char>(0xe0U | (character >> 12U)), rest(6), rest(0)};
}

struct Range {
    unsigned first;
    unsigned last;
};

TEST(LogTextTest, WhatDeceivesAReaderIsShown) {
    for (const Range range :
         {Range{0x80, 0x9f}, Range{0x2028, 0x2029}, Range{0x202a, 0x202e}, Range{0x2066, 0x2069}}) {
        for (unsigned character = range.first; character <= range.last; ++character) {
            char expected[16];
            std::snprintf(expected, sizeof expected, "a\\u{%x}b", character);
            EXPECT_EQ(printableLine("a" + utf8(character) + "b"), expected);
        }
    }
}

TEST(LogTextTest, NeighboursOfWhatDeceivesStayAsTheyAre) {
    for (const unsigned character : {0xa0U, 0x2027U, 0x202fU, 0x2065U, 0x206aU}) {
        EXPECT_EQ(printableLine(utf8(character)), utf8(character)) << character;
    }
}

TEST(LogTextTest, BytesThatAreNoCharacterAreShown) {
    EXPECT_EQ(printableLine("a\x80\xff"), "a\\x80\\xff");
    // Cut short, longer than need be, a surrogate, and beyond the last character.
    EXPECT_EQ(printableLine("\xe2\x80"), "\\xe2\\x80");
    EXPECT_EQ(printableLine("\xc0\x8a"), "\\xc0\\x8a");
    EXPECT_EQ(printableLine("\xed\xa0\x80"), "\\xed\\xa0\\x80");
    EXPECT_EQ(printableLine("\xf4\x90\x80\x80"), "\\xf4\\x90\\x80\\x80");
}

TEST(LogTextTest, NoTextOutgrowsItsRoom) {
    std::string every;
    for (int byte = 0; byte < 0x100; ++byte) {
        every += static_cast<char>(byte);
    }
    for (unsigned character = 0x80; character < 0x3000; ++character) {
        every += utf8(character);
    }
    for (std::size_t at = 0; at + 4 < every.size(); ++at) {
        for (std::size_t size = 1; size <= 4; ++size) {
            char room[4 * platform::kLogTextGrowth + 1] = {};
            const char* const end =
                platform::showLogText(std::string_view(every).substr(at, size), room);
            ASSERT_LE(static_cast<std::size_t>(end - room), size * platform::kLogTextGrowth);
        }
    }
}

} // namespace
