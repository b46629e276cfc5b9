#include "keystrand-sim/ControlArguments.h"

#include <gtest/gtest.h>

namespace keystrand::sim::test {

namespace {

using Value = std::vector<std::uint8_t>;

TEST(ControlArgumentsTest, WordsAndNamedValuesInAnyOrder) {
    ControlArguments arguments("  post a=1 NAME\tb= last\r");
    EXPECT_EQ(arguments.word("command"), "post");
    EXPECT_EQ(arguments.named("b"), "");
    EXPECT_EQ(arguments.namedNumber<int>("a"), 1);
    EXPECT_EQ(arguments.word("name"), "NAME");
    EXPECT_TRUE(arguments.flag("last"));
    EXPECT_FALSE(arguments.problem());
}

TEST(ControlArgumentsTest, MissingWordIsAProblem) {
    ControlArguments arguments("");
    EXPECT_EQ(arguments.word("name"), "");
    EXPECT_EQ(arguments.problem(), "name: missing");
}

TEST(ControlArgumentsTest, WordsThatNobodyTookAreAProblem) {
    EXPECT_EQ(ControlArguments("extra").problem(), "extra: not understood");
    EXPECT_EQ(ControlArguments("a=1").problem(), "a: not understood");
}

TEST(ControlArgumentsTest, NameGivenTwiceIsAProblem) {
    ControlArguments arguments("a=1 a=2");
    EXPECT_EQ(arguments.named("a"), "1");
    EXPECT_EQ(arguments.problem(), "a: given twice");
}

TEST(ControlArgumentsTest, NumbersHaveToBeWholeAndInRange) {
    ControlArguments arguments("9 a=4 b=5");
    EXPECT_EQ(arguments.namedNumber<int>("b", 5, 9), 5);
    EXPECT_EQ(arguments.numberWord<int>("first", 5, 9), 9);
    EXPECT_FALSE(arguments.namedNumber<int>("c"));
    static_cast<void>(arguments.namedNumber<int>("a", 5, 9));
    EXPECT_EQ(arguments.problem(), "a: bad number");
}

TEST(ControlArgumentsTest, OnAndOff) {
    EXPECT_TRUE(ControlArguments("on").onOrOff());
    EXPECT_FALSE(ControlArguments("off").onOrOff());
    ControlArguments arguments("maybe");
    static_cast<void>(arguments.onOrOff());
    EXPECT_EQ(arguments.problem(), "maybe: neither on nor off");
}

TEST(ControlArgumentsTest, FirstProblemIsTheOneTold) {
    ControlArguments arguments("x");
    arguments.fail("one", "bad");
    arguments.fail("two", "bad");
    EXPECT_EQ(arguments.problem(), "one: bad");
}

TEST(HexTextTest, RoundTrip) {
    EXPECT_EQ(toHexWord(Value{0x00, 0x9a, 0xff}), "009aff");
    EXPECT_EQ(fromHexWord("009AfF"), (Value{0x00, 0x9a, 0xff}));
    EXPECT_EQ(toHexWord({}), "empty");
    EXPECT_EQ(fromHexWord("empty"), Value());
}

TEST(HexTextTest, AnythingElseIsRefused) {
    for (const char* word : {"", "0", "0g", "g0", "0x01", "00 0"}) {
        EXPECT_FALSE(fromHexWord(word)) << word;
    }
}

} // namespace

} // namespace keystrand::sim::test
