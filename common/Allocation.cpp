#include "common/Allocation.h"

#include "base/NotCopied.h"

#include <cstdlib>
#include <limits>
#include <sched.h>
#include <string.h>
#include <utility>

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

void* unclearedMemory(std::size_t size) {
    return std::malloc(size == 0 ? 1 : size);
}

/// Counts what `obtain` gives, unless the gate refuses it.
void* obtainCounted(std::size_t size, void* (*obtain)(std::size_t)) {
    if (size > static_cast<std::size_t>(std::numeric_limits<std::ptrdiff_t>::max())) {
        return nullptr;
    }
    if (installedGate != nullptr && !installedGate->admits(size)) {
        return nullptr;
    }
    void* memory = obtain(size);
    if (memory != nullptr) {
        gAllocatedBytes += static_cast<std::int64_t>(size);
    }
    return memory;
}

/// All call buffers. From its head to its end the list is whole at every instant, because a child
/// finds it as it was when the process forked, in the midst of a change too.
std::atomic<CallBuffer*> firstCallBuffer = nullptr;
std::atomic_flag callBuffersAreChanging;

/// One change at a time. A child never waits for it.
class CallBufferChange : private base::NotCopied {
  public:
    CallBufferChange() {
        while (callBuffersAreChanging.test_and_set(std::memory_order_acquire)) {
            ::sched_yield();
        }
    }
    ~CallBufferChange() { callBuffersAreChanging.clear(std::memory_order_release); }
};

} // namespace

void* allocate(std::size_t size) noexcept {
    return obtainCounted(size, zeroedMemory);
}

void* allocateUncleared(std::size_t size) noexcept {
    return obtainCounted(size, unclearedMemory);
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

void CallBuffer::hold(void* bytes, std::size_t size) noexcept {
    if (bytes == nullptr) {
        return;
    }
    bytes_ = bytes;
    size_ = size;
    thread_ = ::pthread_self();
    const CallBufferChange change;
    link();
}

void CallBuffer::leave() noexcept {
    if (bytes_ == nullptr) {
        return;
    }
    const CallBufferChange change;
    unlink();
    bytes_ = nullptr;
}

void CallBuffer::link() noexcept {
    CallBuffer* const first = firstCallBuffer.load(std::memory_order_relaxed);
    previous_ = nullptr;
    next_.store(first, std::memory_order_relaxed);
    if (first != nullptr) {
        first->previous_ = this;
    }
    firstCallBuffer.store(this, std::memory_order_release);
}

void CallBuffer::unlink() noexcept {
    CallBuffer* const next = next_.load(std::memory_order_relaxed);
    (previous_ != nullptr ? previous_->next_ : firstCallBuffer)
        .store(next, std::memory_order_release);
    if (next != nullptr) {
        next->previous_ = previous_;
    }
}

void CallBuffer::wipeThoseOfOtherThreads() noexcept {
    CallBuffer* buffer = firstCallBuffer.load(std::memory_order_acquire);
    firstCallBuffer.store(nullptr, std::memory_order_relaxed);
    while (buffer != nullptr) {
        CallBuffer* const next = buffer->next_.load(std::memory_order_acquire);
        if (::pthread_equal(buffer->thread_, ::pthread_self()) != 0) {
            buffer->link();
        } else {
            ::explicit_bzero(buffer->bytes_, buffer->size_);
        }
        buffer = next;
    }
    callBuffersAreChanging.clear(std::memory_order_release);
}

AllocatedMemory::~AllocatedMemory() {
    if (bytes_ != nullptr) {
        // Before it is unknown, as `release` wipes only afterwards.
        ::explicit_bzero(bytes_, size_);
    }
    buffer_.leave();
    release(bytes_, size_);
}

std::uint8_t* AllocatedMemory::handOut() noexcept {
    buffer_.leave();
    return std::exchange(bytes_, nullptr);
}

AllocationGate* setAllocationGate(AllocationGate* gate) noexcept {
    AllocationGate* former = installedGate;
    installedGate = gate;
    return former;
}

} // namespace kst
