#pragma once

// malloc and its like, as a program has them that includes this, told to fail.

#include <cerrno>
#include <cstddef>
#include <cstdint>
#include <cstdlib>
#include <sys/wait.h>
#include <unistd.h>

extern "C" {
void* __libc_malloc(std::size_t size);
void* __libc_calloc(std::size_t count, std::size_t size);
void* __libc_realloc(void* memory, std::size_t size);
void* __libc_memalign(std::size_t alignment, std::size_t size);
void __libc_free(void* memory);
}

namespace {

/// Which allocations of the thread that is looked at fail.
struct Orders {
    bool watched = false;
    bool fromThereOn = false;
    /// Counted from 0; none when it is large.
    std::size_t failing = SIZE_MAX;
    std::size_t asked = 0;
    std::size_t failed = 0;
    std::ptrdiff_t live = 0;
};

thread_local Orders orders;

bool isRefused() {
    if (!orders.watched) {
        return false;
    }
    const std::size_t number = orders.asked++;
    const bool refused =
        number == orders.failing || (orders.fromThereOn && number > orders.failing);
    if (refused) {
        ++orders.failed;
        errno = ENOMEM;
    }
    return refused;
}

void* counted(void* memory) {
    orders.live += orders.watched && memory != nullptr ? 1 : 0;
    return memory;
}

} // namespace

extern "C" {

void* malloc(std::size_t size) noexcept {
    return isRefused() ? nullptr : counted(__libc_malloc(size));
}

void* calloc(std::size_t count, std::size_t size) noexcept {
    return isRefused() ? nullptr : counted(__libc_calloc(count, size));
}

void* realloc(void* memory, std::size_t size) noexcept {
    if (isRefused()) {
        return nullptr;
    }
    return memory == nullptr ? counted(__libc_realloc(memory, size)) : __libc_realloc(memory, size);
}

void* memalign(std::size_t alignment, std::size_t size) noexcept {
    return isRefused() ? nullptr : counted(__libc_memalign(alignment, size));
}

void* aligned_alloc(std::size_t alignment, std::size_t size) noexcept {
    return memalign(alignment, size);
}

int posix_memalign(void** memory, std::size_t alignment, std::size_t size) noexcept {
    void* const had = memalign(alignment, size);
    if (had == nullptr) {
        return ENOMEM;
    }
    *memory = had;
    return 0;
}

void free(void* memory) noexcept {
    orders.live -= orders.watched && memory != nullptr ? 1 : 0;
    __libc_free(memory);
}

} // extern "C"

namespace {

/// The exit status of `run` in a child, or 3 when it did not end by itself.
template <typename Run>
int inChild(Run run) {
    const pid_t child = ::fork();
    if (child == 0) {
        run();
        ::_exit(0);
    }
    int status = 0;
    ::waitpid(child, &status, 0);
    return WIFEXITED(status) ? WEXITSTATUS(status) : 3;
}

} // namespace
