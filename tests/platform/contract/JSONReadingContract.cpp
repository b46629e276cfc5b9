#include "base/Concat.h"
#include "tests/platform/contract/JSONContract.h"

#include <gtest/gtest.h>

#include <cmath>
#include <cstdint>
#include <limits>
#include <utility>
#include <vector>

namespace contract {

namespace {

using platform::kMaxJSONDepth;
using platform::kMaxJSONSize;
using platform::Null;
using platform::Value;
using platform::ValueList;
using platform::ValueMap;

using Cases = std::vector<std::pair<std::string_view, Value>>;

std::int64_t operator""_i(unsigned long long value) {
    return static_cast<std::int64_t>(value);
}

/// So many beginnings, the middle, so many ends.
std::string nested(std::size_t depth, std::string_view begin, std::string_view end,
                   std::string_view middle = "") {
    std::string text;
    for (std::size_t i = 0; i < depth; ++i) {
        text += begin;
    }
    text += middle;
    for (std::size_t i = 0; i < depth; ++i) {
        text += end;
    }
    return text;
}

const std::vector<std::string_view> kInvalid = {
    // Nothing, or not enough.
    "", " ", "\t\r\n", "[", "{", "\"", "\"a", "[1", "[1,", "{\"a\"", "{\"a\":", "{\"a\":1",
    "{\"a\":1,", "-", "+", "t", "tru", "nul", "fals", "\"\\", "\"\\u", "\"\\u00", "\"\\u004",
    // Too much.
    "1 2", "1,2", "{}{}", "[]]", "{}}", "null,", "true false", "\"a\"\"b\"", "1x", "[1] x",
    // Commas, colons and brackets.
    "[,]", "[1,]", "[,1]", "[1,,2]", "[1 2]", "{,}", "{\"a\":1,}", "{,\"a\":1}",
    "{\"a\":1,,\"b\":2}", "{\"a\" 1}", "{\"a\"::1}", "{\"a\",1}", "{\"a\":}", "{:1}", "{\"a\"}",
    "{1:2}", "{a:1}", "{null:1}", "{\"a\":1 \"b\":2}", "[1}", "{\"a\":1]", "]", "}", ",", ":",
    "(1)",
    // Comments and other foreign things.
    "/**/1", "1/**/", "//\n1", "1//", "#\n1", "[1/**/,2]", "'a'", "{'a':1}", "[\"a']", "`a`",
    "True", "FALSE", "Null", "nil", "undefined", "NaN", "nan", "Infinity", "-Infinity", "inf",
    "Inf", "NULL", "\uFEFF1", "\v1", "\f1", "\u00A01", "\\u0031",
    // Numbers.
    "01", "-01", "00", "+1", "--1", "-a", "1.", ".1", "-.1", "1.e1", "1e", "1e+", "1e-", "1E",
    "1.5.2", "1e1.5", "1e1e1", "0x10", "1_000", "1,000", "- 1", "1 .5", "1e 5", "0e", "1d", "1f",
    "1L", "1e309", "-1e309", "1e400", "1.7976931348623159e308", "1e99999999999999999999",
    "123456789012345678901e308", "1e-400", "-1e-400", "2e-324", "1e-99999999999999999999",
    "0.00000000000001e-2147483639",
    // Escapes.
    "\"\\a\"", "\"\\v\"", "\"\\0\"", "\"\\x41\"", "\"\\'\"", "\"\\U0041\"", "\"\\ \"",
    "\"\\u004G\"", "\"\\u 041\"", "\"\\u+041\"", "\"\\u-041\"", "\"\\u00\"", "\"\\u{41}\"",
    // Half of a surrogate pair.
    "\"\\uD800\"", "\"\\uDBFF\"", "\"\\uDC00\"", "\"\\uDFFF\"", "\"\\uD800a\"", "\"\\uD800\\n\"",
    "\"\\uD800\\u0041\"", "\"\\uD800\\uD800\"", "\"\\uDC00\\uD800\"", "\"\\uD83D\\uDE00\\uDE00\"",
    "\"a\\uDC00z\"", "{\"\\uDC00\":1}", "{\"\\uD800\":1}", "\"\\uD7FF\\uDC00\"",
    // Control characters.
    "\"\x01\"", "\"\x1F\"", "\"\t\"", "\"\n\"", "\"\r\"", "{\"\n\":1}", "\x01", "[1\x01]",
    // No UTF-8.
    "\"\x80\"", "\"\xBF\"", "\"a\x80z\"", "\"\xC0\x80\"", "\"\xC1\xBF\"", "\"\xE0\x9F\xBF\"",
    "\"\xF0\x8F\xBF\xBF\"", "\"\xED\xA0\x80\"", "\"\xED\xBF\xBF\"", "\"\xF4\x90\x80\x80\"",
    "\"\xF5\x80\x80\x80\"", "\"\xF8\x88\x80\x80\x80\"", "\"\xFE\"", "\"\xFF\"", "\"\xC3\"",
    "\"\xE2\x82\"", "\"\xF0\x9F\x98\"", "\"\xC3z\"", "\"\xE2\x82z\"", "\"\xF0\x9F\x98z\"",
    "{\"\xFF\":1}", "\xFF", "\"\xC3", "\"\xF0\x9F\x98"};

} // namespace

TEST_P(JSONContract, ReadValues) {
    const Cases cases = {
        {"null", Null()},
        {"true", true},
        {"false", false},
        {" \t\r\nnull\n\r\t ", Null()},
        {"[]", ValueList()},
        {"{}", ValueMap()},
        {" [ ] ", ValueList()},
        {" { } ", ValueMap()},
        {"[1,[2,{}],\"a\"]", ValueList{1_i, ValueList{2_i, ValueMap()}, "a"}},
        {"{\"b\":1,\"a\":{\"c\":[null]}}",
         ValueMap{{"a", ValueMap{{"c", ValueList{Null()}}}}, {"b", 1_i}}},
        {"{ \"a\" : [ true , false ] , \"\" : null }",
         ValueMap{{"a", ValueList{true, false}}, {"", Null()}}},
    };
    for (const auto& [text, value] : cases) {
        SCOPED_TRACE(text);
        const auto result = read(text);
        ASSERT_TRUE(result) << result.error().description;
        EXPECT_EQ(result.value(), value);
    }
}

TEST_P(JSONContract, ReadIntegers) {
    const Cases cases = {
        {"0", 0_i},
        {"-0", 0_i},
        {"1", 1_i},
        {"-1", std::int64_t{-1}},
        {"2147483647", 2147483647_i},
        {"2147483648", 2147483648_i},
        {"-2147483648", std::int64_t{-2147483648}},
        {"-2147483649", std::int64_t{-2147483649}},
        {"4294967295", 4294967295_i},
        {"4294967296", 4294967296_i},
        {"9007199254740991", 9007199254740991_i},
        {"9007199254740993", 9007199254740993_i},
        {"9223372036854775807", std::numeric_limits<std::int64_t>::max()},
        {"-9223372036854775808", std::numeric_limits<std::int64_t>::min()},
        {"9223372036854775808", std::uint64_t{1} << 63},
        {"18446744073709551615", std::numeric_limits<std::uint64_t>::max()},
        // No integer holds these.
        {"-9223372036854775809", -9223372036854775809.0},
        {"18446744073709551616", 18446744073709551616.0},
        {"100000000000000000000000000000", 1e29},
    };
    for (const auto& [text, value] : cases) {
        SCOPED_TRACE(text);
        const auto result = read(text);
        ASSERT_TRUE(result) << result.error().description;
        EXPECT_EQ(result.value(), value);
    }
}

TEST_P(JSONContract, ReadReals) {
    const std::string longZero = "0." + std::string(1000, '0');
    const std::string longOne = "1." + std::string(1000, '0');
    const std::string longThird = "0." + std::string(1000, '3');
    const Cases cases = {
        {"0.0", 0.0},
        {"1.0", 1.0},
        {"1000.0", 1000.0},
        {"1e0", 1.0},
        {"1E2", 100.0},
        {"1e+2", 100.0},
        {"1e02", 100.0},
        {"25e-1", 2.5},
        {"-2.5", -2.5},
        {"0e308", 0.0},
        {"0e-99999999999999999999", 0.0},
        {"0.1", 0.1},
        {"9007199254740993.0", 9007199254740992.0},
        {"9007199254740993.000000000000001", 9007199254740994.0},
        {"1.7976931348623157e308", std::numeric_limits<double>::max()},
        {"1.7976931348623158e308", std::numeric_limits<double>::max()},
        {"-1.7976931348623157e308", -std::numeric_limits<double>::max()},
        {"2.2250738585072014e-308", std::numeric_limits<double>::min()},
        {"2.2250738585072011e-308", 2.2250738585072011e-308},
        {"5e-324", std::numeric_limits<double>::denorm_min()},
        {"3e-324", std::numeric_limits<double>::denorm_min()},
        {"1700000000500.25", 1700000000500.25},
        {longZero, 0.0},
        {longOne, 1.0},
        {longThird, 1.0 / 3},
    };
    for (const auto& [text, value] : cases) {
        SCOPED_TRACE(text);
        const auto result = read(text);
        ASSERT_TRUE(result) << result.error().description;
        EXPECT_EQ(result.value(), value);
    }
}

TEST_P(JSONContract, NegativeZeroIsReal) {
    const auto result = read("-0.0");
    ASSERT_TRUE(result);
    ASSERT_TRUE(result.value().is<double>());
    EXPECT_EQ(*result.value().as<double>(), 0.0);
    EXPECT_TRUE(std::signbit(*result.value().as<double>()));
}

TEST_P(JSONContract, ReadTexts) {
    using std::literals::operator""sv;
    const Cases cases = {
        {R"("")", ""},
        {R"("a")", "a"},
        {R"("\"\\\/\b\f\n\r\t")", "\"\\/\b\f\n\r\t"},
        {R"("/")", "/"},
        {R"("\u0041\u00e9\u00E9\u20ac")", "A\u00E9\u00E9\u20AC"},
        {R"("\uD7FF\uE000\uFFFF")", "\uD7FF\uE000\uFFFF"},
        {R"("\uD800\uDC00")", "\U00010000"},
        {R"("\udbff\udfff")", "\U0010FFFF"},
        {R"("a\u0000z")", "a\0z"sv},
        {R"("\u001f\u007F")", "\x1F\x7F"},
        {"\"\x7F\u0080\u07FF\u0800\uD7FF\uE000\uFFFF\U00010000\U0010FFFF\"",
         "\x7F\u0080\u07FF\u0800\uD7FF\uE000\uFFFF\U00010000\U0010FFFF"},
        {R"({"\u0000":"\u0000"})", ValueMap{{std::string(1, '\0'), "\0"sv}}},
    };
    for (const auto& [text, value] : cases) {
        SCOPED_TRACE(text);
        const auto result = read(text);
        ASSERT_TRUE(result) << result.error().description;
        EXPECT_EQ(result.value(), value);
    }
}

