#include "kstd/Analytics/SQLite/DatabaseTexts.h"

#include <gtest/gtest.h>

#include <cmath>
#include <cstdio>
#include <limits>
#include <vector>

namespace kstd {
namespace {

using Doubles = std::numeric_limits<double>;
using Floats = std::numeric_limits<float>;

TEST(FixedText, HasSixDecimals) {
    EXPECT_EQ(fixedText(0), "0.000000");
    EXPECT_EQ(fixedText(-0.0), "-0.000000");
    EXPECT_EQ(fixedText(1), "1.000000");
    EXPECT_EQ(fixedText(-2.75), "-2.750000");
    EXPECT_EQ(fixedText(700000000.1234567), "700000000.123457");
    EXPECT_EQ(fixedText(0.0000004), "0.000000");
    EXPECT_EQ(fixedText(0.9999996), "1.000000");
}

TEST(FixedText, BeyondTheFiniteAreWords) {
    EXPECT_EQ(fixedText(Doubles::infinity()), "inf");
    EXPECT_EQ(fixedText(-Doubles::infinity()), "-inf");
    EXPECT_EQ(fixedText(Doubles::quiet_NaN()), "nan");
    EXPECT_EQ(fixedText(std::copysign(Doubles::quiet_NaN(), -1.0)), "nan");
}

// The tests run in the C locale.
TEST(FixedText, AgreesWithTheCLibraryOverTheWholeRange) {
    std::vector<double> numbers = {Doubles::max(),        Doubles::lowest(), Doubles::min(),
                                   Doubles::denorm_min(), 0.0000005,         0.0000015,
                                   123456789.0000005};
    for (int exponent = -1074; exponent < 1024; exponent += 7) {
        numbers.push_back(-std::ldexp(1.3125, exponent));
    }
    for (const double number : numbers) {
        char expected[400];
        std::snprintf(expected, sizeof(expected), "%f", number);
        EXPECT_EQ(fixedText(number), expected);
    }
}

struct Reading {
    std::string_view text;
    float number;
};

void expectNumbers(const std::vector<Reading>& readings) {
    for (const Reading& reading : readings) {
        SCOPED_TRACE(reading.text);
        EXPECT_EQ(leadingFloat(reading.text), reading.number);
    }
}

TEST(LeadingFloat, DecimalNumbersInEveryForm) {
    expectNumbers({
        {"0", 0},
        {"12", 12},
        {"-12", -12},
        {"+12", 12},
        {"2.75", 2.75F},
        {".5", 0.5F},
        {"-.5", -0.5F},
        {"+.5", 0.5F},
        {"5.", 5},
        {"1e3", 1000},
        {"1E3", 1000},
        {"1e+3", 1000},
        {"25e-2", 0.25F},
        {"007", 7},
    });
}

TEST(LeadingFloat, WhatFollowsIsIgnored) {
    expectNumbers({
        {"12 34", 12},
        {"12,5", 12},
        {"1.2.3", 1.2F},
        {"1e", 1},
        {"1e+", 1},
        {"1ex", 1},
        {"0x10", 0},
        {"12abc", 12},
        {std::string_view("12\0005", 4), 12},
    });
}

TEST(LeadingFloat, BlanksBeforeTheNumberAreSkipped) {
    expectNumbers({{" \t\n\v\f\r12", 12}, {"  -1", -1}, {" +1", 1}});
}

TEST(LeadingFloat, EverythingElseIsZero) {
    expectNumbers({
        {"", 0},
        {" ", 0},
        {"abc", 0},
        {"-", 0},
        {"+", 0},
        {"+-1", 0},
        {"-+1", 0},
        {"++1", 0},
        {"- 1", 0},
        {".", 0},
        {"e5", 0},
        {",5", 0},
        {"\xc2\xa0"
         "1",
         0},
        {std::string_view("\0001", 2), 0},
    });
}

TEST(LeadingFloat, WhatIsNotFiniteIsZero) {
    expectNumbers({
        {"inf", 0},
        {"-infinity", 0},
        {"nan", 0},
        {"+inf", 0},
        {"1e39", 0},
        {"-1e39", 0},
        {"1e999999999", 0},
        {"3.5e38", 0},
        {"3.4028235e38", Floats::max()},
        {"-3.4028235e38", Floats::lowest()},
    });
}

TEST(LeadingFloat, HoldsThirtyTwoBits) {
    // Steps of 64 from 2^29 to 2^30.
    expectNumbers({
        {"700000000.000000", 700000000.0F},
        {"700000031.000000", 700000000.0F},
        {"700000033.000000", 700000064.0F},
        {"16777217", 16777216.0F},
        {"1e-46", 0},
    });
}

TEST(LeadingFloat, ReadsWhatFixedTextWrites) {
    for (const double number : {0.0, 1.5, -700000000.25, 1e30}) {
        EXPECT_EQ(leadingFloat(fixedText(number)), static_cast<float>(number));
    }
}

} // namespace
} // namespace kstd
