#include "platform/ValueBuilder.h"
#include "platform/formats/PropertyListCodec.h"
#include "tests/platform/formats/PropertyListBytes.h"

#include <gtest/gtest.h>

#include <limits>

namespace {

using platform::Bytes;
using platform::Timestamp;
using platform::Value;
using platform::ValueList;
using platform::ValueMap;
using support::fromHex;
using support::singleObject;
using support::toHex;

std::string written(const Value& value) {
    const platform::Result<Bytes> result = platform::writeBinaryPropertyList(value);
    return result ? toHex(result.value()) : "failed: " + result.error().description;
}

/// What comes back of a value; integers and reals have lost their width.
std::optional<Value> readBack(const Value& value) {
    const platform::Result<Bytes> result = platform::writeBinaryPropertyList(value);
    platform::ValueBuilder builder;
    if (!result || !platform::readBinaryPropertyList(result.value(), builder)) {
        return std::nullopt;
    }
    return builder.take();
}

/// The numbers in the trailer of a written value.
struct Widths {
    unsigned offset;
    unsigned reference;

    friend bool operator==(const Widths&, const Widths&) = default;
};

Widths widthsOf(const Value& value) {
    const platform::Result<Bytes> result = platform::writeBinaryPropertyList(value);
    const Bytes& bytes = result.value();
    return {bytes[bytes.size() - 26], bytes[bytes.size() - 25]};
}

struct Single {
    Value value;
    std::string_view object;
};

void expectObjects(const std::vector<Single>& singles) {
    for (const auto& [value, object] : singles) {
        EXPECT_EQ(written(value), toHex(singleObject(fromHex(object)))) << object;
    }
}

TEST(BinaryPropertyListWriterTest, WholeFileByteForByte) {
    EXPECT_EQ(written(true), "62706c6973743030"
                             "09"
                             "08"
                             "000000000000"
                             "01"
                             "01"
                             "0000000000000001"
                             "0000000000000000"
                             "0000000000000009");
    const ValueMap map = {{"b", ValueList{false, "x"}}, {"a", std::uint8_t{1}}};
    EXPECT_EQ(written(map), toHex(fromHex("62706c6973743030"
                                          "d2 01 03 02 04"
                                          "5161 1001 5162"
                                          "a2 05 06"
                                          "08 5178"
                                          "08 0d 0f 11 13 16 17"
                                          "000000000000 01 01"
                                          "0000000000000007 0000000000000000 0000000000000019")));
}

TEST(BinaryPropertyListWriterTest, IntegersTakeTheLeastWidth) {
    expectObjects({
        {std::int8_t{0}, "1000"},
        {std::uint8_t{255}, "10ff"},
        {std::int32_t{254}, "10fe"},
        {std::int16_t{256}, "110100"},
        {std::uint16_t{65534}, "11fffe"},
        {std::uint64_t{65535}, "11ffff"},
        {std::int32_t{65536}, "1200010000"},
        {std::uint32_t{4294967294}, "12fffffffe"},
        {std::uint32_t{4294967295}, "12ffffffff"},
        {std::int64_t{4294967296}, "130000000100000000"},
        {std::numeric_limits<std::int64_t>::max() - 1, "137ffffffffffffffe"},
        {std::numeric_limits<std::int64_t>::max(), "137fffffffffffffff"},
        {std::uint64_t{9223372036854775807U}, "137fffffffffffffff"},
        {std::uint64_t{9223372036854775808U}, "1400000000000000008000000000000000"},
        {std::numeric_limits<std::uint64_t>::max(), "140000000000000000ffffffffffffffff"},
    });
}

TEST(BinaryPropertyListWriterTest, NegativeIntegersTakeEightBytes) {
    expectObjects({
        {std::int8_t{-1}, "13ffffffffffffffff"},
        {std::int8_t{-128}, "13ffffffffffffff80"},
        {std::int16_t{-129}, "13ffffffffffffff7f"},
        {std::int32_t{-2147483647 - 1}, "13ffffffff80000000"},
        {std::numeric_limits<std::int64_t>::min(), "138000000000000000"},
    });
}

TEST(BinaryPropertyListWriterTest, OtherScalars) {
    expectObjects({
        {false, "08"},
        {true, "09"},
        {0.0, "230000000000000000"},
        {-0.0, "238000000000000000"},
        {1.5, "233ff8000000000000"},
        {1.5F, "233ff8000000000000"},
        {1700000000500.25, "234278bcfe569f4400"},
        {std::numeric_limits<double>::infinity(), "237ff0000000000000"},
        {std::numeric_limits<double>::quiet_NaN(), "237ff8000000000000"},
        {std::numeric_limits<double>::denorm_min(), "230000000000000001"},
        {Timestamp{0}, "330000000000000000"},
        {Timestamp{721692800.5}, "3341c5821440400000"},
        {Timestamp{-1}, "33bff0000000000000"},
        {Bytes(), "40"},
        {fromHex("00ff"), "4200ff"},
        {"", "50"},
        {"kst", "536b7374"},
        {"\x01\x7f", "52017f"},
        {"\u00e9", "6100e9"},
        {"a\u20ac\U0001f600", "64006120acd83dde00"},
    });
}

TEST(BinaryPropertyListWriterTest, CountsFollowFromFifteenOn) {
    for (const auto& [count, marker] :
         std::vector<std::pair<std::size_t, std::string>>{{14, "4e"},
                                                          {15, "4f100f"},
                                                          {16, "4f1010"},
                                                          {255, "4f10ff"},
                                                          {256, "4f110100"},
                                                          {65535, "4f11ffff"},
                                                          {65536, "4f1200010000"}}) {
        Bytes object = fromHex(marker);
        support::append(object, Bytes(count, 7));
        EXPECT_EQ(written(Bytes(count, 7)), toHex(singleObject(object))) << count;
    }
    expectObjects({
        {std::string(14, 'a'), "5e 6161616161616161616161616161"},
        {std::string(15, 'a'), "5f100f 616161616161616161616161616161"},
        {"\u00e9\u00e9\u00e9\u00e9\u00e9\u00e9\u00e9\u00e9\u00e9\u00e9\u00e9\u00e9\u00e9\u00e9",
         "6e 00e900e900e900e900e900e900e900e900e900e900e900e900e900e9"},
        {"\u00e9\u00e9\u00e9\u00e9\u00e9\u00e9\u00e9\u00e9\u00e9\u00e9\u00e9\u00e9\u00e9\u00e9"
         "\u00e9",
         "6f100f 00e900e900e900e900e900e900e900e900e900e900e900e900e900e900e9"},
    });
}

TEST(BinaryPropertyListWriterTest, ListsAndMapsOfEverySizeComeBack) {
    for (const std::size_t count : {0UL, 1UL, 14UL, 15UL, 16UL, 255UL, 256UL, 257UL, 5000UL}) {
        ValueList list;
        ValueMap map;
        for (std::size_t i = 0; i < count; ++i) {
            list.emplace_back(static_cast<std::int64_t>(i));
            map.emplace("key " + std::to_string(i), static_cast<std::int64_t>(i));
        }
        const Value both = ValueList{list, map};
        EXPECT_EQ(readBack(both), both) << count;
    }
}

TEST(BinaryPropertyListWriterTest, ReferencesTakeTheLeastWidth) {
    for (const auto& [objects, width] : std::vector<std::pair<std::size_t, unsigned>>{
             {1, 1}, {255, 1}, {256, 1}, {257, 2}, {65535, 2}, {65536, 2}, {65537, 4}}) {
        const Value list = ValueList(objects - 1, Value(true));
        EXPECT_EQ(widthsOf(list).reference, width) << objects;
        EXPECT_EQ(readBack(list), list);
    }
}

TEST(BinaryPropertyListWriterTest, OffsetsAreAsWideAsTheirTablesPlace) {
    for (const auto& [place, width] : std::vector<std::pair<std::size_t, unsigned>>{
             {254, 1}, {255, 1}, {256, 2}, {65535, 2}, {65536, 4}}) {
        // The magic, the marker and the count; a count beyond 255 takes one byte more.
        const std::size_t size = place - 8 - (place < 8 + 3 + 256 ? 3 : 4);
        EXPECT_EQ(widthsOf(Bytes(size)), (Widths{width, 1})) << place;
        EXPECT_EQ(readBack(Bytes(size)), Value(Bytes(size)));
    }
}

TEST(BinaryPropertyListWriterTest, KeysOfEveryScriptAreInTheOrderOfTheirBytes) {
    const ValueMap map = {
        {"", 1.0}, {"z", 2.0}, {"\u00e9", 3.0}, {"\uffee", 4.0}, {"\U0001f600", 5.0}};
    EXPECT_EQ(readBack(map), Value(map));
    std::vector<std::string> keys;
    for (const auto& [key, value] : map) {
        keys.push_back(key);
    }
    EXPECT_EQ(keys, (std::vector<std::string>{"", "z", "\u00e9", "\uffee", "\U0001f600"}));
}

TEST(BinaryPropertyListWriterTest, EveryKindComesBack) {
    const ValueMap map = {
        {"boolean", true},
        {"bytes", fromHex("000102")},
        {"date", Timestamp{721692800.25}},
        {"integer", std::int64_t{-5}},
        {"large", std::uint64_t{1} << 63U},
        {"list", ValueList{ValueList{}, ValueMap{}, Bytes{}, ""}},
        {"map", ValueMap{{"\u00e9", "\U0001f600"}}},
        {"real", 0.1},
        {"text", "plain"},
    };
    EXPECT_EQ(readBack(map), Value(map));
}

TEST(BinaryPropertyListWriterTest, OtherKindsAreRefusedByName) {
    const std::vector<std::pair<Value, std::string>> refused = {
        {platform::Null(), "null"},
        {platform::UniqueIdentifier(), "identifier"},
        {platform::Link{"https://example.net"}, "link"},
        {platform::Error(), "error"},
    };
    for (const auto& [value, kind] : refused) {
        const std::string line = "failed: a property list cannot hold a value of the kind " + kind;
        EXPECT_EQ(written(value), line);
        EXPECT_EQ(written(ValueMap{{"a", ValueList{true, value}}}), line);
    }
    const platform::Result<Bytes> result = platform::writeBinaryPropertyList(platform::Null());
    ASSERT_FALSE(result);
    EXPECT_EQ(result.error().domain, platform::kGenericErrorDomain);
    EXPECT_EQ(result.error().code, 0);
}

TEST(BinaryPropertyListWriterTest, TextsThatAreNoneAreRefused) {
    const std::string line =
        "failed: a property list cannot hold a text that is not UTF-8 or has a NUL";
    for (const std::string& text :
         {std::string("\xff"), std::string("long enough \xed\xa0\x80"), std::string(1, '\0'),
          std::string("eight by\0", 9), std::string("\u00e9\0", 3)}) {
        EXPECT_EQ(written(text), line);
        EXPECT_EQ(written(ValueMap{{text, true}}), line);
    }
}

TEST(BinaryPropertyListWriterTest, NestingIsBounded) {
    Value list = ValueList{};
    Value map = ValueMap{};
    for (std::size_t depth = 2; depth <= platform::kMaxPropertyListDepth; ++depth) {
        list = Value(ValueList{list});
        map = Value(ValueMap{{"k", map}});
    }
    EXPECT_EQ(readBack(list), list);
    EXPECT_EQ(readBack(map), map);
    EXPECT_EQ(readBack(ValueList(3, list).front()), list);
    // What lies beside each other is not in each other.
    for (const Value& each : {Value(ValueList{}), Value(ValueMap{})}) {
        const Value besides = ValueList(2 * platform::kMaxPropertyListDepth, each);
        EXPECT_EQ(readBack(besides), besides);
        EXPECT_EQ(readBack(ValueList{besides}), ValueList{besides});
    }
    const std::string line =
        "failed: a property list cannot hold lists and maps more than 128 deep in each other";
    EXPECT_EQ(written(ValueList{list}), line);
    EXPECT_EQ(written(ValueMap{{"k", map}}), line);
}

} // namespace
