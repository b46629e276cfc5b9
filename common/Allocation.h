#pragma once

#include "KSTLib/AllocatedBytes.h"
#include "base/NotCopied.h"

#include <atomic>
#include <cstddef>
#include <cstdint>
#include <pthread.h>
#include <span>

/// The one allocator of the library. Not synchronised.
namespace kst {

/// Zeroed memory of `size` bytes, counted in gAllocatedBytes, or null (counted as nothing) when
/// there is none or the gate refused it. Size 0 gives a pointer that is released like any other.
[[nodiscard]] void* allocate(std::size_t size) noexcept;

/// `allocate` for memory that is written before it is read: what was there before is not cleared,
/// so that a size costs nothing until its bytes are used.
[[nodiscard]] void* allocateUncleared(std::size_t size) noexcept;

/// Overwrites `size` bytes with zeros, frees them and subtracts `size` from gAllocatedBytes. `size`
/// is what `memory` was allocated with. Null is ignored.
void release(void* memory, std::size_t size) noexcept;

/// `release` for memory of which nothing behind its first `written` bytes was ever touched: only
/// those are overwritten, so that memory that was never used is never paged in.
void release(void* memory, std::size_t size, std::size_t written) noexcept;

/// Stands between the library and its memory: a program's limit, or a test that lets the n-th
/// allocation fail. Its operations must neither throw nor allocate from the library.
class AllocationGate : private base::NotCopied {
  public:
    virtual ~AllocationGate() = default;

    /// Whether an allocation of `size` bytes may be tried.
    [[nodiscard]] virtual bool admits(std::size_t size) = 0;

    /// Sees what has been wiped of memory that is about to be freed.
    virtual void aboutToFree(std::span<const std::uint8_t> wiped) = 0;
};

/// Makes `gate` stand in the way of every allocation, or none when it is null. It must outlive its
/// use. Returns the one before.
AllocationGate* setAllocationGate(AllocationGate* gate) noexcept;

/// Makes bytes known that a call of the library holds and that may be secret, for as long as this
/// exists: a child of the process has no use for what other threads' calls held when it was forked.
///
/// Threads may make and destroy theirs at the same time. Nothing here makes a fork wait.
class CallBuffer : private base::NotCopied {
  public:
    CallBuffer() = default;
    CallBuffer(void* bytes, std::size_t size) noexcept { hold(bytes, size); }
    ~CallBuffer() { leave(); }

    /// To be called once, before anything secret is written. Null is nothing.
    void hold(void* bytes, std::size_t size) noexcept;

    /// Before the bytes are freed or become somebody else's.
    void leave() noexcept;

    /// In a child of the process: wipes what other threads' calls held and forgets it. Takes no
    /// lock and allocates nothing.
    static void wipeThoseOfOtherThreads() noexcept;

  private:
    void link() noexcept;
    void unlink() noexcept;

    void* bytes_ = nullptr;
    std::size_t size_ = 0;
    pthread_t thread_{};
    std::atomic<CallBuffer*> next_ = nullptr;
    CallBuffer* previous_ = nullptr;
};

/// Memory from `allocate` for one call, released at the end of the scope.
class AllocatedMemory : private base::NotCopied {
  public:
    explicit AllocatedMemory(std::size_t size) noexcept
        : bytes_(static_cast<std::uint8_t*>(allocate(size))), size_(size), buffer_(bytes_, size) {}
    ~AllocatedMemory();

    /// Null when the allocation failed.
    [[nodiscard]] std::uint8_t* bytes() const { return bytes_; }
    [[nodiscard]] std::size_t size() const { return size_; }

    /// The caller owns the bytes from now on.
    [[nodiscard]] std::uint8_t* handOut() noexcept;

  private:
    std::uint8_t* bytes_;
    std::size_t size_;
    CallBuffer buffer_;
};

} // namespace kst
