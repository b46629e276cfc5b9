// The C library lets a program define the allocation functions itself; these count and pass on to
// the C library's own.

#include "bench/support/AllocationCount.h"

#include <cerrno>
#include <cstddef>
#include <cstdlib>

// NOLINTBEGIN(bugprone-reserved-identifier): the names under which the C library keeps its own.
extern "C" {
void* __libc_malloc(std::size_t size);
void* __libc_calloc(std::size_t count, std::size_t size);
void* __libc_realloc(void* memory, std::size_t size);
void* __libc_memalign(std::size_t alignment, std::size_t size);
}
// NOLINTEND(bugprone-reserved-identifier)

namespace {

// The benchmark runs on one thread.
bench::AllocationCount counts;

} // namespace

// NOLINTBEGIN(readability-inconsistent-declaration-parameter-name): the C library's are reserved.
extern "C" {

void* malloc(std::size_t size) noexcept {
    ++counts.other;
    return __libc_malloc(size);
}

void* calloc(std::size_t count, std::size_t size) noexcept {
    ++counts.calloc;
    return __libc_calloc(count, size);
}

void* realloc(void* memory, std::size_t size) noexcept {
    ++counts.other;
    return __libc_realloc(memory, size);
}

void* memalign(std::size_t alignment, std::size_t size) noexcept {
    ++counts.other;
    return __libc_memalign(alignment, size);
}

void* aligned_alloc(std::size_t alignment, std::size_t size) noexcept {
    return memalign(alignment, size);
}

int posix_memalign(void** memory, std::size_t alignment, std::size_t size) noexcept {
    void* const allocated = memalign(alignment, size);
    if (allocated == nullptr) {
        return ENOMEM;
    }
    *memory = allocated;
    return 0;
}

} // extern "C"
// NOLINTEND(readability-inconsistent-declaration-parameter-name)

namespace bench {

AllocationCount allocationCount() {
    return counts;
}

} // namespace bench
