#include "kstd/Analytics/SQLite/DatabaseTexts.h"

#include <gtest/gtest.h>

#include <limits>
#include <vector>

namespace kstd {
namespace {

constexpr auto kInt32Max = std::numeric_limits<std::int32_t>::max();
constexpr auto kInt64Max = std::numeric_limits<std::int64_t>::max();
constexpr auto kInt64Min = std::numeric_limits<std::int64_t>::min();
constexpr auto kUInt32Max = std::numeric_limits<std::uint32_t>::max();
constexpr auto kUInt64Max = std::numeric_limits<std::uint64_t>::max();
constexpr double kInfinity = std::numeric_limits<double>::infinity();

struct Case {
    std::string_view format;
    std::vector<FormatArgument> arguments;
    std::string_view text;
};

void expectTexts(const std::vector<Case>& cases) {
    for (const Case& given : cases) {
        SCOPED_TRACE(given.format);
        EXPECT_EQ(formatText(given.format, given.arguments), given.text);
    }
}

TEST(FormatText, TextWithoutConversionsStays) {
    expectTexts({{"", {}, ""}, {"begin exclusive", {}, "begin exclusive"}, {"a", {"b"}, "a"}});
}

TEST(FormatText, EveryKindIsAnObject) {
    expectTexts({
        {"drop table %@", {"Properties"}, "drop table Properties"},
        {"%@%@", {"a", std::string_view("b\0c", 3)}, std::string_view("ab\0c", 4)},
        {"<%@>", {""}, "<>"},
        {"%@", {-5}, "-5"},
        {"%@", {kInt64Min}, "-9223372036854775808"},
        {"%@", {kUInt64Max}, "18446744073709551615"},
        {"%@", {std::int8_t{65}}, "65"},
        {"%@", {std::uint8_t{65}}, "65"},
        {"%@", {2.75}, "2.75"},
        {"%@", {0.1F}, "0.10000000149011612"},
        {"%@", {2.0}, "2"},
        {"%@", {-1.7976931348623157e308}, "-1.7976931348623157e+308"},
    });
}

TEST(FormatText, IntegersAreReducedToTheirConversion) {
    expectTexts({
        {"%d %i", {1, -1}, "1 -1"},
        {"%d", {kInt32Max}, "2147483647"},
        {"%d", {std::int64_t{kInt32Max} + 1}, "-2147483648"},
        {"%d", {kUInt32Max}, "-1"},
        {"%u", {-1}, "4294967295"},
        {"%u", {std::int64_t{kUInt32Max} + 1}, "0"},
        {"%x %x", {14, -1}, "e ffffffff"},
        {"%ld %li", {kInt64Min, kInt64Max}, "-9223372036854775808 9223372036854775807"},
        {"%ld", {kUInt64Max}, "-1"},
        {"%lu", {-1}, "18446744073709551615"},
        {"%lx", {-1}, "ffffffffffffffff"},
        {"%lld %lli", {kInt64Min, 2}, "-9223372036854775808 2"},
        {"%llu %llx", {kUInt64Max, 255U}, "18446744073709551615 ff"},
        {"rc=%d(0x%x)", {14, 14}, "rc=14(0xe)"},
    });
}

TEST(FormatText, RealsHaveSixDecimals) {
    expectTexts(
        {{"%f", {2.75}, "2.750000"}, {"%f", {1.5F}, "1.500000"}, {"%f", {-kInfinity}, "-inf"}});
}

TEST(FormatText, ArgumentsAreNeverInterpreted) {
    expectTexts({
        {"%@ %@", {"%@ %s %n %", "x"}, "%@ %s %n % x"},
        {"%s", {"%%"}, "%%"},
        {"%@", {"'; drop table t"}, "'; drop table t"},
    });
}

TEST(FormatText, PercentSignsNeedNoArgument) {
    expectTexts({{"100%%", {}, "100%"}, {"%%%@%%", {"a"}, "%a%"}, {"%%d", {1}, "%d"}});
}

TEST(FormatText, AConversionWithoutAnArgumentStays) {
    expectTexts({
        {"%@", {}, "%@"},
        {"%d, %ld, %f, %s", {1}, "1, %ld, %f, %s"},
    });
}

TEST(FormatText, AnArgumentOfAnotherKindIsUsedUpAndNotWritten) {
    expectTexts({
        {"%d %@", {"text", "next"}, "%d next"},
        {"%lx %@", {2.5, "next"}, "%lx next"},
        {"%s %@", {1, "next"}, "%s next"},
        {"%f %@", {1, "next"}, "%f next"},
        {"%f %@", {"text", "next"}, "%f next"},
    });
}

TEST(FormatText, AnUnknownConversionStaysAndUsesNothingUp) {
    expectTexts({
        {"%", {1}, "%"},
        {"%l", {1}, "%l"},
        {"%ll", {1}, "%ll"},
        {"%llld %d", {1}, "%llld 1"},
        {"%n %5d %l@ %d", {1}, "%n %5d %l@ 1"},
        {"%.2f %lf %f", {1.5}, "%.2f %lf 1.500000"},
        {"% %d", {7}, "% 7"},
        {"%l%d", {7}, "%l7"},
    });
}

TEST(FormatText, ArgumentsMayBeWrittenInPlace) {
    const std::string name = "events";
    EXPECT_EQ(formatText("%@ %d %@", {name, 3U, 0.5}), "events 3 0.5");
    EXPECT_EQ(formatText("%@", {}), "%@");
}

} // namespace
} // namespace kstd
