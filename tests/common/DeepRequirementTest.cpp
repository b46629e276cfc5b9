// Trees that are deep, or that say they are large.

#include "KSTLib/RequirementSerialization.h"
#include "tests/common/RequirementSamples.h"
#include "tests/support/ScriptedGate.h"

#include <gtest/gtest.h>

namespace {

using support::Bytes;
using support::ExactBuffer;
using support::ScriptedGate;

#ifdef KSTD_SANITIZED
constexpr std::size_t kManyLevels = 100'000;
#else
constexpr std::size_t kManyLevels = 1'000'000;
#endif

/// Counts lines by their value and keeps none.
class CountingLog : public platform::SystemLog {
  public:
    std::size_t lines = 0;
    std::size_t failedCalls = 0;

    void write(platform::LogLevel /*level*/, std::string_view text,
               const platform::LogFields& /*fields*/) override {
        ++lines;
        failedCalls += text.find(": err == 0  (value") != std::string_view::npos ? 1U : 0U;
    }
};

/// `levels` lists with `count` children each, of which the first is the next level, and the leaf in
/// the middle of them.
Bytes nestedBytes(std::size_t levels, std::uint32_t count, std::uint32_t leafType) {
    const Bytes level = support::compositeBytes(4, count, {});
    Bytes bytes(levels * level.size());
    for (std::size_t i = 0; i < levels; ++i) {
        std::copy(level.begin(), level.end(),
                  bytes.begin() + static_cast<std::ptrdiff_t>(i * level.size()));
    }
    support::append(bytes, support::leafBytes(leafType));
    return bytes;
}

class DeepRequirement : public support::SerializationFixture {
  protected:
    KSTRequirement* tree = nullptr;
    std::size_t consumed = 4711;
};

} // namespace

TEST_F(DeepRequirement, ManyLevelsThereAndBack) {
    const Bytes bytes = nestedBytes(kManyLevels, 1, 1);
    ASSERT_EQ(DeserializeRequirement(bytes.data(), bytes.size(), &tree, &consumed), 0);
    EXPECT_EQ(consumed, bytes.size());
    std::size_t size = 0;
    EXPECT_EQ(GetSerializedRequirementSize(tree, &size), 0);
    EXPECT_EQ(size, bytes.size());
    const ExactBuffer target(size);
    EXPECT_EQ(SerializeRequirement(tree, target.data(), &size), 0);
    EXPECT_TRUE(target.bytes() == bytes);
    DeallocRequirement(tree);
    expectLogged({});
}

TEST_F(DeepRequirement, LevelsHaveMoreChildrenBehindTheDeepOne) {
    // More than there is room for without any memory: what has begun goes on in the new room.
    Bytes bytes = support::leafBytes(1);
    for (std::uint32_t level = 0; level < 80; ++level) {
        bytes = support::compositeBytes(4, {bytes, support::leafBytes(1), support::leafBytes(1)});
    }
    ASSERT_EQ(DeserializeRequirement(bytes.data(), bytes.size(), &tree, &consumed), 0);
    EXPECT_EQ(consumed, bytes.size());
    std::size_t size = 0;
    EXPECT_EQ(GetSerializedRequirementSize(tree, &size), 0);
    EXPECT_EQ(size, bytes.size());
    const ExactBuffer target(size);
    EXPECT_EQ(SerializeRequirement(tree, target.data(), &size), 0);
    EXPECT_TRUE(target.bytes() == bytes);
    DeallocRequirement(tree);
    expectLogged({});
}

TEST_F(DeepRequirement, FailureBelowManyLevels) {
    CountingLog counting;
    kst::setLibraryLog(&counting);
    const std::size_t levels = kManyLevels / 10;
    const Bytes bytes = nestedBytes(levels, 1, 17);
    EXPECT_EQ(DeserializeRequirement(bytes.data(), bytes.size(), &tree, &consumed), -3);
    kst::setLibraryLog(&log);
    EXPECT_EQ(counting.lines, levels + 1);
    EXPECT_EQ(counting.failedCalls, levels);
    EXPECT_EQ(tree, nullptr);
}

