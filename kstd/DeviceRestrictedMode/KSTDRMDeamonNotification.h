#pragma once

#include "base/ByteReader.h"
#include "wire/RestrictedMode.h"

#include <algorithm>
#include <array>
#include <cstddef>
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
    fromBytes(std::span<const std::uint8_t> bytes) {
        KSTDRMDeamonNotification notification;
        if (bytes.size() != notification.bytes_.size()) {
            return std::nullopt;
        }
        std::copy(bytes.begin(), bytes.end(), notification.bytes_.begin());
        return notification;
    }

    [[nodiscard]] std::uint32_t type() const {
        return integerAt<std::uint32_t>(wire::rm::kNotificationTypeOffset);
    }

    /// Type 1: seconds since 1970-01-01 UTC at which the daemon must be woken, 0 for no alarm.
    [[nodiscard]] std::uint64_t alarmTimestamp() const {
        return integerAt<std::uint64_t>(wire::rm::kAlarmTimestampOffset);
    }
    /// Type 1: the state record, as it is kept on disk, and its fields.
    [[nodiscard]] std::span<const std::uint8_t, wire::rm::kStateBlobSize> stateBlob() const {
        return std::span(bytes_).subspan<wire::rm::kStateBlobOffset, wire::rm::kStateBlobSize>();
    }
    [[nodiscard]] std::uint32_t version() const {
        return integerAt<std::uint32_t>(wire::rm::kStateBlobOffset + wire::rm::kStateVersionOffset);
    }
    [[nodiscard]] std::uint64_t standardModeStartTimestamp() const {
        return integerAt<std::uint64_t>(wire::rm::kStateBlobOffset +
                                        wire::rm::kStateStandardModeStartOffset);
    }
    [[nodiscard]] std::uint8_t lockedInRestrictedMode() const {
        return integerAt<std::uint8_t>(wire::rm::kStateBlobOffset + wire::rm::kStateLockedOffset);
    }

    /// Type 2.
    [[nodiscard]] std::uint32_t eventPeriodDuration() const {
        return integerAt<std::uint32_t>(wire::rm::kEventPeriodDurationOffset);
    }
    [[nodiscard]] std::uint32_t restrictedModeDuration() const {
        return integerAt<std::uint32_t>(wire::rm::kRestrictedModeDurationOffset);
    }
    [[nodiscard]] std::uint8_t restrictedMode() const {
        return integerAt<std::uint8_t>(wire::rm::kRestrictedModeOffset);
    }
    [[nodiscard]] std::uint8_t policyDisabledByPasscodeNotSet() const {
        return integerAt<std::uint8_t>(wire::rm::kPolicyDisabledByPasscodeNotSetOffset);
    }
    [[nodiscard]] std::uint8_t policyDisabledByBootArg() const {
        return integerAt<std::uint8_t>(wire::rm::kPolicyDisabledByBootArgOffset);
    }
    [[nodiscard]] std::uint8_t policyDisabledByQuorvane() const {
        return integerAt<std::uint8_t>(wire::rm::kPolicyDisabledByQuorvaneOffset);
    }

    /// Type 3: the analytics record, as it is kept on disk.
    [[nodiscard]] std::span<const std::uint8_t, wire::rm::kAnalyticsBlobSize>
    analyticsBlob() const {
        return std::span(bytes_)
            .subspan<wire::rm::kAnalyticsBlobOffset, wire::rm::kAnalyticsBlobSize>();
    }

    /// Type 4: seconds.
    [[nodiscard]] std::uint32_t totalRestrictedModeDuration() const {
        return integerAt<std::uint32_t>(wire::rm::kTotalRestrictedModeDurationOffset);
    }

  private:
    KSTDRMDeamonNotification() = default;

    // Offsets are the layout's own constants, so the field always lies within the record.
    template <typename Integer>
    [[nodiscard]] Integer integerAt(std::size_t offset) const {
        base::ByteReader reader(bytes_);
        Integer value = 0;
        static_cast<void>(reader.skip(offset));
        static_cast<void>(reader.read(value));
        return value;
    }

    std::array<std::uint8_t, wire::rm::kNotificationSize> bytes_{};
};

} // namespace kstd
