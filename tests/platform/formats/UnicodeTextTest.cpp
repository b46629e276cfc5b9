#include "platform/formats/UnicodeText.h"

#include "tests/platform/formats/PropertyListBytes.h"

#include <gtest/gtest.h>

namespace {

using platform::Bytes;
using support::fromHex;

std::string text(std::string_view hex) {
    const Bytes bytes = fromHex(hex);
    return {bytes.begin(), bytes.end()};
}

/// UTF-16 of one text against its UTF-8.
struct Pair {
    std::string_view utf8;
    std::string_view utf16;
};

const std::vector<Pair> kPairs = {
    {"", ""},
    {"01", "0001"},
    {"7f", "007f"},
    {"c280", "0080"},
    {"dfbf", "07ff"},
    {"e0a080", "0800"},
    {"ed9fbf", "d7ff"},
    {"ee8080", "e000"},
    {"efbfbf", "ffff"},
    {"f0908080", "d800dc00"},
    {"f09f9880", "d83dde00"},
    {"f1808080", "d8c0dc00"},
    {"f2808080", "d9c0dc00"},
    {"f3808080", "dac0dc00"},
    {"f48fbfbf", "dbffdfff"},
    {"61 c3a9 f09f9880 62", "0061 00e9 d83dde00 0062"},
};

TEST(UnicodeTextTest, BothFormsOfATextBelongTogether) {
    for (const auto& [utf8, utf16] : kPairs) {
        SCOPED_TRACE(utf8);
        EXPECT_EQ(platform::countUTF16(text(utf8)), fromHex(utf16).size() / 2);
        std::string converted = "before";
        EXPECT_TRUE(platform::appendUTF8(fromHex(utf16), converted));
        EXPECT_EQ(converted, "before" + text(utf8));
    }
}

TEST(UnicodeTextTest, WhatIsNotUTF8IsNotCounted) {
    for (const std::string_view hex :
         {"80",       "bf",       "c0",       "c080",     "c1bf",     "c3",       "c328",
          "c3c3",     "e0a0",     "e08080",   "e09fbf",   "e282",     "e28228",   "eda080",
          "edbfbf",   "f0",       "f09f98",   "f0808080", "f08fbfbf", "f09f9828", "f4908080",
          "f5808080", "f8888080", "f8908080", "fc",       "fe",       "ff",       "61ff",
          "00",       "6100",     "c3a900"}) {
        EXPECT_FALSE(platform::countUTF16(text(hex))) << hex;
        EXPECT_FALSE(platform::isUTF8WithoutNUL(text(hex))) << hex;
    }
    EXPECT_TRUE(platform::isUTF8WithoutNUL(""));
    EXPECT_TRUE(platform::isUTF8WithoutNUL("plain"));
    EXPECT_TRUE(platform::isUTF8WithoutNUL(text("c3a9")));
}

TEST(UnicodeTextTest, WhatIsNotUTF16IsNotConverted) {
    for (const std::string_view hex : {"0000", "00610000", "d800", "dbff", "d8000061", "d800d800",
                                       "dc00", "dfff", "0061dc00", "d83dde00dc00", "d83d0000"}) {
        std::string converted;
        EXPECT_FALSE(platform::appendUTF8(fromHex(hex), converted)) << hex;
    }
}

TEST(UnicodeTextTest, OddLastByteIsLeftOut) {
    std::string converted;
    EXPECT_TRUE(platform::appendUTF8(fromHex("006162"), converted));
    EXPECT_EQ(converted, "a");
    EXPECT_TRUE(platform::appendUTF8(fromHex("61"), converted));
    EXPECT_EQ(converted, "a");
}

TEST(UnicodeTextTest, PlainASCIIIsFoundAtEveryLengthAndPlace) {
    for (std::size_t size = 0; size <= 33; ++size) {
        for (const char good : {'\x01', '\x20', '\x7f'}) {
            EXPECT_TRUE(platform::isPlainASCII(std::string(size, good))) << size;
        }
        for (std::size_t at = 0; at < size; ++at) {
            for (const char bad : {'\0', '\x80', '\xff'}) {
                std::string spoilt(size, '\x01');
                spoilt[at] = bad;
                EXPECT_FALSE(platform::isPlainASCII(spoilt)) << size << ' ' << at;
            }
        }
    }
}

TEST(UnicodeTextTest, TakesOneCharacterAtATime) {
    const std::string whole = text("61 c3a9 f09f9880 ff 62");
    std::string_view rest = whole;
    EXPECT_EQ(platform::takeUTF8(rest), U'a');
    EXPECT_EQ(platform::takeUTF8(rest), U'\u00e9');
    EXPECT_EQ(platform::takeUTF8(rest), U'\U0001f600');
    EXPECT_EQ(platform::takeUTF8(rest), std::nullopt);
    EXPECT_EQ(rest, text("ff62"));
    rest = {};
    EXPECT_EQ(platform::takeUTF8(rest), std::nullopt);
}

} // namespace
