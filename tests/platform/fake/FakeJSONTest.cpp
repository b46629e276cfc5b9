#include "platform/fake/FakeFormats.h"

#include <gtest/gtest.h>

namespace {

using platform::Error;
using platform::FakeJSON;

const Error kError = {"of the test", 7, "told to"};

TEST(FakeJSONTest, NextReadFails) {
    FakeJSON json;
    json.failNextRead(kError);
    EXPECT_EQ(json.makeText()->finish().error().domain, platform::kGenericErrorDomain);
    const auto result = json.read("1");
    ASSERT_FALSE(result);
    EXPECT_EQ(result.error(), kError);
    EXPECT_TRUE(json.read("1"));
}

TEST(FakeJSONTest, NextFinishFails) {
    FakeJSON json;
    const auto text = json.makeText();
    const auto other = json.makeText();
    text->null();
    other->null();
    json.failNextFinish(kError);
    EXPECT_TRUE(json.read("1"));
    const auto result = text->finish();
    ASSERT_FALSE(result);
    EXPECT_EQ(result.error(), kError);
    EXPECT_TRUE(other->finish());
}

} // namespace
