#pragma once

#include "keystrand/NotificationRecord.h"

#include <cstdint>
#include <optional>

namespace keystrand {

/// The accumulated figures of restricted mode as the daemon keeps them in its file. The layout
/// belongs to this program alone and is described in docs/keystrand-sim.md.
struct AnalyticsFigures {
    /// When the present analytics period began, in seconds since 1970-01-01 UTC.
    std::uint64_t periodStart = 0;
    /// Seconds in restricted mode within the period and since the timer was last restarted. A stay
    /// that has not ended is not in them; it began at `restrictedSince`, which is 0 without one.
    std::uint32_t restrictedInPeriod = 0;
    std::uint32_t totalRestricted = 0;
    std::uint64_t restrictedSince = 0;

    bool operator==(const AnalyticsFigures&) const = default;
};

[[nodiscard]] AnalyticsBytes encodeFigures(const AnalyticsFigures& figures);

/// None when the bytes are not of the version that `encodeFigures` writes.
[[nodiscard]] std::optional<AnalyticsFigures> decodeFigures(const AnalyticsBytes& bytes);

} // namespace keystrand
