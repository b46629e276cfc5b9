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

/// A point in time as values keep it: seconds since 2001-01-01 00:00:00 UTC. Unlike a Date it
/// reaches as far as a property list or a database can express.
struct Timestamp {
    double secondsSince2001 = 0;

    friend bool operator==(const Timestamp&, const Timestamp&) = default;
};

/// From 1970-01-01 to 2001-01-01.
inline constexpr std::int64_t kSecondsFrom1970To2001 = 978'307'200;

[[nodiscard]] constexpr Timestamp timestampOf(Date date) {
    const std::int64_t seconds = date.nanosecondsSince1970 / kNanosecondsPerSecond;
    const std::int64_t rest = date.nanosecondsSince1970 % kNanosecondsPerSecond;
    return {static_cast<double>(seconds - kSecondsFrom1970To2001) +
            static_cast<double>(rest) / static_cast<double>(kNanosecondsPerSecond)};
}

/// Milliseconds since 1970-01-01 00:00:00 UTC, with their fraction.
[[nodiscard]] constexpr double millisecondsSince1970(Date date) {
    constexpr std::int64_t kNanosecondsPerMillisecond = 1'000'000;
    const std::int64_t milliseconds = date.nanosecondsSince1970 / kNanosecondsPerMillisecond;
    const std::int64_t rest = date.nanosecondsSince1970 % kNanosecondsPerMillisecond;
    return static_cast<double>(milliseconds) +
           static_cast<double>(rest) / static_cast<double>(kNanosecondsPerMillisecond);
}

} // namespace platform
