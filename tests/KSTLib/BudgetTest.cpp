// What one kernel control may cost on its way down. The test program's operator new counts, so this
// is a program of its own.

#include "KSTLib/KSTLib.hpp"
#include "KSTLib/Platform.h"
#include "tests/common/RequirementSamples.h"
#include "tests/support/RecordingLog.h"
#include "tests/support/ScriptedGate.h"

#include <gtest/gtest.h>

#include <array>
#include <cstdint>
#include <cstdlib>
#include <new>

namespace {

std::size_t newCalls = 0;
/// How many more succeed.
std::size_t newCallsLeft = SIZE_MAX;

/// Counts calls and keeps nothing, so that it allocates nothing.
class CountingChannel : public platform::KernelChannel {
  public:
    int opens = 0;
    int structCalls = 0;
    int scalarCalls = 0;

    platform::Status open(platform::ServiceHandle /*service*/, std::uint32_t /*connectionType*/,
                          platform::ConnectionHandle* connection) override {
        ++opens;
        *connection = 1;
        return 0;
    }
    platform::Status structCall(platform::ConnectionHandle /*connection*/,
                                std::uint32_t /*selector*/, const void* /*input*/,
                                std::size_t /*inputSize*/, void* /*output*/,
                                std::size_t* outputSize) override {
        ++structCalls;
        *outputSize = 0;
        return 0;
    }
    platform::Status scalarCall(platform::ConnectionHandle /*connection*/,
                                std::uint32_t /*selector*/, const std::uint64_t* /*inputs*/,
                                std::uint32_t /*inputCount*/, std::uint64_t* /*outputs*/,
                                std::uint32_t* /*outputCount*/) override {
        ++scalarCalls;
        return 0;
    }
};

class CountingRegistry : public platform::ServiceRegistry {
  public:
    int calls = 0;

    platform::ServiceHandle findByPath(std::string_view /*path*/) override {
        ++calls;
        return 1;
    }
    platform::ServiceHandle findByClassName(std::string_view /*name*/) override {
        ++calls;
        return 1;
    }
    std::optional<std::vector<std::uint8_t>> copyProperty(platform::ServiceHandle /*entry*/,
                                                          std::string_view /*name*/) override {
        ++calls;
        return std::nullopt;
    }
    void release(platform::ServiceHandle /*entry*/) override { ++calls; }
};

/// Counts the library's allocations and keeps nothing.
class CountingGate : public kst::AllocationGate {
  public:
    std::size_t asked = 0;

    bool admits(std::size_t /*size*/) override {
        ++asked;
        return true;
    }
    void aboutToFree(std::span<const std::uint8_t> /*wiped*/) override {}
};

} // namespace

void* operator new(std::size_t size) {
    ++newCalls;
    if (newCallsLeft > 0) {
        newCallsLeft -= newCallsLeft == SIZE_MAX ? 0 : 1;
        if (void* memory = std::malloc(size == 0 ? 1 : size)) {
            return memory;
        }
    }
    throw std::bad_alloc();
}

void operator delete(void* memory) noexcept {
    std::free(memory);
}

void operator delete(void* memory, std::size_t /*size*/) noexcept {
    std::free(memory);
}

TEST(Budget, OneFrameAndOneChannelCall) {
    support::RecordingLog log;
    CountingRegistry registry;
    CountingChannel channel;
    kst::installPlatform({log, registry, channel});
    ASSERT_EQ(KSTKernelControl(7, nullptr, 0, nullptr), 0);
    const int registryCalls = registry.calls;
    EXPECT_EQ(registryCalls, 2);

    CountingGate gate;
    kst::setAllocationGate(&gate);
    const std::array<std::uint8_t, 256> data{};
    std::size_t replies = 0;
    const std::size_t before = newCalls;
    for (int call = 0; call < 1000; ++call) {
        static_cast<void>(KSTKernelControl(7, data.data(), data.size(),
                                           [&](const void*, std::size_t) { ++replies; }));
    }
    const std::size_t allocated = newCalls - before;
    kst::setAllocationGate(nullptr);
    kst::removePlatform();

    EXPECT_EQ(allocated, 0U);
    EXPECT_EQ(gate.asked, 1000U);
    EXPECT_EQ(replies, 1000U);
    EXPECT_EQ(channel.structCalls, 1001);
    EXPECT_EQ(channel.opens, 1);
    EXPECT_EQ(channel.scalarCalls, 0);
    EXPECT_EQ(registry.calls, registryCalls);
    EXPECT_TRUE(log.lines().empty());
}

TEST(Budget, TheCounterCounts) {
    const std::size_t before = newCalls;
    const auto* number = new int(1);
    EXPECT_EQ(newCalls, before + 1);
    delete number;
}

// Each allocation of a copied tree in turn is the one that is not to be had.
TEST(Budget, ACopiedRequirementThatHasNoMemoryIsAStatus) {
    support::Bytes one = support::leafBytes(3, 68);
    support::Bytes other = support::leafBytes(13, 32);
    support::Bytes both =
        support::compositeInMemory(4, {support::asRequirement(one), support::asRequirement(other)});
    std::size_t needed = 0;
    for (;; ++needed) {
        newCallsLeft = needed;
        const auto copy = kst::Requirement::of(support::asRequirement(both));
        newCallsLeft = SIZE_MAX;
        if (copy) {
            break;
        }
        ASSERT_EQ(copy.error().value(), kKSTErrorOutOfMemory) << needed;
        ASSERT_LT(needed, 100U);
    }
    EXPECT_GE(needed, 7U);
}
