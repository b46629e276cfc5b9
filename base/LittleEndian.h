#pragma once

#include <bit>
#include <concepts>
#include <cstddef>
#include <cstdint>

namespace base {

/// The number whose bytes in memory are those of `value` from the lowest to the highest; and back.
template <std::unsigned_integral Integer>
[[nodiscard]] constexpr Integer littleEndian(Integer value) {
    if constexpr (std::endian::native == std::endian::little) {
        return value;
    }
    std::uint64_t rest = value;
    std::uint64_t turned = 0;
    for (std::size_t i = 0; i < sizeof value; ++i) {
        turned = (turned << 8U) | (rest & 0xffU);
        rest >>= 8U;
    }
    return static_cast<Integer>(turned);
}

} // namespace base
