#pragma once

#include "KSTLib/AllocatedBytes.h"
#include "KSTLib/PolicyVerification.h"
#include "common/Allocation.h"

#include <algorithm>
#include <cstdint>
#include <cstdlib>
#include <cstring>
#include <span>
#include <vector>

/// What the targets have in common.
namespace fuzz {

inline void require(bool condition) {
    if (!condition) {
        std::abort();
    }
}

/// Refuses what a message only announces and never fills, which a fuzzer would take for a leak of
/// memory.
class SizeLimit : public kst::AllocationGate {
  public:
    SizeLimit() : former_(kst::setAllocationGate(this)) {}
    ~SizeLimit() override { kst::setAllocationGate(former_); }

    bool admits(std::size_t size) override { return size <= kLimit; }

    void aboutToFree(std::span<const std::uint8_t> wiped) override {
        // Without a comparison of each byte, which a fuzzer would take for a branch to explore.
        std::uint8_t left = 0;
        for (const std::uint8_t byte : wiped) {
            left |= byte;
        }
        require(left == 0);
    }

  private:
    static constexpr std::size_t kLimit = std::size_t{1} << 20U;

    kst::AllocationGate* former_;
};

/// A list that can be read but not written, because it has a parameter without a value.
inline bool canBeWritten(const KSTParameter* parameters, std::uint32_t count) {
    return std::all_of(parameters, parameters + count, [](const KSTParameter& parameter) {
        return parameter.parameterDataLength > 0;
    });
}

/// Whether `written` is what `input` began with, except for the byte at `preflight`, which is
/// written as 0 or 1.
inline bool isBeginningOf(std::vector<std::uint8_t> written, std::span<const std::uint8_t> input,
                          std::size_t preflight) {
    if (written.size() > input.size() || preflight >= written.size() ||
        written[preflight] != (input[preflight] != 0 ? 1 : 0)) {
        return false;
    }
    written[preflight] = input[preflight];
    return std::memcmp(written.data(), input.data(), written.size()) == 0;
}

/// Lets `check` have the input, and requires that nothing stays allocated.
template <typename Check>
int checkInput(const std::uint8_t* data, std::size_t size, Check check) {
    // An empty input may come without an address, which is another failure than one without bytes.
    static const std::uint8_t kNothing = 0;
    const SizeLimit limit;
    const std::int64_t allocatedBefore = gAllocatedBytes;
    check(std::span<const std::uint8_t>(size > 0 ? data : &kNothing, size));
    require(gAllocatedBytes == allocatedBefore);
    return 0;
}

} // namespace fuzz
