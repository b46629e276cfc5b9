#include "common/Allocation.h"

#include "tests/support/ScriptedGate.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <cstring>
#include <limits>

namespace {

using support::ScriptedGate;

/// Each test leaves the account where it found it.
class Allocation : public testing::Test {
  protected:
    ~Allocation() override { EXPECT_EQ(gAllocatedBytes, before); }

    const std::int64_t before = gAllocatedBytes;
};

} // namespace

TEST_F(Allocation, IsZeroedAndCounted) {
    auto* bytes = static_cast<std::uint8_t*>(kst::allocate(1000));
    ASSERT_NE(bytes, nullptr);
    EXPECT_EQ(gAllocatedBytes, before + 1000);
    EXPECT_TRUE(std::all_of(bytes, bytes + 1000, [](std::uint8_t byte) { return byte == 0; }));
    kst::release(bytes, 1000);
}

TEST_F(Allocation, IsZeroedWhereOtherBytesWere) {
    for (int round = 0; round < 100; ++round) {
        auto* bytes = static_cast<std::uint8_t*>(kst::allocate(64));
        ASSERT_NE(bytes, nullptr);
        ASSERT_TRUE(std::all_of(bytes, bytes + 64, [](std::uint8_t byte) { return byte == 0; }));
        std::memset(bytes, 0xaa, 64);
        kst::release(bytes, 64);
    }
}

TEST_F(Allocation, SizeZeroCanBeReleased) {
    void* memory = kst::allocate(0);
    EXPECT_NE(memory, nullptr);
    EXPECT_EQ(gAllocatedBytes, before);
    kst::release(memory, 0);
}

TEST_F(Allocation, SizesThatNoMemoryHas) {
    const auto limit = static_cast<std::size_t>(std::numeric_limits<std::ptrdiff_t>::max());
    EXPECT_EQ(kst::allocate(limit + 1), nullptr);
    EXPECT_EQ(kst::allocate(SIZE_MAX), nullptr);
    EXPECT_EQ(gAllocatedBytes, before);
}

TEST_F(Allocation, ReleasingNullDoesNothing) {
    kst::release(nullptr, 100);
    EXPECT_EQ(gAllocatedBytes, before);
}

TEST_F(Allocation, IsWipedBeforeItIsFreed) {
    ScriptedGate gate;
    for (const std::size_t size : {1U, 7U, 8U, 4096U}) {
        void* memory = kst::allocate(size);
        ASSERT_NE(memory, nullptr);
        std::memset(memory, 0xaa, size);
        kst::release(memory, size);
    }
    EXPECT_TRUE(gate.everyFreeWasWiped);
    EXPECT_EQ(gate.freed, (std::vector<std::size_t>{1, 7, 8, 4096}));
}

TEST_F(Allocation, OnlyWhatWasWrittenIsWiped) {
    ScriptedGate gate;
    for (const std::size_t written : {0U, 1U, 100U}) {
        void* memory = kst::allocate(100);
        ASSERT_NE(memory, nullptr);
        std::memset(memory, 0xaa, written);
        kst::release(memory, 100, written);
    }
    EXPECT_TRUE(gate.everyFreeWasWiped);
    EXPECT_EQ(gate.freed, (std::vector<std::size_t>{0, 1, 100}));
}

TEST_F(Allocation, GateRefusesTheOneItIsToldTo) {
    ScriptedGate gate(1);
    const kst::AllocatedMemory first(10);
    const kst::AllocatedMemory second(20);
    const kst::AllocatedMemory third(30);
    EXPECT_NE(first.bytes(), nullptr);
    EXPECT_EQ(second.bytes(), nullptr);
    EXPECT_NE(third.bytes(), nullptr);
    EXPECT_EQ(gAllocatedBytes, before + 40);
    EXPECT_EQ(gate.asked, (std::vector<std::size_t>{10, 20, 30}));
}

TEST_F(Allocation, GateIsTakenAwayAgain) {
    {
        const ScriptedGate gate(0);
        EXPECT_EQ(kst::allocate(1), nullptr);
    }
    EXPECT_EQ(kst::setAllocationGate(nullptr), nullptr);
    const kst::AllocatedMemory memory(1);
    EXPECT_NE(memory.bytes(), nullptr);
}

TEST_F(Allocation, ScopeReleases) {
    ScriptedGate gate;
    {
        const kst::AllocatedMemory memory(12);
        EXPECT_EQ(memory.size(), 12U);
        EXPECT_EQ(gAllocatedBytes, before + 12);
        std::memset(memory.bytes(), 0xaa, memory.size());
    }
    EXPECT_EQ(gate.freed, std::vector<std::size_t>{12});
    EXPECT_TRUE(gate.everyFreeWasWiped);
}

TEST_F(Allocation, LeavesTheLastValueToItsOwner) {
    gLastAllocatedBytes = 4711;
    { const kst::AllocatedMemory memory(12); }
    EXPECT_EQ(gLastAllocatedBytes, 4711);
    gLastAllocatedBytes = 0;
}
