#include "platform/ValueBuilder.h"
#include "platform/formats/JSONCodec.h"
#include "platform/formats/PropertyListCodec.h"
#include "tests/platform/formats/PropertyListBytes.h"
#include "tests/support/DeafSink.h"

#include <gtest/gtest.h>

#include <initializer_list>
#include <limits>

namespace {

using platform::Bytes;
using platform::Timestamp;
using platform::Value;
using platform::ValueList;
using platform::ValueMap;
using support::append;
using support::appendNumber;
using support::fromHex;
using support::HandMadePropertyList;
using support::singleObject;

std::optional<Value> read(const Bytes& bytes) {
    platform::ValueBuilder builder;
    if (!platform::readBinaryPropertyList(bytes, builder)) {
        return std::nullopt;
    }
    return builder.take();
}

std::optional<Value> readObjects(std::initializer_list<std::string_view> objects) {
    HandMadePropertyList file;
    for (const std::string_view object : objects) {
        file.objects.push_back(fromHex(object));
    }
    return read(file.bytes());
}

/// A marker with its count and so many references to one object each.
Bytes container(unsigned kind, std::size_t count, const std::vector<std::uint64_t>& references,
                std::size_t width) {
    Bytes object = {static_cast<std::uint8_t>((kind << 4U) | 0xfU), 0x12};
    appendNumber(object, count, 4);
    for (const std::uint64_t reference : references) {
        appendNumber(object, reference, width);
    }
    return object;
}

Bytes list(const std::vector<std::uint64_t>& references, std::size_t width = 1) {
    return container(0xa, references.size(), references, width);
}

Bytes map(const std::vector<std::uint64_t>& references, std::size_t width = 1) {
    return container(0xd, references.size() / 2, references, width);
}

TEST(BinaryPropertyListReaderTest, ScalarsOfEveryWidth) {
    const std::vector<std::pair<std::string, Value>> scalars = {
        {"08", false},
        {"09", true},
        {"10ff", std::int64_t{255}},
        {"11ffff", std::int64_t{65535}},
        {"110001", std::int64_t{1}},
        {"12ffffffff", std::int64_t{4294967295}},
        {"137fffffffffffffff", std::numeric_limits<std::int64_t>::max()},
        {"13ffffffffffffffff", std::int64_t{-1}},
        {"138000000000000000", std::numeric_limits<std::int64_t>::min()},
        {"1400000000000000000000000000000005", std::int64_t{5}},
        {"1400000000000000007fffffffffffffff", std::numeric_limits<std::int64_t>::max()},
        {"1400000000000000008000000000000000", std::uint64_t{1} << 63U},
        {"140000000000000000ffffffffffffffff", std::numeric_limits<std::uint64_t>::max()},
        {"14ffffffffffffffffffffffffffffffff", std::int64_t{-1}},
        {"14ffffffffffffffff8000000000000000", std::numeric_limits<std::int64_t>::min()},
        {"223fc00000", 1.5},
        {"233ff8000000000000", 1.5},
        {"33bff0000000000000", Timestamp{-1}},
        {"40", Bytes()},
        {"4200ff", fromHex("00ff")},
        {"4f100200ff", fromHex("00ff")},
        {"4f11000200ff", fromHex("00ff")},
        {"4f1200000002 00ff", fromHex("00ff")},
        {"4f130000000000000002 00ff", fromHex("00ff")},
        {"50", ""},
        {"536b7374", "kst"},
        {"60", ""},
        {"63 006b00730074", "kst"},
        {"63 00e9d83dde00", "\u00e9\U0001f600"},
        {"a0", ValueList()},
        {"d0", ValueMap()},
    };
    for (const auto& [object, value] : scalars) {
        EXPECT_EQ(read(singleObject(fromHex(object))), value) << object;
    }
}

TEST(BinaryPropertyListReaderTest, ObjectsThatAreNoneAreRefused) {
    for (const std::string_view object :
         {// Kinds that a value has not, and markers without meaning.
          "00", "01", "07", "0a", "0c", "0f", "7161", "8001", "90", "b0", "c0", "c100", "e0", "f0",
          // Integers beyond 64 bits and of no width.
          "14 0000000000000001 0000000000000000", "14 ffffffffffffffff 7fffffffffffffff",
          "14 8000000000000000 8000000000000000",
          "15 0000000000000000000000000000000000000000000000000000000000000000", "1f",
          // Reals and dates of other widths.
          "2000", "210000", "24 00000000000000000000000000000000", "300000", "3200000000",
          "34 00000000000000000000000000000000",
          // Texts that are none.
          "5180", "51ff", "5100", "526100", "61d800", "61dc00", "610000", "62d8000061",
          // Counts that are no integer or too wide.
          "4f", "4f09", "4f2000", "4f5161", "5f51 616161616161616161616161616161",
          "4f14 00000000000000000000000000000000", "4f1f00", "5f50", "6f08", "af08", "df08"}) {
        EXPECT_EQ(read(singleObject(fromHex(object))), std::nullopt) << object;
    }
}

TEST(BinaryPropertyListReaderTest, ContentMustBeInTheObjectTable) {
    for (const std::string_view object : {"10",
                                          "1100",
                                          "12000000",
                                          "1300000000000000",
                                          "14000000000000000000000000000000",
                                          "22000000",
                                          "2300000000000000",
                                          "3300000000000000",
                                          "41",
                                          "4e00",
                                          "4f10",
                                          "4f1001",
                                          "4f11ff",
                                          "4f12ffffffff00",
                                          "4f13ffffffffffffffff00",
                                          "4f137fffffffffffffff00",
                                          "4f13800000000000000000",
                                          "51",
                                          "5f13ffffffffffffffff00",
                                          "61",
                                          "6100",
                                          "6200e900",
                                          "6f13800000000000000000e9",
                                          "6f13ffffffffffffffff00e9",
                                          "a1",
                                          "af12ffffffff00",
                                          "af13ffffffffffffffff00",
                                          "d1",
                                          "d100",
                                          "d2000000",
                                          "df12ffffffff00",
                                          "df13800000000000000000",
                                          "df13ffffffffffffffff00"}) {
        EXPECT_EQ(read(singleObject(fromHex(object))), std::nullopt) << object;
    }
}

TEST(BinaryPropertyListReaderTest, ReferencesMustBeToObjects) {
    EXPECT_EQ(readObjects({"a101", "09"}), Value(ValueList{true}));
    EXPECT_EQ(readObjects({"a102", "09"}), std::nullopt);
    EXPECT_EQ(readObjects({"a1ff", "09"}), std::nullopt);
    EXPECT_EQ(readObjects({"d10102", "5161", "09"}), Value(ValueMap{{"a", true}}));
    EXPECT_EQ(readObjects({"d10103", "5161", "09"}), std::nullopt);
    EXPECT_EQ(readObjects({"d10302", "5161", "09"}), std::nullopt);
}

TEST(BinaryPropertyListReaderTest, EveryWidthOfReferencesAndOffsets) {
    for (std::size_t width = 1; width <= 8; ++width) {
        HandMadePropertyList file;
        file.offsetWidth = width;
        file.referenceWidth = width;
        file.objects = {list({1, 2}, width), fromHex("09"), map({3, 1}, width), fromHex("5161")};
        const Value value = ValueList{true, ValueMap{{"a", true}}};
        EXPECT_EQ(read(file.bytes()), value) << width;
        file.top = 2;
        EXPECT_EQ(read(file.bytes()), Value(ValueMap{{"a", true}}));
        file.top = 4;
        EXPECT_EQ(read(file.bytes()), std::nullopt);
        file.top = std::numeric_limits<std::uint64_t>::max();
        EXPECT_EQ(read(file.bytes()), std::nullopt);
    }
}

/// The file of one `true` with some bytes of its trailer replaced.
Bytes withTrailer(std::size_t at, std::string_view hex) {
    Bytes file = singleObject(fromHex("09"));
    const Bytes bytes = fromHex(hex);
    std::copy(bytes.begin(), bytes.end(),
              file.begin() + static_cast<std::ptrdiff_t>(file.size() - 32 + at));
    return file;
}

TEST(BinaryPropertyListReaderTest, TrailerMustFitTheFile) {
    EXPECT_EQ(read(withTrailer(0, "ffffffffffff")), Value(true));
    for (const std::string_view width : {"00", "02", "08", "09", "ff"}) {
        EXPECT_EQ(read(withTrailer(6, width)), std::nullopt) << width;
    }
    for (const std::string_view width : {"00", "09", "ff"}) {
        EXPECT_EQ(read(withTrailer(7, width)), std::nullopt) << width;
    }
    for (const std::string_view count :
         {"0000000000000000", "0000000000000002", "8000000000000000", "ffffffffffffffff"}) {
        EXPECT_EQ(read(withTrailer(8, count)), std::nullopt) << count;
    }
    for (const std::string_view place :
         {"0000000000000000", "0000000000000007", "0000000000000008", "000000000000000a",
          "000000000000000b", "7fffffffffffffff", "ffffffffffffffff"}) {
        EXPECT_EQ(read(withTrailer(24, place)), std::nullopt) << place;
    }
}

TEST(BinaryPropertyListReaderTest, OffsetsOfSeveralBytesMustFitTheFile) {
    for (const std::size_t width : {1U, 2U, 4U, 8U}) {
        HandMadePropertyList list;
        list.offsetWidth = width;
        list.objects = {fromHex("09")};
        Bytes file = list.bytes();
        EXPECT_EQ(read(file), Value(true)) << width;
        file[file.size() - 17] = 2;
        EXPECT_EQ(read(file), std::nullopt) << width;
    }
}

TEST(BinaryPropertyListReaderTest, OffsetsMustBeInTheObjectTable) {
    Bytes file = singleObject(fromHex("09"));
    std::uint8_t& offset = file[9];
    ASSERT_EQ(offset, 8);
    for (unsigned place = 0; place <= 0xff; ++place) {
        offset = static_cast<std::uint8_t>(place);
        EXPECT_EQ(read(file).has_value(), place == 8) << place;
    }
}

TEST(BinaryPropertyListReaderTest, GapsAndOverlapsDoNotMatter) {
    // The text's bytes 08 and 09 are objects, too.
    HandMadePropertyList file;
    file.objects = {fromHex("a20102"), fromHex("52"), fromHex("08"), fromHex("09 ffff")};
    EXPECT_EQ(read(file.bytes()), Value(ValueList{"\x08\x09", false}));
}

TEST(BinaryPropertyListReaderTest, OnlyThisVersionIsRead) {
    HandMadePropertyList file;
    file.objects = {fromHex("09")};
    EXPECT_EQ(read(file.bytes()), Value(true));
    for (const char* magic : {"bplist01", "bplist0\0", "Bplist00", "bplist10", "\0plist00"}) {
        file.magic = std::string(magic, 8);
        EXPECT_EQ(read(file.bytes()), std::nullopt) << magic;
    }
    EXPECT_EQ(read(Bytes()), std::nullopt);
    EXPECT_EQ(read(fromHex("62706c6973743030")), std::nullopt);
}

TEST(BinaryPropertyListReaderTest, KeysMustBeTexts) {
    for (const std::string_view key : {"09", "1001", "40", "a0", "00", "5180", "61d800"}) {
        EXPECT_EQ(readObjects({"d10102", key, "09"}), std::nullopt) << key;
        // Behind a key that makes the map unsorted.
        EXPECT_EQ(readObjects({"d3010203 040404", "517a", "5161", key, "09"}), std::nullopt) << key;
    }
}

TEST(BinaryPropertyListReaderTest, UnsortedMapsAreSorted) {
    EXPECT_EQ(readObjects({"d3010203 040506", "5162", "5161", "6100e9", "1002", "1001", "1003"}),
              Value(ValueMap{
                  {"a", std::int64_t{1}}, {"b", std::int64_t{2}}, {"\u00e9", std::int64_t{3}}}));
}

/// Writes the keys down in the order in which they come.
class KeySink final : public support::DeafSink {
  public:
    void beginMap() override { keys += "{"; }
    void key(std::string_view key) override { keys.append(key); }
    void repeatedKey(std::string_view key, std::string& form) override {
        ++repeated;
        EXPECT_TRUE(form.empty() || form == key) << form;
        form = key;
        this->key(key);
    }
    void endMap() override { keys += "}"; }
    void boolean(bool value) override { keys += value ? "+" : "-"; }

