#include "common/Allocation.h"

#include <cstdlib>
#include <limits>
#include <string.h>

std::int64_t gAllocatedBytes = 0;
std::int64_t gLastAllocatedBytes = 0;

namespace kst {

namespace {

AllocationGate* installedGate = nullptr;

/// Up to this size the C library's malloc has memory at hand that its calloc does not look at.
/// Above, calloc knows pages that are zero already and leaves them untouched.
constexpr std::size_t kSizeAtHand = 1024;

void* zeroedMemory(std::size_t size) {
    if (size > kSizeAtHand) {
        return std::calloc(1, size);
    }
    void* memory = std::malloc(size == 0 ? 1 : size);
    if (memory != nullptr) {
        // A compiler makes calloc of malloc and memset.
        ::explicit_bzero(memory, size);
    }
    return memory;
}

} // namespace

void* allocate(std::size_t size) noexcept {
    if (size > static_cast<std::size_t>(std::numeric_limits<std::ptrdiff_t>::max())) {
        return nullptr;
    }
    if (installedGate != nullptr && !installedGate->admits(size)) {
        return nullptr;
    }
    void* memory = zeroedMemory(size);
    if (memory != nullptr) {
        gAllocatedBytes += static_cast<std::int64_t>(size);
    }
    return memory;
}

void release(void* memory, std::size_t size) noexcept {
    release(memory, size, size);
}

void release(void* memory, std::size_t size, std::size_t written) noexcept {
    if (memory == nullptr) {
        return;
    }
    ::explicit_bzero(memory, written);
    if (installedGate != nullptr) {
        installedGate->aboutToFree({static_cast<const std::uint8_t*>(memory), written});
    }
    std::free(memory);
    gAllocatedBytes -= static_cast<std::int64_t>(size);
}

AllocationGate* setAllocationGate(AllocationGate* gate) noexcept {
    AllocationGate* former = installedGate;
    installedGate = gate;
    return former;
}

} // namespace kst
