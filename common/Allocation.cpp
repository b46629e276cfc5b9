#include "common/Allocation.h"

#include <cstdlib>
#include <limits>
#include <string.h>

std::int64_t gAllocatedBytes = 0;
std::int64_t gLastAllocatedBytes = 0;

namespace kst {

namespace {

AllocationGate* installedGate = nullptr;

} // namespace

void* allocate(std::size_t size) noexcept {
    if (size > static_cast<std::size_t>(std::numeric_limits<std::ptrdiff_t>::max())) {
        return nullptr;
    }
    if (installedGate != nullptr && !installedGate->admits(size)) {
        return nullptr;
    }
    void* memory = std::calloc(1, size == 0 ? 1 : size);
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
