#include "keystrand/ContextTable.h"

#include <gtest/gtest.h>

namespace keystrand::test {

namespace {

using Value = std::vector<std::uint8_t>;

Value valueOf(const NumberedValues& variables, std::uint32_t id) {
    const auto value = variables.get(id);
    return {value.begin(), value.end()};
}

TEST(NumberedValuesTest, UnsetValueIsEmpty) {
    EXPECT_TRUE(valueOf(NumberedValues(), 7).empty());
}

TEST(NumberedValuesTest, ValueIsReplaced) {
    NumberedValues variables;
    ASSERT_TRUE(variables.set(7, Value{1, 2, 3}));
    ASSERT_TRUE(variables.set(7, Value{4}));
    EXPECT_EQ(valueOf(variables, 7), Value{4});
    EXPECT_TRUE(valueOf(variables, 8).empty());
}

TEST(NumberedValuesTest, EmptyValueRemoves) {
    NumberedValues variables;
    ASSERT_TRUE(variables.set(7, Value{1}));
    ASSERT_TRUE(variables.set(7, {}));
    EXPECT_EQ(variables.count(), 0U);
    EXPECT_TRUE(variables.set(7, {}));
}

TEST(NumberedValuesTest, ValueHas64BytesAtMost) {
    NumberedValues variables;
    EXPECT_TRUE(variables.set(0, Value(63, 1)));
    EXPECT_TRUE(variables.set(0, Value(64, 2)));
    EXPECT_FALSE(variables.set(0, Value(65, 3)));
    EXPECT_EQ(valueOf(variables, 0), Value(64, 2));
}

TEST(NumberedValuesTest, NoMoreThan64Values) {
    NumberedValues variables;
    for (std::uint32_t id = 0; id < NumberedValues::kMaxCount; ++id) {
        ASSERT_TRUE(variables.set(id, Value{1}));
    }
    EXPECT_FALSE(variables.set(0xffffffff, Value{1}));
    EXPECT_TRUE(variables.set(0, Value{2}));
    EXPECT_TRUE(variables.set(0xffffffff, {}));
    ASSERT_TRUE(variables.set(0, {}));
    EXPECT_TRUE(variables.set(0xffffffff, Value{1}));
}

} // namespace

} // namespace keystrand::test
