#include "platform/formats/PropertyListCodec.h"
#include "tests/support/DeafSink.h"

#include <gtest/gtest.h>

#include <limits>

namespace {

using platform::Bytes;
using platform::Timestamp;
using platform::Value;
using platform::ValueList;
using platform::ValueMap;

std::optional<Value> readAll(const std::string& text) {
    platform::PropertyListCodec propertyLists;
    return propertyLists.value(Bytes(text.begin(), text.end()));
}

std::string document(const std::string& body) {
    std::string text = "<?xml version=\"1.0\" encoding=\"UTF-8\"?>\n"
                       "<!DOCTYPE plist PUBLIC \"-//x//DTD PLIST 1.0//EN\" \"http://x/p.dtd\">\n"
                       "<plist version=\"1.0\">";
    text += body;
    text += "</plist>\n";
    return text;
}

std::optional<Value> read(const std::string& body) {
    return readAll(document(body));
}

TEST(XMLPropertyListReaderTest, EveryKindIsReadFromXML) {
    const std::vector<std::pair<std::string, Value>> values = {
        {"<true/>", true},
        {"<false/>", false},
        {"<integer>0</integer>", std::int64_t{0}},
        {"<integer>-1</integer>", std::int64_t{-1}},
        {"<integer> 12 </integer>", std::int64_t{12}},
        {"<integer>0x1F</integer>", std::int64_t{31}},
        {"<integer>9223372036854775807</integer>", std::numeric_limits<std::int64_t>::max()},
        {"<integer>9223372036854775808</integer>", std::uint64_t{1} << 63U},
        {"<integer>18446744073709551614</integer>", std::uint64_t{18446744073709551614U}},
        {"<integer>18446744073709551615</integer>", std::numeric_limits<std::uint64_t>::max()},
        {"<integer>-2</integer>", std::int64_t{-2}},
        {"<integer>-9223372036854775807</integer>", std::numeric_limits<std::int64_t>::min() + 1},
        {"<integer>-9223372036854775808</integer>", std::numeric_limits<std::int64_t>::min()},
        {"<real>1.5</real>", 1.5},
        {"<real>-1e300</real>", -1e300},
        {"<real>7</real>", 7.0},
        {"<string/>", ""},
        {"<string></string>", ""},
        {"<string> a &lt;&amp;&#233;&#x1F600; </string>", " a <&\u00e9\U0001f600 "},
        {"<string>a<![CDATA[<b>]]>c<!-- d --></string>", "a<b>c"},
        {"<string>\u20ac</string>", "\u20ac"},
        {"<data/>", Bytes()},
        {"<data>\n AAH/\n </data>", Bytes{0, 1, 255}},
        {"<date>2001-01-01T00:00:00Z</date>", Timestamp{0}},
        {"<date>2023-11-14T22:13:20Z</date>", Timestamp{721692800}},
        {"<date>2100-01-01T00:00:00Z</date>", Timestamp{3124137600}},
        {"<date>1900-01-01T00:00:00Z</date>", Timestamp{-3187296000}},
        {"<array/>", ValueList()},
        {"<array><true/><array><integer>1</integer></array></array>",
         ValueList{true, ValueList{std::int64_t{1}}}},
        {"<dict/>", ValueMap()},
        {"<dict><key>b</key><true/><key>a</key><dict><key></key><false/></dict></dict>",
         ValueMap{{"a", ValueMap{{"", false}}}, {"b", true}}},
    };
    for (const auto& [body, value] : values) {
        EXPECT_EQ(read(body), value) << body;
    }
}

TEST(XMLPropertyListReaderTest, DocumentNeedsNoPreamble) {
    EXPECT_EQ(readAll("<plist><true/></plist>"), Value(true));
    EXPECT_EQ(readAll("<true/>"), Value(true));
}

TEST(XMLPropertyListReaderTest, LaterValueOfAKeyCounts) {
    EXPECT_EQ(read("<dict><key>a</key><true/><key>b</key><true/><key>a</key><false/></dict>"),
              Value(ValueMap{{"a", false}, {"b", true}}));
}

TEST(XMLPropertyListReaderTest, KeysComeInTheOrderOfTheirBytes) {
    const std::string xml =
        document("<dict><key>\u00e9</key><true/><key>z</key><true/><key>B</key><true/>"
                 "<key>a</key><true/></dict>");
    struct Keys final : support::DeafSink {
        void key(std::string_view key) override { keys.emplace_back(key); }

        std::vector<std::string> keys;
    } sink;
    EXPECT_TRUE(platform::readXMLPropertyList(Bytes(xml.begin(), xml.end()), sink));
    EXPECT_EQ(sink.keys, (std::vector<std::string>{"B", "a", "z", "\u00e9"}));
}

TEST(XMLPropertyListReaderTest, WhatIsNoXMLPropertyListIsNone) {
    for (const std::string body :
         {"", "x", "<foo/>", "<null/>", "<array><foo/></array>", "<array><true/>", "<dict>",
          "<dict><true/></dict>", "<dict><key>a</key><key>b</key><true/></dict>",
          "<array><dict></array></dict>", "<string>&unknown;</string>", "<string>\xff</string>",
          "<string>&#xD800;</string>", "<dict><key>\xc3</key><true/></dict>",
          "<array><string>\xff</string></array>"}) {
        EXPECT_EQ(read(body), std::nullopt) << body;
    }
    for (const std::string text : {"<", "<plist/>", "<plist></plist>", "<html><body/></html>",
                                   "<?xml", "<!--", "<plist><string>a"}) {
        EXPECT_EQ(readAll(text), std::nullopt) << text;
    }
    EXPECT_EQ(read(std::string("<string>a\0b</string>", 20)), std::nullopt);
    EXPECT_EQ(readAll(document("<true/>") + std::string(1, '\0')), std::nullopt);
}

TEST(PropertyListCodecTest, MagicTellsTheBinaryForm) {
    platform::PropertyListCodec propertyLists;
    const Value value =
        ValueMap{{"large", std::uint64_t{1} << 63U}, {"negative", std::int64_t{-1}}};
    const Bytes bytes = platform::writeBinaryPropertyList(value).value();
    EXPECT_EQ(propertyLists.binary(value).value(), bytes);
    EXPECT_EQ(propertyLists.value(bytes), value);
    EXPECT_EQ(readAll("bplist00<plist><true/></plist>"), std::nullopt);
}

TEST(PropertyListCodecTest, MagicTellsTheBinaryFormAlsoWithKnownKeys) {
    platform::PropertyListCodec propertyLists;
    platform::KnownKeys known;
    const Value value = ValueMap{{"key", true}};
    const std::string XML = document("<dict><key>key</key><true/></dict>");
    for (const Bytes& bytes :
         {platform::writeBinaryPropertyList(value).value(), Bytes(XML.begin(), XML.end())}) {
        platform::ValueBuilder builder;
        ASSERT_TRUE(propertyLists.readKnowing(known, bytes, builder));
        EXPECT_EQ(builder.take(), value);
    }
    platform::ValueBuilder builder;
    EXPECT_FALSE(propertyLists.readKnowing(known, Bytes{'x'}, builder));
}

TEST(XMLPropertyListReaderTest, SizeOfXMLIsBounded) {
    const std::size_t frame = document("<string></string>").size();
    const std::size_t most = platform::kMaxXMLPropertyListSize - frame;
    for (const std::size_t size : {most - 1, most}) {
        const std::string text(size, 'x');
        EXPECT_EQ(read("<string>" + text + "</string>"), Value(text));
    }
    EXPECT_EQ(read("<string>" + std::string(most + 1, 'x') + "</string>"), std::nullopt);
}

std::string repeated(const std::string& text, std::size_t count) {
    std::string result;
    for (std::size_t i = 0; i < count; ++i) {
        result += text;
    }
    return result;
}

TEST(XMLPropertyListReaderTest, NestingOfXMLIsBounded) {
    constexpr std::size_t kMost = platform::kMaxPropertyListDepth;
    for (const std::size_t depth : {kMost - 1, kMost, kMost + 1, 5000UL, 10'000UL, 60'000UL}) {
        const bool isRead = depth <= kMost;
        EXPECT_EQ(read(repeated("<array>", depth) + repeated("</array>", depth)).has_value(),
                  isRead)
            << depth;
        const std::string maps =
            repeated("<dict><key>k</key>", depth) + "<true/>" + repeated("</dict>", depth);
        EXPECT_EQ(read(maps).has_value(), isRead) << depth;
        EXPECT_EQ(read(repeated("<array>", depth)), std::nullopt);
    }
    // What lies beside each other is not in each other.
    for (const std::size_t depth : {1UL, 2UL}) {
        EXPECT_TRUE(read(repeated("<array>", depth) + repeated("<array/>", 2 * kMost) +
                         repeated("</array>", depth)))
            << depth;
    }
}

TEST(XMLPropertyListReaderTest, NumberOfContainersInXMLIsBounded) {
    constexpr std::size_t kMost = platform::kMaxXMLPropertyListContainers - 1;
    const auto isRead = [](std::size_t count) {
        std::string body = "<array>";
        body += repeated("<dict/>", count);
        body += "</array>";
        return read(body).has_value();
    };
    EXPECT_TRUE(isRead(kMost - 1));
    EXPECT_TRUE(isRead(kMost));
    EXPECT_FALSE(isRead(kMost + 1));
}

} // namespace