TEST_P(JSONContract, OfAKeyThatStandsTwiceTheLaterValueCounts) {
    EXPECT_EQ(read(R"({"a":1,"a":true})").value(), Value(ValueMap{{"a", true}}));
    EXPECT_EQ(read(R"({"a":1,"b":2,"\u0061":{"a":1,"a":2}})").value(),
              Value(ValueMap{{"a", ValueMap{{"a", 2_i}}}, {"b", 2_i}}));
}

TEST_P(JSONContract, InvalidTexts) {
    for (const std::string_view text : kInvalid) {
        SCOPED_TRACE(text);
        const auto result = read(text);
        ASSERT_FALSE(result);
        EXPECT_EQ(result.error().domain, platform::kGenericErrorDomain);
        EXPECT_FALSE(result.error().description.empty());
    }
}

TEST_P(JSONContract, ZeroBytesAreNoEnd) {
    using std::literals::operator""sv;
    for (const std::string_view text :
         {"\0"sv, "1\0"sv, "\0001"sv, "1\0x"sv, "[1\0]"sv, "[1]\0"sv, "[1]\0\0"sv, "\"a\0z\""sv,
          "{\"a\0\":1}"sv, "{\"a\":1}\0{}"sv, "nul\0l"sv, "1\0 "sv}) {
        EXPECT_FALSE(read(text));
    }
}

