#include "platform/Value.h"

#include <gtest/gtest.h>

#include <string>
#include <utility>
#include <vector>

namespace {

using platform::Bytes;
using platform::Error;
using platform::Link;
using platform::Null;
using platform::Timestamp;
using platform::UniqueIdentifier;
using platform::Value;
using platform::ValueList;
using platform::ValueMap;

/// A one, or what comes nearest to it, of every kind.
const std::vector<std::pair<Value, std::string_view>> kOneOfEveryKind = {
    {Null(), "null"},
    {true, "boolean"},
    {std::int8_t{1}, "integer"},
    {std::int16_t{1}, "integer"},
    {std::int32_t{1}, "integer"},
    {std::int64_t{1}, "integer"},
    {std::uint8_t{1}, "integer"},
    {std::uint16_t{1}, "integer"},
    {std::uint32_t{1}, "integer"},
    {std::uint64_t{1}, "integer"},
    {1.0F, "real"},
    {1.0, "real"},
    {"1", "text"},
    {Bytes{'1'}, "bytes"},
    {Timestamp{1}, "date"},
    {UniqueIdentifier{}, "identifier"},
    {Link{"1:1"}, "link"},
    {Error{"", 1, ""}, "error"},
    {ValueList{true}, "list"},
    {ValueMap{{"1", true}}, "map"},
};

TEST(ValueTest, OneOfEveryKind) {
    for (std::size_t i = 0; i < kOneOfEveryKind.size(); ++i) {
        const auto& [value, name] = kOneOfEveryKind[i];
        EXPECT_EQ(value.content().index(), i);
        EXPECT_EQ(kindName(value), name);
    }
    EXPECT_EQ(kOneOfEveryKind.size(), std::variant_size_v<Value::Content>);
}

TEST(ValueTest, EqualOnlyToItsOwnKind) {
    for (const auto& [value, name] : kOneOfEveryKind) {
        for (const auto& [other, otherName] : kOneOfEveryKind) {
            EXPECT_EQ(value == other, &value == &other) << name << " and " << otherName;
        }
    }
}

TEST(ValueTest, NullUnlessGivenAnything) {
    EXPECT_EQ(Value(), Value(Null()));
}

TEST(ValueTest, EqualWhenTheContentIs) {
    EXPECT_NE(Value(1.0), Value(2.0));
    EXPECT_NE(Value("a"), Value("b"));
    EXPECT_EQ(Value("a"), Value(std::string("a")));
    EXPECT_EQ(Value("a"), Value(std::string_view("a")));
    EXPECT_NE(Value(Bytes{1}), Value(Bytes{1, 2}));
    EXPECT_NE(Value(UniqueIdentifier{{1}}), Value(UniqueIdentifier{{2}}));
    EXPECT_NE(Value(Error{"a", 1, "b"}), Value(Error{"a", 2, "b"}));
    EXPECT_NE(Value(ValueList{1.0}), Value(ValueList{1.0F}));
    EXPECT_NE(Value(ValueMap{{"a", true}}), Value(ValueMap{{"b", true}}));
}

TEST(ValueTest, ContentOfTheKindAskedFor) {
    const Value value = std::uint8_t{7};
    ASSERT_NE(value.as<std::uint8_t>(), nullptr);
    EXPECT_EQ(*value.as<std::uint8_t>(), 7);
    EXPECT_TRUE(value.is<std::uint8_t>());
    EXPECT_EQ(value.as<bool>(), nullptr);
    EXPECT_EQ(value.as<std::uint32_t>(), nullptr);
    EXPECT_FALSE(value.is<std::int8_t>());
}

TEST(ValueTest, MapsAreSortedByTheBytesOfTheirKeys) {
    const ValueMap map = {{"\u00E9", true}, {"b", true}, {"a", true},
                          {"B", true},      {"", true},  {"aa", true}};
    std::vector<std::string> keys;
    for (const auto& [key, value] : map) {
        keys.push_back(key);
    }
    EXPECT_EQ(keys, (std::vector<std::string>{"", "B", "a", "aa", "b", "\u00E9"}));
}

} // namespace
