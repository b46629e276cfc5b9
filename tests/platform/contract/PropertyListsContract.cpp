#include "tests/platform/contract/PropertyListsContract.h"

#include <gtest/gtest.h>

#include <limits>

namespace contract {

namespace {

using platform::Bytes;
using platform::Timestamp;
using platform::Value;
using platform::ValueList;
using platform::ValueMap;

TEST_P(PropertyListsContract, EveryKindComesBackAsItself) {
    const std::vector<Value> values = {
        true,
        false,
        std::int64_t{0},
        std::numeric_limits<std::int64_t>::min(),
        std::numeric_limits<std::int64_t>::max(),
        std::uint64_t{1} << 63U,
        std::numeric_limits<std::uint64_t>::max(),
        -0.5,
        "",
        "text",
        "\u00e9\u20ac\U0001f600",
        Bytes(),
        Bytes{0, 255},
        Timestamp{721692800.25},
        ValueList(),
        ValueMap(),
    };
    for (const Value& value : values) {
        EXPECT_EQ(readBack(value), value) << kindName(value);
    }
    EXPECT_EQ(readBack(ValueList(values)), Value(values));
    const Value map = ValueMap{{"a", ValueList(values)}, {"\u00e9", ValueMap{{"", true}}}};
    EXPECT_EQ(readBack(map), map);
}

TEST_P(PropertyListsContract, KnownKeysChangeNothing) {
    platform::KnownKeys known;
    const auto readKnowing = [&](const Bytes& bytes) -> std::optional<Value> {
        platform::ValueBuilder builder;
        return fixture().propertyLists().readKnowing(known, bytes, builder)
                   ? std::optional(builder.take())
                   : std::nullopt;
    };
    const std::vector<Value> values = {
        ValueMap{{"a", true}, {"b", "text"}},
        ValueMap{{"a", std::int64_t{1}}, {"b", -0.5}},
        ValueMap{{"a", true}, {"c", "text"}},
        ValueMap{{"a", ValueMap{{"a", true}, {"b", false}}}},
        ValueMap{{"\u00e9", true}},
        ValueList{ValueMap{{"a", true}}},
        true,
    };
    for (int round = 0; round < 2; ++round) {
        for (const Value& value : values) {
            EXPECT_EQ(readKnowing(binary(value).value()), value);
            EXPECT_EQ(readKnowing(Bytes{'b'}), std::nullopt);
        }
    }
}

TEST_P(PropertyListsContract, NumbersLoseTheirWidthNotTheirKind) {
    EXPECT_EQ(readBack(std::uint8_t{1}), Value(std::int64_t{1}));
    EXPECT_EQ(readBack(std::int8_t{-1}), Value(std::int64_t{-1}));
    EXPECT_EQ(readBack(std::uint32_t{4294967295}), Value(std::int64_t{4294967295}));
    EXPECT_EQ(readBack(std::int32_t{-2147483647}), Value(std::int64_t{-2147483647}));
    EXPECT_EQ(readBack(std::uint64_t{5}), Value(std::int64_t{5}));
    EXPECT_EQ(readBack(1.0F), Value(1.0));
}

TEST_P(PropertyListsContract, WrittenFormBeginsWithTheMagicOfItsVersion) {
    const platform::Result<Bytes> bytes = binary(ValueMap{{"a", true}});
    ASSERT_TRUE(bytes);
    const std::string start(bytes.value().begin(), bytes.value().begin() + 8);
    EXPECT_EQ(start, "bplist00");
}

TEST_P(PropertyListsContract, OtherKindsFailWithTheirName) {
    const std::vector<std::pair<Value, std::string>> refused = {
        {Value(), "null"},
        {platform::UniqueIdentifier(), "identifier"},
        {platform::Link{"https://example.net/"}, "link"},
        {platform::Error(), "error"},
        {"\xff", "text"},
        {std::string(1, '\0'), "text"},
    };
    for (const auto& [value, kind] : refused) {
        const platform::Result<Bytes> result =
            binary(ValueMap{{"a", true}, {"b", ValueList{value}}});
        ASSERT_FALSE(result) << kind;
        EXPECT_EQ(result.error().domain, platform::kGenericErrorDomain);
        EXPECT_NE(result.error().description.find(kind), std::string::npos)
            << result.error().description;
    }
}

TEST_P(PropertyListsContract, WhatIsNoPropertyListIsNone) {
    EXPECT_EQ(read({}), std::nullopt);
    for (const std::string text : {"hello", "bplist00", "bplist01", "{}", "<", "\xff\xfe"}) {
        EXPECT_EQ(read(Bytes(text.begin(), text.end())), std::nullopt) << text;
    }
    Bytes cut = binary(ValueMap{{"a", true}}).value();
    cut.pop_back();
    EXPECT_EQ(read(cut), std::nullopt);
}

} // namespace

} // namespace contract
