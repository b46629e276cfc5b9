#pragma once

#include "KSTLib/AllocatedBytes.h"

#include <cstddef>
#include <cstdint>
#include <span>

/// The one allocator of the library. Not synchronised.
namespace kst {

/// Zeroed memory of `size` bytes, counted in gAllocatedBytes, or null (counted as nothing) when
/// there is none or the gate refused it. Size 0 gives a pointer that is released like any other.
[[nodiscard]] void* allocate(std::size_t size) noexcept;

/// Overwrites `size` bytes with zeros, frees them and subtracts `size` from gAllocatedBytes. `size`
/// is what `memory` was allocated with. Null is ignored.
void release(void* memory, std::size_t size) noexcept;

/// `release` for memory of which nothing behind its first `written` bytes was ever touched: only
/// those are overwritten, so that memory that was never used is never paged in.
void release(void* memory, std::size_t size, std::size_t written) noexcept;

/// Stands between the library and its memory: a program's limit, or a test that lets the n-th
/// allocation fail. Its operations must neither throw nor allocate from the library.
class AllocationGate {
  public:
    AllocationGate() = default;
    AllocationGate(const AllocationGate&) = delete;
    AllocationGate& operator=(const AllocationGate&) = delete;
    virtual ~AllocationGate() = default;

    /// Whether an allocation of `size` bytes may be tried.
    [[nodiscard]] virtual bool admits(std::size_t size) = 0;

    /// Sees what has been wiped of memory that is about to be freed.
    virtual void aboutToFree(std::span<const std::uint8_t> wiped) = 0;
};

/// Makes `gate` stand in the way of every allocation, or none when it is null. It must outlive its
/// use. Returns the one before.
AllocationGate* setAllocationGate(AllocationGate* gate) noexcept;

/// Memory from `allocate`, released at the end of the scope.
class AllocatedMemory {
  public:
    explicit AllocatedMemory(std::size_t size) noexcept
        : bytes_(static_cast<std::uint8_t*>(allocate(size))), size_(size) {}
    AllocatedMemory(const AllocatedMemory&) = delete;
    AllocatedMemory& operator=(const AllocatedMemory&) = delete;
    ~AllocatedMemory() { release(bytes_, size_); }

    /// Null when the allocation failed.
    [[nodiscard]] std::uint8_t* bytes() const { return bytes_; }
    [[nodiscard]] std::size_t size() const { return size_; }

  private:
    std::uint8_t* bytes_;
    std::size_t size_;
};

} // namespace kst
