#include "common/Allocation.h"

#include "tests/support/ChildProcess.h"
#include "tests/support/ScriptedGate.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <array>
#include <cstring>
#include <limits>
#include <optional>
#include <thread>

namespace {

using support::ScriptedGate;

/// Each test leaves the account where it found it.
class Allocation : public testing::Test {
  protected:
    ~Allocation() override { EXPECT_EQ(gAllocatedBytes, before); }

    const std::int64_t before = gAllocatedBytes;
};

using Secret = std::array<std::uint8_t, 24>;

constexpr Secret kForgotten{};

Secret secret() {
    Secret bytes{};
    bytes.fill(0x55);
    return bytes;
}

/// In a process that ends soon: what a thread that is there no more has held, and holds for good.
void holdInAnotherThread(Secret& bytes) {
    std::thread([&bytes] { new kst::CallBuffer(bytes.data(), bytes.size()); }).join();
}

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
#ifndef KSTD_SANITIZED // Where the process stops instead.
    EXPECT_EQ(kst::allocate(limit), nullptr);
    EXPECT_EQ(gAllocatedBytes, before);
#endif
    // The largest size of all is asked for; what is beyond it is not.
    const ScriptedGate gate(0);
    EXPECT_EQ(kst::allocate(limit + 1), nullptr);
    EXPECT_EQ(kst::allocate(limit), nullptr);
    EXPECT_EQ(gate.asked, std::vector<std::size_t>{limit});
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

TEST_F(Allocation, ChildForgetsWhatOtherThreadsHeldAndNothingElse) {
    EXPECT_EQ(support::exitStatusOfChild([] {
                  Secret first = secret();
                  Secret own = secret();
                  Secret second = secret();
                  Secret left = secret();
                  holdInAnotherThread(first);
                  kst::CallBuffer mine(own.data(), own.size());
                  kst::CallBuffer gone(left.data(), left.size());
                  holdInAnotherThread(second);
                  gone.leave();
                  kst::CallBuffer nothing(nullptr, 24);
                  kst::CallBuffer::wipeThoseOfOtherThreads();
                  const bool wiped = first == kForgotten && second == kForgotten;
                  const bool kept = own == secret() && left == secret();

                  // It is forgotten, and what is its own is known still.
                  first = secret();
                  kst::CallBuffer::wipeThoseOfOtherThreads();
                  const bool once = first == secret() && own == secret();
                  std::thread([] { kst::CallBuffer::wipeThoseOfOtherThreads(); }).join();
                  const bool known = own == kForgotten && left == secret();
                  return (wiped ? 0 : 1) + (kept ? 0 : 2) + (once ? 0 : 4) + (known ? 0 : 8);
              }),
              0);
}

TEST_F(Allocation, WhatHeldNothingOrHasLeftTakesNobodyAlong) {
    EXPECT_EQ(support::exitStatusOfChild([] {
                  Secret left = secret();
                  Secret held = secret();
                  std::optional<kst::CallBuffer> gone;
                  gone.emplace(left.data(), left.size());
                  gone->leave();
                  kst::CallBuffer mine(held.data(), held.size());
                  gone.reset();
                  { const kst::CallBuffer nothing(nullptr, 24); }
                  std::thread([] { kst::CallBuffer::wipeThoseOfOtherThreads(); }).join();
                  return (held == kForgotten ? 0 : 1) + (left == secret() ? 0 : 2);
              }),
              0);
}

TEST_F(Allocation, WhatWasKeptMayLeave) {
    EXPECT_EQ(support::exitStatusOfChild([] {
                  Secret first = secret();
                  Secret second = secret();
                  Secret third = secret();
                  kst::CallBuffer one(first.data(), first.size());
                  kst::CallBuffer two(second.data(), second.size());
                  kst::CallBuffer three(third.data(), third.size());
                  kst::CallBuffer::wipeThoseOfOtherThreads();
                  one.leave();
                  std::thread([] { kst::CallBuffer::wipeThoseOfOtherThreads(); }).join();
                  return (first == secret() ? 0 : 1) + (second == kForgotten ? 0 : 2) +
                         (third == kForgotten ? 0 : 4);
              }),
              0);
}

TEST_F(Allocation, MemoryOfACallIsKnownUntilItIsHandedOut) {
    EXPECT_EQ(support::exitStatusOfChild([] {
                  kst::AllocatedMemory held(sizeof(Secret));
                  kst::AllocatedMemory handed(sizeof(Secret));
                  std::memset(held.bytes(), 0x55, sizeof(Secret));
                  std::memset(handed.bytes(), 0x55, sizeof(Secret));
                  std::uint8_t* const bytes = handed.handOut();
                  const Secret whole = secret();
                  std::thread([] { kst::CallBuffer::wipeThoseOfOtherThreads(); }).join();
                  const bool wiped =
                      std::memcmp(held.bytes(), kForgotten.data(), sizeof(Secret)) == 0;
                  const bool kept = std::memcmp(bytes, whole.data(), sizeof(Secret)) == 0;
                  return (wiped ? 0 : 1) + (kept ? 0 : 2) + (handed.bytes() == nullptr ? 0 : 4);
              }),
              0);
}

TEST_F(Allocation, GateThatWasThereIsHandedBack) {
    ScriptedGate first;
    EXPECT_EQ(kst::setAllocationGate(nullptr), &first);
    EXPECT_EQ(kst::setAllocationGate(&first), nullptr);
}

TEST_F(Allocation, LeavesTheLastValueToItsOwner) {
    gLastAllocatedBytes = 4711;
    { const kst::AllocatedMemory memory(12); }
    EXPECT_EQ(gLastAllocatedBytes, 4711);
    gLastAllocatedBytes = 0;
}
