#include "KSTLib/Blocks.h"

#include "KSTLib/Requirement.h"

#include <gtest/gtest.h>

#include <cstdint>
#include <functional>
#include <stdexcept>
#include <string>

namespace {

/// What a library function does with its block.
bool callBlock(KSTDataBlock block, const void* data, std::size_t length) {
    if (block.invoke == nullptr) {
        return false;
    }
    block.invoke(block.captured, data, length);
    return true;
}

std::size_t lengthSeenByFunction = 0;

void freeFunction(const void* /*data*/, std::size_t length) {
    lengthSeenByFunction = length;
}

void functionWithContext(void* captured, const void* data, std::size_t length) {
    *static_cast<std::string*>(captured) = std::string(static_cast<const char*>(data), length);
}

struct Counter {
    int calls = 0;
    // Returning something is no obstacle.
    int operator()(const void* /*data*/, std::size_t /*length*/) { return ++calls; }
};

struct ConstCallable {
    std::size_t* seen;
    void operator()(const void* /*data*/, std::size_t length) const { *seen = length; }
};

} // namespace

TEST(DataBlock, NullIsNull) {
    EXPECT_FALSE(callBlock(nullptr, "", 0));
    EXPECT_FALSE(callBlock({}, "", 0));
    EXPECT_FALSE(callBlock(KSTDataBlock(), "", 0));
    EXPECT_FALSE(callBlock(KST_NO_BLOCK, "", 0));
    const KSTDataBlock block = nullptr;
    EXPECT_EQ(block.invoke, nullptr);
    EXPECT_EQ(block.captured, nullptr);
}

TEST(DataBlock, FunctionAndPointerAsInC) {
    std::string seen;
    EXPECT_TRUE(callBlock({functionWithContext, &seen}, "abc", 2));
    EXPECT_EQ(seen, "ab");
    EXPECT_FALSE(callBlock({nullptr, &seen}, "abc", 2));
}

TEST(DataBlock, TemporaryLambdaWithCaptures) {
    std::string seen;
    int added = 7;
    EXPECT_TRUE(callBlock(
        [&seen, added](const void* data, std::size_t length) {
            seen = std::string(static_cast<const char*>(data), length) + std::to_string(added);
        },
        "abc", 3));
    EXPECT_EQ(seen, "abc7");
}

TEST(DataBlock, LambdaWithoutCaptures) {
    static std::size_t seen = 0;
    EXPECT_TRUE(callBlock([](const void*, std::size_t length) { seen = length; }, "", 5));
    EXPECT_EQ(seen, 5U);
}

TEST(DataBlock, MutableCallableIsCalledItselfNotACopy) {
    Counter counter;
    EXPECT_TRUE(callBlock(counter, "", 0));
    EXPECT_TRUE(callBlock(counter, "", 0));
    EXPECT_EQ(counter.calls, 2);
}

TEST(DataBlock, ConstCallable) {
    std::size_t seen = 0;
    const ConstCallable callable{&seen};
    EXPECT_TRUE(callBlock(callable, "", 9));
    EXPECT_EQ(seen, 9U);
}

TEST(DataBlock, PlainFunction) {
    EXPECT_TRUE(callBlock(freeFunction, "", 11));
    EXPECT_EQ(lengthSeenByFunction, 11U);
    EXPECT_TRUE(callBlock(&freeFunction, "", 12));
    EXPECT_EQ(lengthSeenByFunction, 12U);
}

TEST(DataBlock, EmptyCallablesAreNullBlocks) {
    void (*noFunction)(const void*, std::size_t) = nullptr;
    EXPECT_FALSE(callBlock(noFunction, "", 0));
    const std::function<void(const void*, std::size_t)> empty;
    EXPECT_FALSE(callBlock(empty, "", 0));
    EXPECT_FALSE(callBlock(std::function<void(const void*, std::size_t)>(), "", 0));
    std::size_t seen = 0;
    std::function<void(const void*, std::size_t)> filled = ConstCallable{&seen};
    EXPECT_TRUE(callBlock(filled, "", 3));
    EXPECT_EQ(seen, 3U);
}

TEST(DataBlock, CopiesCallTheSame) {
    Counter counter;
    const KSTDataBlock block = counter;
    const KSTDataBlock copy = block;
    EXPECT_EQ(copy.invoke, block.invoke);
    EXPECT_EQ(copy.captured, &counter);
    EXPECT_TRUE(callBlock(copy, "", 0));
    EXPECT_EQ(counter.calls, 1);
}

TEST(DataBlock, OnlyWhatCanBeCalledBecomesABlock) {
    EXPECT_TRUE((std::is_convertible_v<Counter&, KSTDataBlock>));
    EXPECT_FALSE((std::is_convertible_v<int, KSTDataBlock>));
    EXPECT_FALSE((std::is_convertible_v<void (*)(int), KSTDataBlock>));
    EXPECT_FALSE((std::is_convertible_v<std::function<void()>, KSTDataBlock>));
}

TEST(OtherBlocks, GetTheirOwnArguments) {
    std::uint32_t seenId = 0;
    std::size_t seenLength = 0;
    const auto property = [&](std::uint32_t id, const void*, std::size_t length) {
        seenId = id;
        seenLength = length;
    };
    const KSTPropertyBlock propertyBlock = property;
    propertyBlock.invoke(propertyBlock.captured, 0xfffffffe, "abc", 3);
    EXPECT_EQ(seenId, 0xfffffffeU);
    EXPECT_EQ(seenLength, 3U);

    const KSTRequirement* seen = nullptr;
    const auto requirement = [&](const KSTRequirement* given) {
        seen = given;
    };
    const KSTRequirementBlock requirementBlock = requirement;
    const KSTRequirement given{};
    requirementBlock.invoke(requirementBlock.captured, &given);
    EXPECT_EQ(seen, &given);

    EXPECT_EQ(KSTPropertyBlock(nullptr).invoke, nullptr);
    EXPECT_EQ(KSTRequirementBlock().invoke, nullptr);
    EXPECT_EQ(KSTRequirementBlock(KST_NO_BLOCK).invoke, nullptr);
    EXPECT_FALSE((std::is_convertible_v<KSTDataBlock, KSTPropertyBlock>));
    EXPECT_FALSE((std::is_convertible_v<void (*)(const void*, std::size_t), KSTPropertyBlock>));
}

TEST(DataBlockDeathTest, EscapingExceptionEndsTheProgram) {
    EXPECT_EXIT(
        callBlock([](const void*, std::size_t) { throw std::runtime_error("escaped"); }, "", 0),
        testing::KilledBySignal(SIGABRT), "");
}
