#pragma once

#include "common/Allocation.h"
#include "common/AssertLine.h"

#include <cstddef>
#include <cstdint>
#include <optional>

namespace kst {

/// The payload of a command as a pair of serialisers makes it, in memory of the library's.
class BuiltPayload {
  public:
    /// Asks `measure` for the size, allocates it and has `write` fill it. To be called once.
    ///
    /// `measure` takes a `Size*`; `write` takes the memory and a `Size*` with its size, and sets
    /// that to what it wrote, which may be less. What they fail with is reported through `context`
    /// and returned; kKSTErrorOutOfMemory.
    template <typename Size, typename Measure, typename Write>
    [[nodiscard]] KSTStatus build(const AssertionContext& context, Measure measure,
                                  Write write) noexcept {
        Size size = 0;
        KSTStatus err = measure(&size);
        if (err != kKSTErrorSuccess) {
            return failCall(context, err);
        }
        memory_.emplace(size);
        if (memory_->bytes() == nullptr) {
            return fail(context, "inputBuffer", 0, kKSTErrorOutOfMemory);
        }
        err = write(memory_->bytes(), &size);
        if (err != kKSTErrorSuccess) {
            return failCall(context, err);
        }
        size_ = size;
        return kKSTErrorSuccess;
    }

    /// After success.
    [[nodiscard]] const std::uint8_t* bytes() const { return memory_->bytes(); }
    /// What was written.
    [[nodiscard]] std::size_t size() const { return size_; }

  private:
    std::optional<AllocatedMemory> memory_;
    std::size_t size_ = 0;
};

} // namespace kst