TEST_P(JSONContract, EveryTruncationFails) {
    constexpr std::string_view kText = "{\"\u00E9\":[1,-2.5e+10,true,false,null,"
                                       "\"a\\n\\u00e9\\uD83D\\uDE00\U0001F600\"],\"b\":{}}";
    ASSERT_TRUE(read(kText));
    for (std::size_t size = 0; size < kText.size(); ++size) {
        EXPECT_FALSE(read(kText.substr(0, size))) << size;
    }
}

TEST_P(JSONContract, Depth) {
    for (const std::size_t depth : {kMaxJSONDepth - 1, kMaxJSONDepth}) {
        EXPECT_TRUE(read(nested(depth, "[", "]"))) << depth;
        EXPECT_TRUE(read(nested(depth, "{\"a\":", "}", "null"))) << depth;
        EXPECT_TRUE(read(nested(depth - 1, "[", "]", "{}"))) << depth;
    }
    EXPECT_FALSE(read(nested(kMaxJSONDepth + 1, "[", "]")));
    EXPECT_FALSE(read(nested(kMaxJSONDepth + 1, "{\"a\":", "}", "null")));
    EXPECT_FALSE(read(nested(kMaxJSONDepth, "[", "]", "{}")));
    EXPECT_FALSE(read(nested(kMaxJSONSize / 2, "[", "]")));
    EXPECT_FALSE(read(std::string(kMaxJSONSize, '[')));
    EXPECT_FALSE(read(nested(kMaxJSONSize / 5, "{\"a\":", "")));
}

