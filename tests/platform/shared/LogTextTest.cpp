#include "platform/shared/LogText.h"

#include <gtest/gtest.h>

#include <string>

namespace {

using platform::logLine;

TEST(LogTextTest, PlainTextStaysAsItIs) {
    EXPECT_EQ(logLine("kstd: main: Entering the main runloop."),
              "kstd: main: Entering the main runloop.");
}

TEST(LogTextTest, EmptyTextIsAnEmptyLine) {
    EXPECT_EQ(logLine(""), "");
    EXPECT_EQ(logLine("\n"), "");
}

TEST(LogTextTest, OneNewlineAtTheEndIsDropped) {
    EXPECT_EQ(logLine("text\n"), "text");
}

TEST(LogTextTest, OtherNewlinesAreShown) {
    EXPECT_EQ(logLine("text\n\n"), "text\\n");
    EXPECT_EQ(logLine("first\nsecond\n"), "first\\nsecond");
    EXPECT_EQ(logLine("\ntext"), "\\ntext");
}

TEST(LogTextTest, OnlyTheFinalNewlineOfALineEndIsDropped) {
    EXPECT_EQ(logLine("text\r\n"), "text\\r");
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
        EXPECT_EQ(logLine(std::string("a") + character + "b"), "a" + expected + "b") << code;
    }
    EXPECT_EQ(logLine("a\x7f"), "a\\x7f");
}

TEST(LogTextTest, NeighboursOfControlCharactersStayAsTheyAre) {
    EXPECT_EQ(logLine(" ~"), " ~");
}

TEST(LogTextTest, CharactersBeyondAsciiStayAsTheyAre) {
    EXPECT_EQ(logLine("Schl\xc3\xbcssel \x80\xff"), "Schl\xc3\xbcssel \x80\xff");
}

} // namespace
