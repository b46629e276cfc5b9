#include "base/Concat.h"
#include "tests/platform/contract/JSONContract.h"

#include <gtest/gtest.h>

#include <bit>
#include <cstdlib>
#include <limits>
#include <utility>
#include <vector>

namespace contract {

namespace {

using platform::Bytes;
using platform::Error;
using platform::JSONText;
using platform::Link;
using platform::Null;
using platform::Timestamp;
using platform::UniqueIdentifier;
using platform::Value;
using platform::ValueList;
using platform::ValueMap;

constexpr char kGolden[] =
    R"({"events":[{"eventPeriodDuration":4294967295,"eventTime":1700000000000.0,)"
    R"("eventType":"policy","eventVersion":3,"policyDisabledByBootArg":2,)"
    R"("policyDisabledByPasscodeNotSet":0,"policyDisabledByQuorvane":0,"policyEnabled":0,)"
    R"("restrictedMode":1,"restrictedModeDuration":3600,"topic":"kst"},)"
    R"({"eventTime":1700000000000.0,"eventType":"timerRestarted","eventVersion":4,"topic":"kst",)"
    R"("totalRestrictedModeDurationMin":1},)"
    R"({"build":"B1","eventTime":1700000000500.25,"eventType":"accumulatedPolicyStats",)"
    R"("product":"P","topic":null}],"postTime":1700000000500.25})";

Value document() {
    ValueMap policy = {{"topic", "kst"},
                       {"eventType", "policy"},
                       {"eventVersion", std::int32_t{3}},
                       {"eventTime", 1700000000000.0},
                       {"eventPeriodDuration", std::uint32_t{4294967295}},
                       {"policyEnabled", std::uint8_t{0}},
                       {"policyDisabledByQuorvane", std::uint8_t{0}},
                       {"policyDisabledByPasscodeNotSet", std::uint8_t{0}},
                       {"policyDisabledByBootArg", std::uint8_t{2}},
                       {"restrictedMode", std::uint8_t{1}},
                       {"restrictedModeDuration", std::uint32_t{3600}}};
    ValueMap restarted = {{"topic", "kst"},
                          {"eventType", "timerRestarted"},
                          {"eventVersion", std::int32_t{4}},
                          {"eventTime", 1700000000000.0},
                          {"totalRestrictedModeDurationMin", std::uint32_t{1}}};
    ValueMap summary = {{"topic", Null()},
                        {"eventTime", 1700000000500.25},
                        {"eventType", "accumulatedPolicyStats"},
                        {"build", "B1"},
                        {"product", "P"}};
    ValueList events = {std::move(policy), std::move(restarted), std::move(summary)};
    return ValueMap{{"postTime", 1700000000500.25}, {"events", std::move(events)}};
}

/// How a character of ASCII is written.
std::string escaped(char character) {
    switch (character) {
    case '"':
        return "\\\"";
    case '\\':
        return "\\\\";
    case '\b':
        return "\\b";
    case '\t':
        return "\\t";
    case '\n':
        return "\\n";
    case '\f':
        return "\\f";
    case '\r':
        return "\\r";
    default:
        break;
    }
    if (character >= ' ') {
        return {character};
    }
    constexpr std::string_view kDigits = "0123456789ABCDEF";
    return base::concat("\\u00", kDigits[static_cast<std::size_t>(character / 16)],
                        kDigits[static_cast<std::size_t>(character % 16)]);
}

/// Everything that is no UTF-8.
const std::vector<std::string_view> kBadTexts = {
    "\x80",             // a byte of the middle alone
    "\xBF",             //
    "a\x80z",           //
    "\xC0\x80",         // two bytes for NUL
    "\xC1\xBF",         // two bytes for what needs one
    "\xE0\x9F\xBF",     // three bytes for what needs two
    "\xF0\x8F\xBF\xBF", // four bytes for what needs three
    "\xED\xA0\x80",     // the first surrogate
    "\xED\xBF\xBF",     // the last
    "\xF4\x90\x80\x80", // beyond the last character
    "\xF5\x80\x80\x80", //
    "\xFE",             // bytes that never stand in UTF-8
    "\xFF",             //
    "\xC3",             // cut
    "\xE2\x82",         //
    "\xF0\x9F\x98",     //
    "\xC3z",            // the next one begins too early
    "\xE2\x82z",        //
    "\xF0\x9F\x98z",    //
    "\xF0zz",           //
};

std::vector<Value> inexpressible() {
    constexpr double kInfinity = std::numeric_limits<double>::infinity();
    std::vector<Value> values = {Bytes{1, 2},
                                 Bytes(),
                                 Timestamp{1},
                                 UniqueIdentifier{},
                                 Link{"https://example.com/"},
                                 Error{"generic", 1, "no"},
                                 std::numeric_limits<double>::quiet_NaN(),
                                 std::numeric_limits<float>::quiet_NaN(),
                                 kInfinity,
                                 -kInfinity,
                                 std::numeric_limits<float>::infinity()};
    values.insert(values.end(), kBadTexts.begin(), kBadTexts.end());
    return values;
}

void addEntry(JSONText& text, std::string_view key, std::int64_t value) {
    text.key(key);
    text.integer(value);
}

} // namespace

TEST_P(JSONContract, WholeDocument) {
    EXPECT_EQ(write(document()), kGolden);
}

TEST_P(JSONContract, EmptyThings) {
    EXPECT_EQ(write(ValueMap()), "{}");
    EXPECT_EQ(write(ValueList()), "[]");
    EXPECT_EQ(write(""), R"("")");
    EXPECT_EQ(write(ValueMap{{"", ""}}), R"({"":""})");
    EXPECT_EQ(write(ValueList{ValueList(), ValueMap(), ValueList{ValueMap()}}), "[[],{},[{}]]");

    const auto text = makeText();
    text->text(std::string_view());
    EXPECT_EQ(finish(*text), R"("")");
}

TEST_P(JSONContract, WrittenConstants) {
    EXPECT_EQ(write(Null()), "null");
    EXPECT_EQ(write(ValueList{true, false, Null()}), "[true,false,null]");
}

TEST_P(JSONContract, EveryCharacterOfASCII) {
    for (int code = 0; code < 0x80; ++code) {
        SCOPED_TRACE(code);
        const auto character = static_cast<char>(code);
        const std::string text{'a', character, 'z'};
        const std::string expected = base::concat("\"a", escaped(character), "z\"");
        EXPECT_EQ(write(text), expected);
        EXPECT_EQ(write(ValueMap{{text, true}}), base::concat("{", expected, ":true}"));
    }
}

TEST_P(JSONContract, CharactersThatAreEscapedAnywhereInALongerText) {
    for (const char character : {'\0', '\x1f', ' ', '!', '"', '#', '[', '\\', ']', '\x7f'}) {
        for (std::size_t size = 1; size <= 17; ++size) {
            for (std::size_t at = 0; at < size; ++at) {
                SCOPED_TRACE(base::concat(int{character}, " at ", at, " of ", size));
                std::string text(size, 'x');
                text[at] = character;
                const std::string_view around(text);
                EXPECT_EQ(write(text), base::concat('"', around.substr(0, at), escaped(character),
                                                    around.substr(at + 1), '"'));
            }
        }
    }
}

TEST_P(JSONContract, CharactersBeyondASCIIStandForThemselves) {
    for (const std::string_view text :
         {"\u0080", "\u07FF", "\u0800", "\uD7FF", "\uE000", "\uFEFF", "\uFFFF", "\U00010000",
          "\U0010FFFF", "a\u00E9z", "\u20AC\n\u20AC"}) {
        SCOPED_TRACE(text);
        std::string expected = base::concat("\"", text, "\"");
        if (const std::size_t newline = expected.find('\n'); newline != std::string::npos) {
            expected.replace(newline, 1, "\\n");
        }
        EXPECT_EQ(write(text), expected);
    }
}

TEST_P(JSONContract, WrittenIntegers) {
    EXPECT_EQ(write(ValueList{std::int8_t{-128}, std::int16_t{-32768}, std::uint8_t{255},
                              std::uint16_t{65535}, std::uint8_t{1}, std::int32_t{0}}),
              "[-128,-32768,255,65535,1,0]");
    EXPECT_EQ(write(ValueList{std::numeric_limits<std::int64_t>::min(),
                              std::numeric_limits<std::int64_t>::max(),
                              std::numeric_limits<std::uint64_t>::max()}),
              "[-9223372036854775808,9223372036854775807,18446744073709551615]");
    EXPECT_EQ(write(std::uint64_t{1} << 63), "9223372036854775808");
    EXPECT_EQ(write(ValueList(2, Value(std::numeric_limits<std::uint64_t>::max()))),
              "[18446744073709551615,18446744073709551615]");
}

TEST_P(JSONContract, RealsAlwaysHaveAFraction) {
    const std::vector<std::pair<double, std::string>> cases = {
        {0.0, "0.0"},
        {-0.0, "-0.0"},
        {1.0, "1.0"},
        {-1.5, "-1.5"},
        {0.1, "0.1"},
        {1.0 / 3, "0.3333333333333333"},
        {0.000001, "0.000001"},
        {1e-7, "1.0e-7"},
        {1.5e-7, "1.5e-7"},
        {9007199254740991.0, "9007199254740991.0"},
        {9007199254740992.0, "9007199254740992.0"},
        {1e20, "100000000000000000000.0"},
        {1e21, "1.0e21"},
        {1e25, "1.0e25"},
        {-1e25, "-1.0e25"},
        {1.25e25, "1.25e25"},
        {1e100, "1.0e100"},
        {std::numeric_limits<double>::denorm_min(), "5.0e-324"},
        {std::numeric_limits<double>::min(), "2.2250738585072014e-308"},
        {-std::numeric_limits<double>::min(), "-2.2250738585072014e-308"},
        {std::numeric_limits<double>::max(), "1.7976931348623157e308"},
        {-std::numeric_limits<double>::max(), "-1.7976931348623157e308"},
    };
    for (const auto& [value, expected] : cases) {
        EXPECT_EQ(write(value), expected);
    }
    EXPECT_EQ(write(0.5F), "0.5");
    EXPECT_EQ(write(0.1F), "0.10000000149011612");
    EXPECT_EQ(write(std::numeric_limits<float>::max()), "3.4028234663852887e38");
}

TEST_P(JSONContract, RealsComeBackBitForBit) {
    std::uint64_t bits = 0x0123456789ABCDEF;
    for (int i = 0; i < 2000; ++i) {
        bits = bits * 6364136223846793005U + 1442695040888963407U;
        const auto value = std::bit_cast<double>(bits);
        if (value - value != 0) {
            continue;
        }
        const std::string text = write(value);
        EXPECT_NE(text.find('.'), std::string::npos) << text;
        EXPECT_EQ(std::strtod(text.c_str(), nullptr), value) << text;
        EXPECT_EQ(read(text).value(), Value(value)) << text;
    }
}

TEST_P(JSONContract, RepeatedKeysAreWrittenAsOthersAre) {
    for (const std::string_view key : {"key", "", "a \"quoted\" one", "\u00e9", "\xff"}) {
        for (const bool isPretty : {false, true}) {
            const auto expected = fixture().json().makeText({.isPretty = isPretty});
            const auto repeated = fixture().json().makeText({.isPretty = isPretty});
            std::string form;
            // First and later ones, behind one that is left out, and inside of what is left out.
            const auto write = [](JSONText& text, const auto& writeKey) {
                text.beginMap();
                writeKey(text);
                text.beginMap();
                writeKey(text);
                text.integer(1);
                addEntry(text, "x", 2);
                writeKey(text);
                text.bytes({});
                writeKey(text);
                text.endMap();
                text.key("\xff");
                text.beginMap();
                writeKey(text);
                text.boolean(true);
                text.endMap();
                writeKey(text);
                text.text("end");
                text.endMap();
            };
            write(*expected, [key](JSONText& text) { text.key(key); });
            write(*repeated, [key, &form](JSONText& text) { text.repeatedKey(key, form); });
            EXPECT_EQ(finish(*repeated), finish(*expected));
            EXPECT_FALSE(form.empty());
        }
    }
}

TEST_P(JSONContract, WhatCannotBeExpressedIsLeftOutWithItsKey) {
    const std::vector<Value> values = inexpressible();
    for (std::size_t i = 0; i < values.size(); ++i) {
        SCOPED_TRACE(i);
        const Value& value = values[i];
        EXPECT_EQ(write(value), "none");
        EXPECT_EQ(write(ValueList{value}), "[]");
        EXPECT_EQ(write(ValueList{value, true}), "[true]");
        EXPECT_EQ(write(ValueList{true, value, false}), "[true,false]");
        EXPECT_EQ(write(ValueList{true, value}), "[true]");
        EXPECT_EQ(write(ValueMap{{"a", value}}), "{}");
        EXPECT_EQ(write(ValueMap{{"a", value}, {"b", true}}), R"({"b":true})");
        EXPECT_EQ(write(ValueMap{{"a", true}, {"b", value}, {"c", false}}),
                  R"({"a":true,"c":false})");
        EXPECT_EQ(write(ValueMap{{"a", true}, {"b", value}}), R"({"a":true})");
        EXPECT_EQ(write(ValueList{ValueMap{{"a", ValueList{value}}}, value}), R"([{"a":[]}])");
    }
}

TEST_P(JSONContract, KeyThatIsNoTextIsLeftOutWithItsValue) {
    const ValueMap deep = {{"x", ValueList{ValueMap{{"y", true}}, "z"}}};
    for (const std::string_view bad : kBadTexts) {
        for (const Value& value : std::vector<Value>{true, "text", Bytes{1}, ValueList{1.0, deep},
                                                     deep, ValueMap(), ValueList()}) {
            const auto text = makeText();
            text->beginMap();
            text->key(bad);
            describe(value, *text);
            addEntry(*text, "a", 1);
            text->key(bad);
            describe(value, *text);
            addEntry(*text, "b", 2);
            text->key("c");
            text->beginMap();
            text->key(bad);
            describe(value, *text);
            text->endMap();
            text->endMap();
            EXPECT_EQ(finish(*text), R"({"a":1,"b":2,"c":{}})");
        }
    }
}

TEST_P(JSONContract, WhatStandsBehindATextIsNoPartOfIt) {
    // The first character of each length, and one in the middle.
    for (const std::string_view memory :
         {"\xC2\x80", "\xE0\xA0\x80", "\xF0\x90\x80\x80", "\xF0\x9F\x98\x80"}) {
        for (std::size_t size = 1; size < memory.size(); ++size) {
            const auto text = makeText();
            text->beginList();
            text->text(memory.substr(0, size));
            text->text("z");
            text->endList();
            EXPECT_EQ(finish(*text), R"(["z"])");
        }
        EXPECT_EQ(write(memory), base::concat("\"", memory, "\""));
    }
}

TEST_P(JSONContract, TextThatIsMovedAwayAsItGrowsIsTheSame) {
    for (const bool isPretty : {false, true}) {
        const auto whole = fixture().json().makeText({.isPretty = isPretty});
        const auto moved = fixture().json().makeText({.isPretty = isPretty});
        base::TextBuffer taken;
        const auto addEach = [&](const auto& add) {
            add(*whole);
            add(*moved);
            moved->moveTo(taken);
        };
        addEach([](JSONText& text) { text.beginMap(); });
        addEach([](JSONText& text) {
            text.key("a");
            text.beginList();
        });
        addEach([](JSONText& text) { text.integer(1); });
        addEach([](JSONText& text) { text.date({}); });
        addEach([](JSONText& text) { text.integer(2); });
        addEach([](JSONText& text) {
            const auto before = text.mark();
            text.beginMap();
            addEntry(text, "lost", 3);
            text.rewind(before);
        });
        addEach([](JSONText& text) { text.text("last"); });
        addEach([](JSONText& text) { text.endList(); });
        addEach([](JSONText& text) { addEntry(text, "b", 4); });
        addEach([](JSONText& text) { text.endMap(); });
        EXPECT_EQ(taken.view(), finish(*whole));
    }
}

TEST_P(JSONContract, NothingToFinish) {
    const auto text = makeText();
    const auto finished = text->finish();
    ASSERT_FALSE(finished);
    EXPECT_EQ(finished.error(),
              (Error{platform::kGenericErrorDomain, 0, "there is no value that JSON can express"}));
}

TEST_P(JSONContract, FinishedTooEarly) {
    const std::vector<void (*)(JSONText&)> beginnings = {
        [](JSONText& text) { text.beginList(); },
        [](JSONText& text) { text.beginMap(); },
        [](JSONText& text) {
            text.beginList();
            text.beginMap();
            text.endMap();
        },
        [](JSONText& text) {
            text.beginMap();
            text.key("\xFF");
            text.beginList();
        },
    };
    for (const auto& begin : beginnings) {
        const auto text = makeText();
        begin(*text);
        const auto finished = text->finish();
        ASSERT_FALSE(finished);
        EXPECT_EQ(finished.error(), (Error{platform::kGenericErrorDomain, 0,
                                           "a map or list of the JSON text is still open"}));
    }
}

TEST_P(JSONContract, RewoundBeforeEverything) {
    const auto text = makeText();
    const auto mark = text->mark();
    text->beginMap();
    text->key("a");
    text->beginList();
    text->rewind(mark);
    EXPECT_EQ(finish(*text), "none");

    const auto again = makeText();
    const auto start = again->mark();
    again->text("first");
    again->rewind(start);
    again->beginList();
    again->endList();
    EXPECT_EQ(finish(*again), "[]");
}

TEST_P(JSONContract, RewoundInAList) {
    for (const std::int64_t before : {0, 1, 2}) {
        const auto text = makeText();
        std::string expected = "[";
        text->beginList();
        for (std::int64_t i = 0; i < before; ++i) {
            text->integer(i);
            expected += base::concat(i, ",");
        }
        const auto mark = text->mark();
        text->text("gone");
        text->rewind(mark);
        text->beginMap();
        text->key("gone");
        text->rewind(mark);
        text->beginMap();
        text->key("gone");
        text->beginList();
        text->integer(1);
        text->rewind(mark);
        for (const std::string_view key : {"gone", "\xFF"}) {
            const auto here = text->mark();
            text->beginMap();
            text->key(key);
            text->rewind(here);
            text->boolean(true);
        }
        text->endList();
        EXPECT_EQ(finish(*text), expected + "true,true]");
    }
}

TEST_P(JSONContract, RewoundInAMap) {
    for (const bool isFirst : {true, false}) {
        const auto text = makeText();
        text->beginMap();
        if (!isFirst) {
            addEntry(*text, "a", 1);
        }
        const auto mark = text->mark();
        addEntry(*text, "gone", 2);
        text->rewind(mark);
        text->key("gone");
        text->rewind(mark);
        text->key("\xFF");
        text->rewind(mark);
        text->key("gone");
        text->beginMap();
        addEntry(*text, "gone", 3);
        text->rewind(mark);
        addEntry(*text, "b", 4);
        text->endMap();
        EXPECT_EQ(finish(*text), isFirst ? R"({"b":4})" : R"({"a":1,"b":4})");
    }
}

TEST_P(JSONContract, RewoundToTheEndOfAMap) {
    const auto text = makeText();
    text->beginList();
    text->beginMap();
    addEntry(*text, "a", 1);
    text->endMap();
    const auto mark = text->mark();
    text->beginMap();
    addEntry(*text, "gone", 1);
    text->rewind(mark);
    text->endList();
    EXPECT_EQ(finish(*text), R"([{"a":1}])");
}

TEST_P(JSONContract, RewoundOutOfWhatIsLeftOut) {
    const auto text = makeText();
    text->beginMap();
    const auto mark = text->mark();
    text->key("\xFF");
    text->beginList();
    text->beginMap();
    text->rewind(mark);
    addEntry(*text, "a", 1);
    text->endMap();
    EXPECT_EQ(finish(*text), R"({"a":1})");
}

TEST_P(JSONContract, RewoundWithinWhatIsLeftOut) {
    const auto text = makeText();
    text->beginMap();
    text->key("\xFF");
    text->beginList();
    const auto mark = text->mark();
    text->beginMap();
    text->key("x");
    text->rewind(mark);
    text->boolean(true);
    text->endList();
    addEntry(*text, "a", 1);
    text->endMap();
    EXPECT_EQ(finish(*text), R"({"a":1})");
}

TEST_P(JSONContract, PrettyTextHasALineForEachEntry) {
    const auto pretty = [this](const Value& value) {
        const auto text = fixture().json().makeText({.isPretty = true});
        platform::describe(value, *text);
        return finish(*text);
    };
    EXPECT_EQ(pretty(true), "true");
    EXPECT_EQ(pretty(ValueList()), "[]");
    EXPECT_EQ(pretty(ValueMap()), "{}");
    EXPECT_EQ(pretty(ValueList{ValueList(), ValueMap{{"a", "b,:{"}}, 1.5}),
              "[\n  [],\n  {\n    \"a\": \"b,:{\"\n  },\n  1.5\n]");
    // What is left out leaves no line.
    EXPECT_EQ(pretty(ValueMap{{"a", Bytes{1}}}), "{}");
    EXPECT_EQ(pretty(ValueList{Bytes{1}, true, Bytes{2}}), "[\n  true\n]");
    EXPECT_EQ(pretty(ValueMap{{"a", true}, {"b", Bytes{1}}, {"c", ValueList{Bytes{1}}}}),
              "{\n  \"a\": true,\n  \"c\": []\n}");
    const auto parsed = read(pretty(document()));
    ASSERT_TRUE(parsed);
    EXPECT_EQ(write(parsed.value()), kGolden);
}

} // namespace contract
