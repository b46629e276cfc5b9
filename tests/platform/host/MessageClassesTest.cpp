#include "platform/host/MessageClasses.h"

#include <gtest/gtest.h>

namespace platform {
namespace {

TEST(MessageClassesTest, PatternIsTheBeginningOfALine) {
    EXPECT_TRUE(isOfPattern("kstd: main: text", "kstd: main: "));
    EXPECT_TRUE(isOfPattern("kstd", "kstd"));
    EXPECT_TRUE(isOfPattern("anything", ""));
    EXPECT_FALSE(isOfPattern("kst", "kstd"));
    EXPECT_FALSE(isOfPattern("a kstd", "kstd"));
    EXPECT_FALSE(isOfPattern("", "k"));
}

TEST(MessageClassesTest, AsteriskStandsForAnyText) {
    EXPECT_TRUE(isOfPattern("from x to y", "from * to "));
    EXPECT_TRUE(isOfPattern("from  to y", "from * to "));
    EXPECT_TRUE(isOfPattern("from x to y by z", "from * to * by"));
    EXPECT_TRUE(isOfPattern("from * to y", "from * to "));
    EXPECT_TRUE(isOfPattern("from x", "from *"));
    EXPECT_TRUE(isOfPattern("x end", "* end"));
    EXPECT_FALSE(isOfPattern("from x by z to y", "from * to * by"));
    EXPECT_FALSE(isOfPattern("from to", "from * to"));
    EXPECT_FALSE(isOfPattern("from x t", "from * to"));
    EXPECT_FALSE(isOfPattern("to from x to", "from * to"));
}

TEST(MessageClassesTest, LineIsOfTheFirstClassThatFits) {
    constexpr MessageClass kClasses[] = {{"1", "ab"}, {"2", "a"}, {"1", "c"}};
    EXPECT_EQ(messageIdOf("abc", kClasses), "1");
    EXPECT_EQ(messageIdOf("ac", kClasses), "2");
    EXPECT_EQ(messageIdOf("c", kClasses), "1");
    EXPECT_EQ(messageIdOf("b", kClasses), "");
    EXPECT_EQ(messageIdOf("", kClasses), "");
    EXPECT_EQ(messageIdOf("abc", {}), "");
}

} // namespace
} // namespace platform
