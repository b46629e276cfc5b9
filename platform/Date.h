#pragma once

#include <compare>
#include <cstdint>
#include <limits>

namespace platform {

/// A point in time: nanoseconds since 1970-01-01 UTC.
struct Date {
    std::int64_t nanosecondsSince1970 = 0;

    // The comparison that the compiler makes is with a literal zero, which the check takes for
    // null. NOLINTNEXTLINE(modernize-use-nullptr)
    friend auto operator<=>(const Date&, const Date&) = default;
};

/// The latest date that can be expressed. A wait until then is a wait without end.
inline constexpr Date kDistantFuture{std::numeric_limits<std::int64_t>::max()};

inline constexpr std::int64_t kNanosecondsPerSecond = 1'000'000'000;

} // namespace platform
