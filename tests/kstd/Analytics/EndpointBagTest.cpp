#include "base/Concat.h"
#include "kstd/Analytics/ServerDocuments.h"
#include "platform/fake/FakeFormats.h"

#include <gtest/gtest.h>

namespace kstd {
namespace {

using Texts = std::vector<std::string>;

std::optional<EndpointBag> bagOf(const std::string& JSON) {
    platform::FakeJSON reader;
    const auto value = reader.read(JSON);
    EXPECT_TRUE(value) << JSON;
    return EndpointBag::fromValue(value.value());
}

EndpointBag bagWith(const std::string& key, const std::string& value) {
    const auto bag = bagOf(base::concat("{\"", key, "\":", value, "}"));
    EXPECT_TRUE(bag);
    return bag.value_or(EndpointBag());
}

TEST(EndpointBagTest, OnlyAnObjectIsABag) {
    for (const char* const JSON : {"[]", "[{}]", "1", "1.5", "\"{}\"", "true", "null"}) {
        EXPECT_FALSE(bagOf(JSON)) << JSON;
    }
    EXPECT_TRUE(bagOf("{}"));
}

TEST(EndpointBagTest, EveryKey) {
    const auto bag = bagOf(R"({"disabled":true,"sendDisabled":true,"postFrequency":86400000,
        "blacklistedEvents":["a","b"],"blacklistedFields":["c"],"metricsBase":{"d":1},
        "metricsUrl":"https://x","unknown":{}})");
    ASSERT_TRUE(bag);
    EXPECT_TRUE(bag->disabled);
    EXPECT_TRUE(bag->sendDisabled);
    EXPECT_EQ(bag->postFrequency, 86400000U);
    EXPECT_EQ(bag->blacklistedEvents, (Texts{"a", "b"}));
    EXPECT_EQ(bag->blacklistedFields, Texts{"c"});
    EXPECT_EQ(bag->metricsBase, (platform::ValueMap{{"d", std::int64_t{1}}}));
    EXPECT_EQ(bag->metricsUrl, "https://x");
}

TEST(EndpointBagTest, AbsentKeys) {
    const EndpointBag bag = bagWith("unknown", "1");
    EXPECT_FALSE(bag.disabled);
    EXPECT_FALSE(bag.sendDisabled);
    EXPECT_EQ(bag.postFrequency, std::nullopt);
    EXPECT_EQ(bag.blacklistedEvents, std::nullopt);
    EXPECT_EQ(bag.blacklistedFields, std::nullopt);
    EXPECT_EQ(bag.metricsBase, std::nullopt);
    EXPECT_EQ(bag.metricsUrl, std::nullopt);
}

TEST(EndpointBagTest, OnlyTrueIsTrue) {
    for (const char* const value : {"false", "1", "1.0", "\"true\"", "[true]", "{}", "null"}) {
        EXPECT_FALSE(bagWith("disabled", value).disabled) << value;
        EXPECT_FALSE(bagWith("sendDisabled", value).sendDisabled) << value;
    }
    EXPECT_TRUE(bagWith("disabled", "true").disabled);
    EXPECT_TRUE(bagWith("sendDisabled", "true").sendDisabled);
}

TEST(EndpointBagTest, UnsignedIntegers) {
    EXPECT_EQ(bagWith("postFrequency", "0").postFrequency, 0U);
    EXPECT_EQ(bagWith("postFrequency", "9223372036854775808").postFrequency, 1ULL << 63U);
    EXPECT_EQ(bagWith("postFrequency", "18446744073709551615").postFrequency, UINT64_MAX);
    for (const char* const value : {"-1", "1000.0", "1e6", "18446744073709551616", "true",
                                    "\"86400000\"", "[1000]", "{}", "null"}) {
        EXPECT_EQ(bagWith("postFrequency", value).postFrequency, std::nullopt) << value;
    }
}

TEST(EndpointBagTest, ListsHoldTextsOnly) {
    EXPECT_EQ(bagWith("blacklistedEvents", "[]").blacklistedEvents, Texts());
    for (const char* const value : {"\"a\"", "[1]", "[\"a\",null]", "{\"a\":\"b\"}", "true"}) {
        EXPECT_EQ(bagWith("blacklistedEvents", value).blacklistedEvents, std::nullopt) << value;
        EXPECT_EQ(bagWith("blacklistedFields", value).blacklistedFields, std::nullopt) << value;
    }
}

TEST(EndpointBagTest, WrongKindsOfMapAndText) {
    for (const char* const value : {"[]", "1", "true", "null"}) {
        EXPECT_EQ(bagWith("metricsBase", value).metricsBase, std::nullopt) << value;
        EXPECT_EQ(bagWith("metricsUrl", value).metricsUrl, std::nullopt) << value;
    }
    EXPECT_EQ(bagWith("metricsBase", "{}").metricsBase, platform::ValueMap());
    EXPECT_EQ(bagWith("metricsUrl", "\"\"").metricsUrl, "");
}

} // namespace
} // namespace kstd