TEST_F(DeepRequirement, CountsThatNothingStandsBehind) {
    // Every level announces as many children as the bound of its own node admits.
    const std::size_t levels = 20'000;
    Bytes bytes = nestedBytes(levels, 0, 1);
    for (std::size_t i = 0; i < levels; ++i) {
        const std::size_t left = bytes.size() - i * 20;
        support::putU32(bytes, i * 20 + 16, static_cast<std::uint32_t>((left - 20) / 8));
    }
    CountingLog counting;
    kst::setLibraryLog(&counting);
    const ScriptedGate gate;
    EXPECT_EQ(DeserializeRequirement(bytes.data(), bytes.size(), &tree, &consumed), -3);
    kst::setLibraryLog(&log);
    EXPECT_EQ(counting.lines, levels + 1);
    std::size_t asked = 0;
    for (const std::size_t size : gate.asked) {
        asked += size;
    }
    // The levels themselves, doubled and doubled; nothing for the children.
    EXPECT_LT(asked, 4 * bytes.size());
}

TEST_F(DeepRequirement, NothingIsBuiltWhenOneChildIsMissing) {
    Bytes bytes = support::compositeBytes(4, {support::leafBytes(1), support::leafBytes(1)});
    {
        const ScriptedGate gate;
        ASSERT_EQ(DeserializeRequirement(bytes.data(), bytes.size(), &tree, &consumed), 0);
        EXPECT_EQ(gate.asked, (std::vector<std::size_t>{36, 16, 16}));
        DeallocRequirement(tree);
        tree = nullptr;
    }
    bytes.resize(bytes.size() - 1);
    const ScriptedGate gate;
    EXPECT_EQ(DeserializeRequirement(bytes.data(), bytes.size(), &tree, &consumed), -3);
    EXPECT_TRUE(gate.asked.empty());
    expectLogged({failedCheck("size >= sizeof(KSTRequirement)"), failedCall(-3)});
}

TEST_F(DeepRequirement, FailedAllocationOfTheLevels) {
    // One level more than there is room for without any.
    const Bytes bytes = nestedBytes(33, 1, 1);
    ASSERT_EQ(DeserializeRequirement(bytes.data(), bytes.size(), &tree, &consumed), 0);
    const ExactBuffer target(bytes.size());
    const support::Lines lines = [] {
        support::Lines expected = {failedCheck("levels")};
        expected.insert(expected.end(), 32, failedCall(-4));
        return expected;
    }();
    {
        const ScriptedGate gate(0);
        std::size_t size = 4711;
        EXPECT_EQ(GetSerializedRequirementSize(tree, &size), -4);
        EXPECT_EQ(size, 4711U);
        expectLogged(lines);
    }
    {
        const ScriptedGate gate(0);
        std::size_t size = target.size();
        EXPECT_EQ(SerializeRequirement(tree, target.data(), &size), -4);
        EXPECT_EQ(size, target.size());
        EXPECT_EQ(target.bytes(), ExactBuffer(bytes.size()).bytes());
        support::Lines withTheWriters = lines;
        withTheWriters.push_back(failedCall(-4));
        expectLogged(withTheWriters);
    }
    {
        const ScriptedGate gate;
        std::size_t size = target.size();
        EXPECT_EQ(SerializeRequirement(tree, target.data(), &size), 0);
        EXPECT_EQ(gate.asked.size(), 1U);
        EXPECT_TRUE(target.bytes() == bytes);
    }
    DeallocRequirement(tree);
    tree = nullptr;
    // 33 nodes, then the room for the 33rd level.
    const ScriptedGate gate(33);
    EXPECT_EQ(DeserializeRequirement(bytes.data(), bytes.size(), &tree, &consumed), -4);
    EXPECT_EQ(tree, nullptr);
    expectLogged(lines);
}
