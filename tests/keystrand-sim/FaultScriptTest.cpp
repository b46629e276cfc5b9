#include "keystrand-sim/FaultScript.h"

#include <gtest/gtest.h>

namespace keystrand::sim::test {

namespace {

using wire::KernelOperation;

constexpr RequestKind kAck{.operation = KernelOperation::structCall, .command = 26, .control = 7};
constexpr RequestKind kGetVariable{
    .operation = KernelOperation::structCall, .command = 25, .control = std::nullopt};
constexpr RequestKind kOpen{
    .operation = KernelOperation::open, .command = std::nullopt, .control = std::nullopt};

FaultEffect status(std::int32_t value) {
    FaultEffect effect;
    effect.status = value;
    return effect;
}

TEST(FaultScriptTest, EmptyScriptDoesNothing) {
    FaultScript script;
    EXPECT_FALSE(script.take(kAck));
    EXPECT_FALSE(script.takeHiddenProperty("P"));
    EXPECT_FALSE(script.takeRefusal());
    EXPECT_TRUE(script.entryPresent());
    EXPECT_EQ(script.pending(), 0U);
}

TEST(FaultScriptTest, FaultHappensAsOftenAsOrdered) {
    FaultScript script;
    ASSERT_TRUE(script.add({}, status(-42), 2));
    EXPECT_EQ(script.take(kAck)->status, -42);
    EXPECT_EQ(script.take(kAck)->status, -42);
    EXPECT_FALSE(script.take(kAck));
    EXPECT_EQ(script.pending(), 0U);
}

TEST(FaultScriptTest, AlwaysNeverEnds) {
    FaultScript script;
    ASSERT_TRUE(script.add({}, status(-42), FaultScript::kAlways));
    for (int i = 0; i < 1000; ++i) {
        ASSERT_TRUE(script.take(kOpen));
    }
}

TEST(FaultScriptTest, RequestsThatDoNotMatchAreLeftAloneAndNotCounted) {
    FaultScript script;
    ASSERT_TRUE(script.add({.operation = {}, .command = 26, .control = 7}, status(-1), 1));
    EXPECT_FALSE(script.take(kOpen));
    EXPECT_FALSE(script.take(kGetVariable));
    EXPECT_FALSE(script.take({KernelOperation::structCall, std::uint8_t{26}, 5U}));
    EXPECT_TRUE(script.take(kAck));
}

TEST(FaultScriptTest, OperationMatches) {
    FaultScript script;
    ASSERT_TRUE(script.add({.operation = KernelOperation::open, .command = {}, .control = {}},
                           status(-1), 1));
    EXPECT_FALSE(script.take(kAck));
    EXPECT_TRUE(script.take(kOpen));
}

TEST(FaultScriptTest, OlderFaultComesFirst) {
    FaultScript script;
    ASSERT_TRUE(script.add({}, status(-1), 1));
    ASSERT_TRUE(script.add({}, status(-2), 1));
    EXPECT_EQ(script.take(kAck)->status, -1);
    EXPECT_EQ(script.take(kAck)->status, -2);
}

TEST(FaultScriptTest, HiddenPropertyIsHiddenByName) {
    FaultScript script;
    ASSERT_TRUE(script.hideProperty("P", 2));
    EXPECT_FALSE(script.takeHiddenProperty("Q"));
    EXPECT_TRUE(script.takeHiddenProperty("P"));
    EXPECT_TRUE(script.takeHiddenProperty("P"));
    EXPECT_FALSE(script.takeHiddenProperty("P"));
}

TEST(FaultScriptTest, RefusalsAreCounted) {
    FaultScript script;
    script.refuseConnections(2);
    EXPECT_TRUE(script.takeRefusal());
    EXPECT_TRUE(script.takeRefusal());
    EXPECT_FALSE(script.takeRefusal());
}

TEST(FaultScriptTest, FaultsHaveALimit) {
    FaultScript script;
    for (std::size_t i = 0; i < FaultScript::kMaxFaults; ++i) {
        ASSERT_TRUE(script.add({}, status(-1), 1));
        ASSERT_TRUE(script.hideProperty("P", 1));
    }
    EXPECT_FALSE(script.add({}, status(-1), 1));
    EXPECT_FALSE(script.hideProperty("P", 1));
    EXPECT_EQ(script.pending(), 2 * FaultScript::kMaxFaults);
}

TEST(FaultScriptTest, ClearForgetsEverything) {
    FaultScript script;
    ASSERT_TRUE(script.add({}, status(-1), FaultScript::kAlways));
    ASSERT_TRUE(script.hideProperty("P", 1));
    script.refuseConnections(1);
    script.setEntryPresent(false);
    EXPECT_EQ(script.pending(), 4U);
    script.clear();
    EXPECT_EQ(script.pending(), 0U);
    EXPECT_TRUE(script.entryPresent());
    EXPECT_FALSE(script.take(kAck));
}

TEST(FaultScriptTest, OnlyEffectsOfTheFirstGroupReplaceTheHandling) {
    FaultEffect effect;
    EXPECT_TRUE(effect.isNothing());
    effect.delayMilliseconds = 1;
    effect.reported = 3;
    effect.wrongSequence = true;
    EXPECT_FALSE(effect.isNothing());
    EXPECT_FALSE(effect.replacesHandling());
    effect.silence = true;
    EXPECT_TRUE(effect.replacesHandling());
}

} // namespace

} // namespace keystrand::sim::test
