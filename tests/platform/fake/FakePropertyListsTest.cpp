#include "platform/fake/FakeFormats.h"

#include <gtest/gtest.h>

namespace {

using platform::Error;
using platform::FakePropertyLists;
using platform::Value;

TEST(FakePropertyListsTest, NextBinaryFailsOnceAsTold) {
    FakePropertyLists propertyLists;
    const Error error{platform::kGenericErrorDomain, 7, "told to"};
    propertyLists.failNextBinary(error);
    const platform::Result<platform::Bytes> failed = propertyLists.binary(true);
    ASSERT_FALSE(failed);
    EXPECT_EQ(failed.error(), error);
    EXPECT_TRUE(propertyLists.binary(true));
}

TEST(FakePropertyListsTest, NextReadFailsOnceAsTold) {
    FakePropertyLists propertyLists;
    const platform::Bytes bytes = propertyLists.binary(true).value();
    propertyLists.failNextRead();
    EXPECT_EQ(propertyLists.value(bytes), std::nullopt);
    EXPECT_EQ(propertyLists.value(bytes), Value(true));
}

TEST(FakePropertyListsTest, OnlyTheBinaryFormIsRead) {
    FakePropertyLists propertyLists;
    const std::string xml = "<plist version=\"1.0\"><true/></plist>";
    EXPECT_EQ(propertyLists.value(platform::Bytes(xml.begin(), xml.end())), std::nullopt);
}

} // namespace
