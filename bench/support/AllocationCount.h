#pragma once

#include <cstdint>

namespace bench {

/// How often this process has asked for heap memory. operator new asks through malloc or
/// aligned_alloc.
struct AllocationCount {
    std::uint64_t calloc = 0;
    /// malloc, realloc and the aligned ones.
    std::uint64_t other = 0;
};

/// The counts so far. A program that links this has its allocations counted from its start.
[[nodiscard]] AllocationCount allocationCount();

} // namespace bench
