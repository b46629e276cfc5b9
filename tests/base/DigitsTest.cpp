#include "base/Digits.h"

#include <gtest/gtest.h>

#include <array>

namespace base {

namespace {

TEST(DigitsTest, NumbersHaveToBeWholeAndInRange) {
    for (const char* text : {"", "-1", "256", "1x", "0x1", " 1", "+1"}) {
        EXPECT_FALSE(parseNumber<std::uint8_t>(text)) << text;
    }
    EXPECT_EQ(parseNumber<std::uint8_t>("255"), 255);
    EXPECT_EQ(parseNumber<std::int32_t>("-2147483648"), -2147483647 - 1);
}

TEST(DigitsTest, HexDigitsOfBothCasesHaveTheirValue) {
    constexpr std::string_view kLower = "0123456789abcdef";
    constexpr std::string_view kUpper = "0123456789ABCDEF";
    for (std::size_t i = 0; i < kLower.size(); ++i) {
        EXPECT_EQ(hexDigitValue(kLower[i]), i);
        EXPECT_EQ(hexDigitValue(kUpper[i]), i);
    }
    for (const char other : {'/', ':', '@', 'G', '`', 'g', ' ', '\0', '\xff'}) {
        EXPECT_FALSE(hexDigitValue(other)) << other;
    }
}

TEST(DigitsTest, BytesAreTwoLowerCaseDigitsEach) {
    EXPECT_EQ(hexDigits(std::array<std::uint8_t, 3>{0x00, 0x9a, 0xff}), "009aff");
    EXPECT_EQ(hexDigits({}), "");
}

} // namespace

} // namespace base
