#include "keystrand-sim/EnvironmentVariables.h"

#include <gtest/gtest.h>

namespace sim::test {

namespace {

using Value = std::vector<std::uint8_t>;

Value valueOf(const EnvironmentVariables& variables, std::uint32_t id) {
    const auto value = variables.get(id);
    return {value.begin(), value.end()};
}

TEST(EnvironmentVariablesTest, UnsetVariableIsEmpty) {
    EXPECT_TRUE(valueOf(EnvironmentVariables(), 7).empty());
}

TEST(EnvironmentVariablesTest, ValueIsReplaced) {
    EnvironmentVariables variables;
    ASSERT_TRUE(variables.set(7, Value{1, 2, 3}));
    ASSERT_TRUE(variables.set(7, Value{4}));
    EXPECT_EQ(valueOf(variables, 7), Value{4});
    EXPECT_TRUE(valueOf(variables, 8).empty());
}

TEST(EnvironmentVariablesTest, EmptyValueRemoves) {
    EnvironmentVariables variables;
    ASSERT_TRUE(variables.set(7, Value{1}));
    ASSERT_TRUE(variables.set(7, {}));
    EXPECT_EQ(variables.count(), 0U);
    EXPECT_TRUE(variables.set(7, {}));
}

TEST(EnvironmentVariablesTest, ValueHas64BytesAtMost) {
    EnvironmentVariables variables;
    EXPECT_TRUE(variables.set(0, Value(63, 1)));
    EXPECT_TRUE(variables.set(0, Value(64, 2)));
    EXPECT_FALSE(variables.set(0, Value(65, 3)));
    EXPECT_EQ(valueOf(variables, 0), Value(64, 2));
}

TEST(EnvironmentVariablesTest, NoMoreThan64Variables) {
    EnvironmentVariables variables;
    for (std::uint32_t id = 0; id < EnvironmentVariables::kMaxCount; ++id) {
        ASSERT_TRUE(variables.set(id, Value{1}));
    }
    EXPECT_FALSE(variables.set(0xffffffff, Value{1}));
    EXPECT_TRUE(variables.set(0, Value{2}));
    EXPECT_TRUE(variables.set(0xffffffff, {}));
    ASSERT_TRUE(variables.set(0, {}));
    EXPECT_TRUE(variables.set(0xffffffff, Value{1}));
}

} // namespace

} // namespace sim::test