    std::string keys;
    /// How many of the keys came as repeated ones.
    int repeated = 0;
};

TEST(BinaryPropertyListReaderTest, SinkSeesKeysSortedAndOnce) {
    struct Case {
        std::vector<std::uint64_t> references;
        std::string keys;
    };
    // 1 is "a", 2 is "b", 3 is "a" in UTF-16, 4 is the accented letter, 5 is false, 6 is true.
    for (const Case& one : std::vector<Case>{
             {{1, 2, 5, 6}, "{a-b+}"},
             {{2, 1, 5, 6}, "{a+b-}"},
             {{1, 1, 5, 6}, "{a+}"},
             {{1, 1, 6, 5}, "{a-}"},
             {{1, 3, 5, 6}, "{a+}"},
             {{3, 1, 5, 6}, "{a+}"},
             {{2, 1, 2, 1, 5, 5, 6, 6}, "{a+b+}"},
             {{4, 2, 3, 5, 5, 6}, "{a+b-\u00e9-}"},
             {{1, 2, 2, 6, 6, 5}, "{a+b-}"},
         }) {
        HandMadePropertyList file;
        file.objects = {map(one.references), fromHex("5161"), fromHex("5162"), fromHex("610061"),
                        fromHex("6100e9"),   fromHex("08"),   fromHex("09")};
        KeySink sink;
        EXPECT_TRUE(platform::readBinaryPropertyList(file.bytes(), sink));
        EXPECT_EQ(sink.keys, one.keys);
    }
}

TEST(BinaryPropertyListReaderTest, CyclesAreRefused) {
    EXPECT_EQ(readObjects({"a100"}), std::nullopt);
    EXPECT_EQ(readObjects({"ae 0000000000000000000000000000"}), std::nullopt);
    EXPECT_EQ(readObjects({"a101", "a102", "a100"}), std::nullopt);
    EXPECT_EQ(readObjects({"d10100", "5161"}), std::nullopt);
    EXPECT_EQ(readObjects({"d2010200 00", "5162", "5161"}), std::nullopt);
    EXPECT_EQ(readObjects({"a20102", "09", "d10300", "5161"}), std::nullopt);
}

TEST(BinaryPropertyListReaderTest, NestingIsBounded) {
    for (const std::size_t depth :
         {platform::kMaxPropertyListDepth - 1, platform::kMaxPropertyListDepth,
          platform::kMaxPropertyListDepth + 1, 60000UL}) {
        HandMadePropertyList lists;
        lists.offsetWidth = 4;
        lists.referenceWidth = 2;
        HandMadePropertyList maps = lists;
        for (std::size_t i = 1; i < depth; ++i) {
            lists.objects.push_back(list({i}, 2));
            maps.objects.push_back(map({depth, i}, 2));
        }
        lists.objects.push_back(fromHex("a0"));
        maps.objects.push_back(fromHex("d0"));
        maps.objects.push_back(fromHex("516b"));
        const bool isRead = depth <= platform::kMaxPropertyListDepth;
        EXPECT_EQ(read(lists.bytes()).has_value(), isRead) << depth;
        EXPECT_EQ(read(maps.bytes()).has_value(), isRead) << depth;
    }
}

TEST(BinaryPropertyListReaderTest, ListsThatDoubleAtEachLevelAreRefusedSoon) {
    HandMadePropertyList lists;
    HandMadePropertyList maps;
    for (std::uint64_t i = 1; i <= 60; ++i) {
        lists.objects.push_back(list({i, i}));
        // Two keys, first the greater one: the map has to be sorted at every visit.
        maps.objects.push_back(map({62, 61, i, i}));
    }
    lists.objects.push_back(fromHex("09"));
    maps.objects.push_back(fromHex("09"));
    maps.objects.push_back(fromHex("5161"));
    maps.objects.push_back(fromHex("5162"));
    maps.offsetWidth = 2;
    lists.offsetWidth = 2;
    EXPECT_EQ(read(lists.bytes()), std::nullopt);
    EXPECT_EQ(read(maps.bytes()), std::nullopt);
}

/// A list of `count` references to one object, which takes `work` and is not behind a reference.
bool readsSharedObject(std::size_t count, const std::vector<Bytes>& objects) {
    HandMadePropertyList file;
    file.offsetWidth = 4;
    file.objects = {list(std::vector<std::uint64_t>(count, 1))};
    file.objects.insert(file.objects.end(), objects.begin(), objects.end());
    KeySink sink;
    return platform::readBinaryPropertyList(file.bytes(), sink);
}

TEST(BinaryPropertyListReaderTest, WorkIsBounded) {
    constexpr std::size_t kElements = 1000;
    const std::vector<Bytes> lists = {list(std::vector<std::uint64_t>(kElements, 2)),
                                      fromHex("09")};
    Bytes text = fromHex("5f1103e8");
    append(text, Bytes(kElements, 'x'));
    // The size of the file but for the first list's references, and what one reference costs.
    const auto most = [](std::size_t size, std::size_t cost) {
        std::size_t count = 0;
        while (cost * (count + 1) <= 1024UL * 1024 + 16 * (size + count + 1)) {
            ++count;
        }
        return count;
    };
    constexpr std::size_t kFrame = 8 + 6 + 32;
    const std::size_t mostLists = most(kFrame + lists[0].size() + 1 + 3 * 4, 16 + kElements * 16);
    EXPECT_TRUE(readsSharedObject(mostLists, lists));
    EXPECT_FALSE(readsSharedObject(mostLists + 1, lists));
    const std::size_t mostTexts = most(kFrame + text.size() + 2 * 4, 16 + kElements);
    EXPECT_TRUE(readsSharedObject(mostTexts, {text}));
    EXPECT_FALSE(readsSharedObject(mostTexts + 1, {text}));
    text[0] = 0x4f;
    EXPECT_TRUE(readsSharedObject(mostTexts, {text}));
    EXPECT_FALSE(readsSharedObject(mostTexts + 1, {text}));
    // A key is read twice. It depends on its length which of the two is too much.
    for (std::size_t length = kElements; length < kElements + 8; ++length) {
        Bytes key = {0x5f, 0x11, static_cast<std::uint8_t>(length >> 8U),
                     static_cast<std::uint8_t>(length)};
        append(key, Bytes(length, 'x'));
        const std::vector<Bytes> maps = {map({2, 3}), key, fromHex("09")};
        const std::size_t mostMaps =
            most(kFrame + maps[0].size() + key.size() + 1 + 4 * 4, 16 + 2 * 16 + 2 * length);
        EXPECT_TRUE(readsSharedObject(mostMaps, maps)) << length;
        EXPECT_FALSE(readsSharedObject(mostMaps + 1, maps)) << length;
    }
}

TEST(BinaryPropertyListReaderTest, ObjectsOfOneFileMayBeSharedByUsualMeasure) {
    EXPECT_TRUE(readsSharedObject(60'000, {fromHex("09")}));
    EXPECT_TRUE(readsSharedObject(300'000, {fromHex("09")}));
    EXPECT_TRUE(readsSharedObject(10'000, {fromHex("5f1028"
                                                   "6161616161616161616161616161616161616161"
                                                   "6161616161616161616161616161616161616161")}));
}

/// A file of such objects, the first of which is the whole value.
Bytes fileOf(std::initializer_list<std::string_view> objects) {
    HandMadePropertyList file;
    for (const std::string_view object : objects) {
        file.objects.push_back(fromHex(object));
    }
    return file.bytes();
}

/// How many keys of the file were known.
int knownKeysIn(const Bytes& file, platform::KnownKeys& known) {
    KeySink sink;
    EXPECT_TRUE(platform::readBinaryPropertyList(file, sink, &known));
    return sink.repeated;
}

/// The file as JSON, or none.
std::optional<std::string> asJSON(const Bytes& file, platform::KnownKeys* known) {
    platform::JSONWriter writer;
    if (!platform::readBinaryPropertyList(file, writer, known)) {
        return std::nullopt;
    }
    const auto text = writer.finish();
    return text ? std::string(text.value().view()) : "nothing";
}

TEST(BinaryPropertyListReaderTest, KeysAreKnownWhenTheyCameInThatOrderBefore) {
    platform::KnownKeys known;
    EXPECT_EQ(knownKeysIn(fileOf({"d2010203 04", "5161", "5162", "08", "09"}), known), 0);
    EXPECT_EQ(knownKeysIn(fileOf({"d2010203 04", "5161", "5162", "08", "09"}), known), 2);
    // Wherever they stand, and whatever their values are.
    EXPECT_EQ(
        knownKeysIn(fileOf({"d2030401 02", "33 3ff0000000000000", "a0", "5161", "5162"}), known),
        2);
    const Bytes withEmptyKey = fileOf({"d2010203 04", "50", "5161", "08", "09"});
    EXPECT_EQ(knownKeysIn(withEmptyKey, known), 0);
    EXPECT_EQ(knownKeysIn(withEmptyKey, known), 2);
    // One of them alone is another set.
    const Bytes alone = fileOf({"d10103", "5161", "5162", "08"});
    EXPECT_EQ(knownKeysIn(alone, known), 0);
    EXPECT_EQ(knownKeysIn(alone, known), 1);
    // What has to be sorted, or is in UTF-16, is not kept.
    for (const Bytes& other : {fileOf({"d2020103 04", "5161", "5162", "08", "09"}),
                               fileOf({"d2010203 04", "5161", "610062", "08", "09"})}) {
        EXPECT_EQ(knownKeysIn(other, known), 0);
        EXPECT_EQ(knownKeysIn(other, known), 0);
    }
    // In a map that is inside another value they are not kept, nor known.
    const Bytes inside = fileOf({"a101", "d10203", "5161", "08"});
    EXPECT_EQ(knownKeysIn(inside, known), 0);
    EXPECT_EQ(knownKeysIn(inside, known), 0);
}

TEST(BinaryPropertyListReaderTest, KeysOfAFewKindsOfMapsAreKept) {
    const std::vector<Bytes> files = {
        fileOf({"d10102", "5161", "08"}), fileOf({"d10102", "5162", "08"}),
        fileOf({"d10102", "5163", "08"}), fileOf({"d10102", "5164", "08"}),
        fileOf({"d10102", "5165", "08"})};
    platform::KnownKeys known;
    for (std::size_t i = 0; i < 4; ++i) {
        EXPECT_EQ(knownKeysIn(files[i], known), 0) << i;
    }
    for (std::size_t i = 0; i < 4; ++i) {
        EXPECT_EQ(knownKeysIn(files[i], known), 1) << i;
    }
    // The fifth takes the place of the first, which then takes that of the second.
    EXPECT_EQ(knownKeysIn(files[4], known), 0);
    EXPECT_EQ(knownKeysIn(files[4], known), 1);
    EXPECT_EQ(knownKeysIn(files[1], known), 1);
    EXPECT_EQ(knownKeysIn(files[0], known), 0);
    EXPECT_EQ(knownKeysIn(files[1], known), 0);
    EXPECT_EQ(knownKeysIn(files[3], known), 1);
}

TEST(BinaryPropertyListReaderTest, WithKnownKeysAFileIsReadAsWithout) {
    const std::vector<Bytes> files = {
        // Two keys; in the other order; one with another byte; one more; one less; one twice.
        fileOf({"d2010203 04", "5161", "5162", "1007", "09"}),
        fileOf({"d2020103 04", "5161", "5162", "1007", "09"}),
        fileOf({"d2010203 04", "5161", "5163", "1007", "09"}),
        fileOf({"d3010205 030404", "5161", "5162", "1007", "09", "5164"}),
        fileOf({"d10103", "5161", "5162", "1007", "09"}),
        fileOf({"d2010103 04", "5161", "5162", "1007", "09"}),
        // A longer one that begins alike; one in UTF-16; counts that follow; one with a quote.
        fileOf({"d2010203 04", "5161", "526262", "1007", "09"}),
        fileOf({"d2010203 04", "610061", "5162", "1007", "09"}),
        fileOf({"d2010203 04", "5f100161", "5162", "1007", "09"}),
        fileOf({"d2010203 04", "5122", "5162", "1007", "09"}),
        // A map in a map, both with the keys; none; a list of one.
        fileOf({"d2010203 05", "5161", "5162", "d2010204 05", "40", "09"}),
        fileOf({"d0"}),
        fileOf({"a101", "d2020304 05", "5161", "5162", "1007", "09"}),
        // The last key at the end of the objects, and one that would go beyond.
        fileOf({"d2020403 01", "09", "5161", "1007", "5162"}),
        fileOf({"d2020403 01", "09", "5161", "1007", "51"}),
        // A value that is none; a reference to nothing; a key that is none; no map.
        fileOf({"d2010203 04", "5161", "5162", "1007", "0a"}),
        fileOf({"d2010203 05", "5161", "5162", "1007", "09"}),
        fileOf({"d2010503 04", "5161", "5162", "1007", "09"}),
        fileOf({"d2010403 04", "5161", "5162", "1007", "09"}),
        fileOf({"d2010203 04", "5161", "5180", "1007", "09"}),
        Bytes(),
    };
    platform::KnownKeys known;
    for (const Bytes& first : files) {
        for (const Bytes& second : files) {
            EXPECT_EQ(asJSON(first, &known), asJSON(first, nullptr));
            EXPECT_EQ(asJSON(second, &known), asJSON(second, nullptr));
        }
    }
    EXPECT_EQ(asJSON(files[0], &known), R"({"a":7,"b":true})");
    EXPECT_EQ(asJSON(files[10], &known), R"({"a":{"b":true},"b":true})");
}

/// A map with one entry, a list of `count` references to one text, each of them 1000 bytes.
Bytes fileOfWork(std::size_t keyLength, std::size_t count) {
    constexpr std::size_t kTextLength = 1000;
    const auto text = [](std::size_t length) {
        Bytes object = {0x5f, 0x11};
        appendNumber(object, length, 2);
        append(object, Bytes(length, 'x'));
        return object;
    };
    HandMadePropertyList file;
    file.offsetWidth = 4;
    file.objects = {map({1, 2}), text(keyLength), list(std::vector<std::uint64_t>(count, 3)),
                    text(kTextLength)};
    return file.bytes();
}

TEST(BinaryPropertyListReaderTest, KnownKeysAreAsMuchWork) {
    for (std::size_t length = 1000; length < 1008; ++length) {
        const std::size_t sizeWithout = fileOfWork(length, 0).size();
        std::size_t most = 0;
        while (2 * 16 + 2 * length + (most + 1) * (16 + 1000) <=
               platform::propertyListWork(sizeWithout + most + 1)) {
            ++most;
        }
        platform::KnownKeys known;
        EXPECT_EQ(knownKeysIn(fileOfWork(length, 0), known), 0);
        EXPECT_EQ(knownKeysIn(fileOfWork(length, most), known), 1) << length;
        for (platform::KnownKeys* const keys :
             {&known, static_cast<platform::KnownKeys*>(nullptr)}) {
            KeySink sink;
            EXPECT_FALSE(platform::readBinaryPropertyList(fileOfWork(length, most + 1), sink, keys))
                << length;
        }
    }
}

TEST(BinaryPropertyListReaderTest, WorkMayEndAtAKnownKey) {
    constexpr std::size_t kTextLength = 1000;
    constexpr std::size_t kKeyLength = 3000;
    const auto text = [](std::size_t length, std::uint8_t character) {
        Bytes object = {0x5f, 0x11};
        appendNumber(object, length, 2);
        append(object, Bytes(length, character));
        return object;
    };
    // Behind the first value there is less left than the second key takes.
    const auto fileWith = [&](std::size_t count) {
        HandMadePropertyList file;
        file.offsetWidth = 4;
        file.objects = {map({1, 2, 3, 5}),      text(1, 'x'),
                        text(kKeyLength, 'y'),  list(std::vector<std::uint64_t>(count, 4)),
                        text(kTextLength, 'x'), Bytes{0x09}};
        return file.bytes();
    };
    const std::size_t sizeWithout = fileWith(0).size();
    std::size_t most = 0;
    while (4 * 16 + 2 + (most + 1) * (16 + kTextLength) <=
           platform::propertyListWork(sizeWithout + most + 1)) {
        ++most;
    }
    platform::KnownKeys known;
    EXPECT_EQ(knownKeysIn(fileWith(0), known), 0);
    EXPECT_EQ(knownKeysIn(fileWith(most - 6), known), 2);
    KeySink sink;
    EXPECT_FALSE(platform::readBinaryPropertyList(fileWith(most), sink, &known));
    EXPECT_EQ(sink.repeated, 1);
}

TEST(BinaryPropertyListReaderTest, KeysThatTakeMoreThanTheirFileAreNotKept) {
    // Fifteen texts in each other, the shortest first: together they have 15 markers and 105
    // characters.
    constexpr std::size_t kSizeOfKeys = 120;
    const auto fileWith = [](std::size_t padding) {
        HandMadePropertyList file;
        std::vector<std::uint64_t> references;
        for (std::uint64_t key = 15; key > 0; --key) {
            references.push_back(key);
        }
        references.insert(references.end(), 15, 16);
        file.objects = {map(references)};
        for (unsigned length = 15; length > 0; --length) {
            file.objects.push_back({static_cast<std::uint8_t>(0x50 + length - 1)});
        }
        file.objects.push_back(Bytes{0x09});
        append(file.objects.back(), Bytes(padding));
        return file.bytes();
    };
    const std::size_t least = fileWith(0).size();
    ASSERT_LT(least, kSizeOfKeys);
    for (const std::size_t size : {kSizeOfKeys - 1, kSizeOfKeys, kSizeOfKeys + 1}) {
        platform::KnownKeys known;
        const Bytes file = fileWith(size - least);
        ASSERT_EQ(file.size(), size);
        EXPECT_EQ(knownKeysIn(file, known), 0);
        EXPECT_EQ(knownKeysIn(file, known), size < kSizeOfKeys ? 0 : 15);
    }
}

/// A small file with an object of every kind.
Bytes sample() {
    const Value value = ValueMap{
        {"a", ValueList{true, Timestamp{0.25}, 0.5, fromHex("00ff")}},
        {"b", ValueList{std::uint16_t{300}, std::int8_t{-1}, std::uint64_t{1} << 63U}},
        {"c", ValueMap{{"16 bytes of text", "\u00e9"}}},
    };
    return platform::writeBinaryPropertyList(value).value();
}

TEST(BinaryPropertyListReaderTest, EveryTruncationIsRefused) {
    const Bytes whole = sample();
    ASSERT_TRUE(read(whole));
    for (std::size_t size = 0; size < whole.size(); ++size) {
        EXPECT_EQ(read(Bytes(whole.begin(), whole.begin() + static_cast<std::ptrdiff_t>(size))),
                  std::nullopt)
            << size;
    }
}

TEST(BinaryPropertyListReaderTest, EverySpoiltByteIsRefusedOrGivesAValueThatCanBeWritten) {
    const Bytes whole = sample();
    std::size_t refused = 0;
    for (std::size_t at = 0; at < whole.size(); ++at) {
        for (unsigned change = 1; change <= 0xff; ++change) {
            Bytes spoilt = whole;
            spoilt[at] = static_cast<std::uint8_t>(spoilt[at] ^ change);
            const std::optional<Value> value = read(spoilt);
            if (!value) {
                ++refused;
            } else {
                EXPECT_TRUE(platform::writeBinaryPropertyList(*value)) << at << ' ' << change;
            }
        }
    }
    EXPECT_GT(refused, whole.size() * 0xff / 2);
}

} // namespace
