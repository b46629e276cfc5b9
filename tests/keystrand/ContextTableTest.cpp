#include "keystrand/ContextTable.h"

#include <gtest/gtest.h>

#include <set>

namespace keystrand::test {

namespace {

KSTHandle handleOf(std::uint32_t number) {
    KSTHandle handle{};
    handle.bytes[14] = static_cast<std::uint8_t>(number >> 8U);
    handle.bytes[15] = static_cast<std::uint8_t>(number);
    return handle;
}

/// Hands out the numbers in turn, then none.
HandleSource handles(std::vector<std::uint32_t> numbers) {
    return [numbers = std::move(numbers), next = std::size_t{0}]() mutable {
        return next < numbers.size() ? std::optional(handleOf(numbers[next++])) : std::nullopt;
    };
}

TEST(ContextTableTest, CreatedContextIsFoundUntilItIsDestroyed) {
    ContextTable table(handles({7}));
    const auto handle = table.create();
    ASSERT_TRUE(handle);
    EXPECT_EQ(toHex(*handle), "00000000000000000000000000000007");
    EXPECT_NE(table.find(*handle), nullptr);
    EXPECT_EQ(table.find(handleOf(8)), nullptr);
    EXPECT_TRUE(table.destroy(*handle));
    EXPECT_EQ(table.find(*handle), nullptr);
    EXPECT_FALSE(table.destroy(*handle));
}

TEST(ContextTableTest, HandleThatIsTakenOrZeroIsDrawnAgain) {
    ContextTable table(handles({1, 1, 0, 2}));
    ASSERT_TRUE(table.create());
    const auto second = table.create();
    ASSERT_TRUE(second);
    EXPECT_EQ(second->bytes[15], 2);
}

TEST(ContextTableTest, NoContextWithoutAFreeHandle) {
    EXPECT_FALSE(ContextTable(handles({})).create());
    EXPECT_FALSE(ContextTable(handles({0, 0, 0, 0, 1})).create());
    EXPECT_TRUE(ContextTable(handles({0, 0, 0, 1})).create());
}

TEST(ContextTableTest, NoMoreThan256Contexts) {
    std::uint32_t last = 0;
    ContextTable table([&last] { return std::optional(handleOf(++last)); });
    for (std::size_t i = 0; i < 256; ++i) {
        ASSERT_TRUE(table.create()) << i;
    }
    EXPECT_FALSE(table.create());
    EXPECT_EQ(table.all().size(), 256U);
    ASSERT_TRUE(table.destroy(handleOf(17)));
    EXPECT_TRUE(table.create());
}

TEST(ContextTableTest, RandomHandlesDiffer) {
    std::set<KSTHandle, HandleOrder> drawn;
    for (int i = 0; i < 100; ++i) {
        const auto handle = randomHandle();
        ASSERT_TRUE(handle);
        EXPECT_FALSE(isNoHandle(*handle));
        EXPECT_TRUE(drawn.insert(*handle).second);
    }
}

} // namespace

} // namespace keystrand::test
