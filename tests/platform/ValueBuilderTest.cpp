#include "platform/ValueBuilder.h"

#include "tests/support/DeafSink.h"

#include <gtest/gtest.h>

#include <limits>
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
using platform::ValueBuilder;
using platform::ValueList;
using platform::ValueMap;

Value rebuilt(const Value& value) {
    ValueBuilder builder;
    describe(value, builder);
    return builder.take();
}

/// Keeps the names of the kinds that it has no operation for.
struct OtherKinds final : support::DeafSink {
    void other(std::string_view kind) override { names.emplace_back(kind); }

    std::vector<std::string> names;
};

TEST(ValueBuilderTest, KindsWithoutAnOperationAreTheirNames) {
    OtherKinds kinds;
    describe(ValueList{UniqueIdentifier(), true, Link(), "text", Error(), ValueMap()}, kinds);
    EXPECT_EQ(kinds.names, (std::vector<std::string>{"identifier", "link", "error"}));
}

TEST(ValueBuilderTest, NumbersComeBackInTheirWidestKind) {
    constexpr auto kMostSigned = std::numeric_limits<std::int64_t>::max();
    constexpr auto kMostUnsigned = std::numeric_limits<std::uint64_t>::max();
    const std::vector<std::pair<Value, Value>> cases = {
        {std::int8_t{-1}, std::int64_t{-1}},
        {std::int16_t{-2}, std::int64_t{-2}},
        {std::int32_t{-3}, std::int64_t{-3}},
        {std::int64_t{-4}, std::int64_t{-4}},
        {std::uint8_t{255}, std::int64_t{255}},
        {std::uint16_t{65535}, std::int64_t{65535}},
        {std::uint32_t{4294967295}, std::int64_t{4294967295}},
        {std::uint64_t{kMostSigned}, kMostSigned},
        {std::uint64_t{kMostSigned} + 1, std::uint64_t{kMostSigned} + 1},
        {kMostUnsigned, kMostUnsigned},
        {0.5F, 0.5},
        {0.1, 0.1},
    };
    for (const auto& [value, expected] : cases) {
        EXPECT_EQ(rebuilt(value), expected);
    }
}

TEST(ValueBuilderTest, OtherKindsComeBackAsTheyWere) {
    for (const Value& value :
         std::vector<Value>{Null(), true, false, "", "text", Bytes(), Bytes{0, 1}, Timestamp{-0.5},
                            ValueList(), ValueMap(), ValueList{Null(), true},
                            ValueMap{{"a", ValueList{ValueMap{{"b", "c"}}, ValueMap()}},
                                     {"d", Bytes{1}},
                                     {"e", ValueMap{{"", ValueList{ValueList()}}}}}}) {
        EXPECT_EQ(rebuilt(value), value) << kindName(value);
    }
}

TEST(ValueBuilderTest, KindsWithoutAFormComeBackAsNull) {
    EXPECT_EQ(rebuilt(ValueMap{{"a", UniqueIdentifier{}}, {"b", Link{"a:b"}}, {"c", Error{}}}),
              Value(ValueMap{{"a", Null()}, {"b", Null()}, {"c", Null()}}));
}

TEST(ValueBuilderTest, KeysMayComeInAnyOrder) {
    ValueBuilder builder;
    builder.beginMap();
    for (const std::string_view key : {"b", "a", "b"}) {
        builder.key(key);
        builder.text(key);
    }
    builder.key("a");
    builder.null();
    builder.endMap();
    EXPECT_EQ(builder.take(), Value(ValueMap{{"a", Null()}, {"b", "b"}}));
}

} // namespace
