#include "kstctl/Forms.h"

#include <gtest/gtest.h>

namespace kstctl {
namespace {

TEST(TerminalTextTest, WhatAnyTextIsShownAs) {
    const std::pair<std::string, std::string> kTexts[] = {
        {"", ""},
        {"plain text, äöü, 日本, 🙂", "plain text, äöü, 日本, 🙂"},
        {"a\nb\rc\td", "a\\nb\\rc\\td"},
        {std::string("\0\x01\x1f \x7f~", 6), "\\x00\\x01\\x1f \\x7f~"},
        {"\x1b[31mred", "\\x1b[31mred"},
        {"\xc2\x9b"
         "31m",
         "\\u{9b}31m"},
        {"\xc2\x80\xc2\xa0", "\\u{80}\xc2\xa0"},
        {"C:\\x1b", "C:\\\\x1b"},
        {"a\xe2\x80\xae"
         "b",
         "a\\u{202e}b"},
        {"\xe2\x80\x8b\xe2\x80\xa8\xef\xbb\xbf", "\\u{200b}\\u{2028}\\u{feff}"},
        {"\xf3\xa0\x81\x81", "\\u{e0041}"},
        // No part of UTF-8: a stray byte, one cut short, one too long, a surrogate.
        {"\xff", "\\xff"},
        {"a\xc3", "a\\xc3"},
        {"\xc0\x8a", "\\xc0\\x8a"},
        {"\xed\xa0\x80", "\\xed\\xa0\\x80"},
    };
    for (const auto& [text, shown] : kTexts) {
        EXPECT_EQ(printable(text), shown);
    }
}

TEST(TerminalTextTest, JSONStaysJSON) {
    EXPECT_EQ(printableJSON(R"({"a":"b\\c\n"})"), R"({"a":"b\\c\n"})");
    EXPECT_EQ(printableJSON("\"\x7f\xc2\x9b\xe2\x80\xae\""), R"("\u007f\u009b\u202e")");
    EXPECT_EQ(printableJSON("\"\xf3\xa0\x81\x81\""), R"("\udb40\udc41")");
    EXPECT_EQ(printableJSON("\"ä🙂\""), "\"ä🙂\"");
}

TEST(TerminalTextTest, CharactersAreCountedNotBytes) {
    EXPECT_EQ(characterCount(""), 0U);
    EXPECT_EQ(characterCount("abc"), 3U);
    EXPECT_EQ(characterCount("äö🙂"), 3U);
}

} // namespace
} // namespace kstctl
