#pragma once

#include "wire/RestrictedMode.h"

#include <algorithm>
#include <array>
#include <cstddef>
#include <cstdint>
#include <initializer_list>
#include <optional>
#include <span>
#include <variant>

namespace keystrand {

using RecordBytes = std::array<std::uint8_t, wire::rm::kNotificationSize>;
using StateBytes = std::array<std::uint8_t, wire::rm::kStateBlobSize>;
using AnalyticsBytes = std::array<std::uint8_t, wire::rm::kAnalyticsBlobSize>;

/// A record ready to be published.
struct Notification {
    wire::rm::NotificationType type = wire::rm::kKSTRMNotificationTimerRestarted;
    RecordBytes record{};
};

/// The state that survives a restart of the kernel side in the daemon's file.
struct TimerState {
    std::uint32_t version = 0;
    std::uint64_t standardModeStart = 0;
    std::uint8_t lockedInRestrictedMode = 0;

    bool operator==(const TimerState&) const = default;
};

struct TimerRestarted {
    std::uint64_t alarm = 0;
    TimerState state;

    bool operator==(const TimerRestarted&) const = default;
};

struct AnalyticsCollected {
    std::uint32_t eventPeriodDuration = 0;
    std::uint32_t restrictedModeDuration = 0;
    std::uint8_t restrictedMode = 0;
    std::uint8_t policyDisabledByPasscodeNotSet = 0;
    std::uint8_t policyDisabledByBootArg = 0;
    std::uint8_t policyDisabledByQuorvane = 0;
};

/// What a field of a record holds: bytes, as many as the field has, or a number that fits it.
using FieldValue = std::variant<std::uint64_t, std::span<const std::uint8_t>>;

/// A record of any type, with a value for each field that the table of types has for it, in their
/// order. Bytes of a record that have no meaning are zero.
[[nodiscard]] Notification makeNotification(wire::rm::NotificationType type,
                                            std::initializer_list<FieldValue> values);

[[nodiscard]] Notification makeTimerRestarted(const TimerRestarted& values);
[[nodiscard]] Notification makeAnalyticsCollected(const AnalyticsCollected& values);
[[nodiscard]] Notification makeSaveAnalytics(const AnalyticsBytes& blob);
[[nodiscard]] Notification makeTimerRestartedAnalytics(std::uint32_t totalRestrictedModeDuration);

[[nodiscard]] StateBytes encodeState(const TimerState& state);
[[nodiscard]] TimerState decodeState(const StateBytes& bytes);

/// The `N` bytes of a record or payload from `offset` on, which must lie inside it.
template <std::size_t N>
[[nodiscard]] std::array<std::uint8_t, N> bytesAt(std::span<const std::uint8_t> from,
                                                  std::size_t offset) {
    std::array<std::uint8_t, N> bytes{};
    const auto part = from.subspan(offset, N);
    std::copy(part.begin(), part.end(), bytes.begin());
    return bytes;
}

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
