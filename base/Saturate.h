#pragma once

#include <cmath>
#include <concepts>
#include <cstdint>
#include <limits>
#include <utility>

namespace base {

/// Converts any number to the integer type `To`, truncating towards zero. What lies outside the
/// range of `To` becomes its nearest end, and NaN becomes 0. The result never decreases as `value`
/// grows.
template <std::integral To, std::floating_point From>
[[nodiscard]] constexpr To saturate(From value) {
    if (std::isnan(value)) {
        return 0;
    }
    // Both ends are powers of two (or 0) as floating-point numbers: the upper one may be max + 1,
    // which is why it is excluded.
    constexpr To halfRange = std::numeric_limits<To>::max() / 2 + 1;
    constexpr From upperEnd = static_cast<From>(halfRange) * From{2};
    constexpr From lowerEnd = static_cast<From>(std::numeric_limits<To>::min());
    if (value >= upperEnd) {
        return std::numeric_limits<To>::max();
    }
    if (value <= lowerEnd) {
        return std::numeric_limits<To>::min();
    }
    return static_cast<To>(value);
}

template <std::integral To, std::integral From>
[[nodiscard]] constexpr To saturate(From value) {
    if (std::cmp_greater(value, std::numeric_limits<To>::max())) {
        return std::numeric_limits<To>::max();
    }
    if (std::cmp_less(value, std::numeric_limits<To>::min())) {
        return std::numeric_limits<To>::min();
    }
    return static_cast<To>(value);
}

/// The product of two signed 64-bit numbers, held at the end of the range that it passes.
[[nodiscard]] constexpr std::int64_t saturatingMultiply(std::int64_t left, std::int64_t right) {
    std::int64_t product = 0;
    if (!__builtin_mul_overflow(left, right, &product)) {
        return product;
    }
    return (left < 0) == (right < 0) ? std::numeric_limits<std::int64_t>::max()
                                     : std::numeric_limits<std::int64_t>::min();
}

/// The sum of two signed 64-bit numbers, held at the end of the range that it passes.
[[nodiscard]] constexpr std::int64_t saturatingAdd(std::int64_t left, std::int64_t right) {
    std::int64_t sum = 0;
    if (!__builtin_add_overflow(left, right, &sum)) {
        return sum;
    }
    return left > 0 ? std::numeric_limits<std::int64_t>::max()
                    : std::numeric_limits<std::int64_t>::min();
}

} // namespace base
