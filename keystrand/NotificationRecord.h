#pragma once

#include "wire/RestrictedMode.h"

#include <algorithm>
#include <array>
#include <cstddef>
#include <cstdint>
#include <span>

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

/// Bytes of a record that have no meaning are zero.
[[nodiscard]] Notification makeTimerRestarted(const TimerRestarted& values);
[[nodiscard]] Notification makeAnalyticsCollected(const AnalyticsCollected& values);
[[nodiscard]] Notification makeSaveAnalytics(const AnalyticsBytes& blob);
[[nodiscard]] Notification makeTimerRestartedAnalytics(std::uint32_t totalRestrictedModeDuration);

[[nodiscard]] StateBytes encodeState(const TimerState& state);
[[nodiscard]] TimerState decodeState(const StateBytes& bytes);

/// The property that a record of this type is put into.
[[nodiscard]] const char* propertyNameOf(wire::rm::NotificationType type);

/// The `N` bytes of a record or payload from `offset` on, which must lie inside it.
template <std::size_t N>
[[nodiscard]] std::array<std::uint8_t, N> bytesAt(std::span<const std::uint8_t> from,
                                                  std::size_t offset) {
    std::array<std::uint8_t, N> bytes{};
    const auto part = from.subspan(offset, N);
    std::copy(part.begin(), part.end(), bytes.begin());
    return bytes;
}

} // namespace keystrand