TEST_P(JSONContract, DepthIsCountedForWhatIsOpen) {
    const std::string list = nested(kMaxJSONDepth - 1, "[", "]");
    EXPECT_TRUE(read(base::concat("[", list, ",", list, "]")));
    EXPECT_FALSE(read(base::concat("[", list, ",[", list, "]]")));
    const std::string map = nested(kMaxJSONDepth - 1, "{\"a\":", "}", "null");
    EXPECT_TRUE(read(base::concat("[", map, ",", map, "]")));
    EXPECT_FALSE(read(base::concat("[", map, ",[", map, "]]")));
}

TEST_P(JSONContract, Size) {
    for (const std::size_t size : {kMaxJSONSize - 1, kMaxJSONSize}) {
        const auto text = read(base::concat("\"", std::string(size - 2, 'a'), "\""));
        ASSERT_TRUE(text) << size;
        EXPECT_EQ(text.value().as<std::string>()->size(), size - 2);
        EXPECT_TRUE(read("[]" + std::string(size - 2, ' '))) << size;
    }
    EXPECT_FALSE(read(base::concat("\"", std::string(kMaxJSONSize - 1, 'a'), "\"")));
    EXPECT_FALSE(read("[]" + std::string(kMaxJSONSize - 1, ' ')));
}

TEST_P(JSONContract, WhatWasWrittenIsReadBack) {
    const Value value = ValueMap{
        {"list", ValueList{1_i, std::int64_t{-1}, 1.0, -0.5, 1e25, true, false, Null(), "", "\n"}},
        {"map", ValueMap{{"", ValueMap()}, {"\u00E9\x01\"", ValueList()}}},
        {"most", std::numeric_limits<std::uint64_t>::max()},
    };
    EXPECT_EQ(read(write(value)).value(), value);
}

} // namespace contract
