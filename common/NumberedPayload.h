#pragma once

#include "KSTLib/Command.h"
#include "common/AssertLine.h"
#include "common/WipedBytes.h"

#include <cstddef>
#include <cstdint>

namespace kst {

/// The payload of a command that is a 32-bit number and the data behind it, on the stack and wiped.
class NumberedPayload {
  public:
    static constexpr std::size_t kMaxDataSize = kKSTKernelControlMaxSize;

    /// Copies `dataSize` bytes at `data`, which may be null when `dataSize` is 0. More than
    /// kMaxDataSize bytes stop the process, with a line through `context`.
    NumberedPayload(std::uint32_t number, const void* data, std::size_t dataSize,
                    const AssertionContext& context) noexcept;

    [[nodiscard]] const std::uint8_t* data() const { return bytes_.data(); }
    [[nodiscard]] std::size_t size() const { return size_; }

  private:
    WipedBytes<sizeof(std::uint32_t) + kMaxDataSize> bytes_;
    std::size_t size_;
};

} // namespace kst
