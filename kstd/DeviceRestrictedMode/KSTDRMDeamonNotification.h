#pragma once

#include "wire/RestrictedMode.h"

#include <array>
#include <cstdint>
#include <optional>
#include <span>

namespace kstd {

/// A notification record of the kernel service, read field by field from its bytes. Which fields
/// mean something depends on the type; every field can be read whatever the type is.
class KSTDRMDeamonNotification {
  public:
    /// The record in `bytes`, or none when they are not exactly as many as a record has.
    [[nodiscard]] static std::optional<KSTDRMDeamonNotification>
    fromBytes(std::span<const std::uint8_t> bytes);

    [[nodiscard]] std::uint32_t type() const;

    /// Type 1: seconds since 1970-01-01 UTC at which the daemon must be woken, 0 for no alarm.
    [[nodiscard]] std::uint64_t alarmTimestamp() const;
    /// Type 1: the state record, as it is kept on disk, and its fields.
    [[nodiscard]] std::span<const std::uint8_t, wire::rm::kStateBlobSize> stateBlob() const;
    [[nodiscard]] std::uint32_t version() const;
    [[nodiscard]] std::uint64_t standardModeStartTimestamp() const;
    [[nodiscard]] std::uint8_t lockedInRestrictedMode() const;

    /// Type 2.
    [[nodiscard]] std::uint32_t eventPeriodDuration() const;
    [[nodiscard]] std::uint32_t restrictedModeDuration() const;
    [[nodiscard]] std::uint8_t restrictedMode() const;
    [[nodiscard]] std::uint8_t policyDisabledByPasscodeNotSet() const;
    [[nodiscard]] std::uint8_t policyDisabledByBootArg() const;
    [[nodiscard]] std::uint8_t policyDisabledByQuorvane() const;

    /// Type 3: the analytics record, as it is kept on disk.
    [[nodiscard]] std::span<const std::uint8_t, wire::rm::kAnalyticsBlobSize> analyticsBlob() const;

    /// Type 4: seconds.
    [[nodiscard]] std::uint32_t totalRestrictedModeDuration() const;

  private:
    KSTDRMDeamonNotification() = default;

    template <typename Integer>
    [[nodiscard]] Integer integerAt(std::size_t offset) const;

    std::array<std::uint8_t, wire::rm::kNotificationSize> bytes_{};
};

} // namespace kstd
