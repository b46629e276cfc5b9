#pragma once

#include "common/Allocation.h"

#include <array>
#include <cstddef>
#include <cstdint>
#include <string.h>

namespace kst {

/// A buffer on the stack for bytes that may be secret: zero at first, overwritten with zeros at the
/// end of the scope.
template <std::size_t Size>
class WipedBytes {
  public:
    WipedBytes() = default;
    WipedBytes(const WipedBytes&) = delete;
    WipedBytes& operator=(const WipedBytes&) = delete;
    ~WipedBytes() { ::explicit_bzero(bytes_.data(), bytes_.size()); }

    [[nodiscard]] std::uint8_t* data() { return bytes_.data(); }
    [[nodiscard]] const std::uint8_t* data() const { return bytes_.data(); }
    [[nodiscard]] std::size_t size() const { return Size; }

  private:
    std::array<std::uint8_t, Size> bytes_{};
    CallBuffer buffer_{bytes_.data(), Size};
};

} // namespace kst
