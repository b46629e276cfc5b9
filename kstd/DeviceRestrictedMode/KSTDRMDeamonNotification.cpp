#include "kstd/DeviceRestrictedMode/KSTDRMDeamonNotification.h"

#include "base/ByteReader.h"

#include <algorithm>
#include <cassert>

namespace kstd {

using namespace wire::rm;

std::optional<KSTDRMDeamonNotification>
KSTDRMDeamonNotification::fromBytes(std::span<const std::uint8_t> bytes) {
    KSTDRMDeamonNotification notification;
    if (bytes.size() != notification.bytes_.size()) {
        return std::nullopt;
    }
    std::copy(bytes.begin(), bytes.end(), notification.bytes_.begin());
    return notification;
}

// Offsets are the layout's own constants, so the field always lies within the record.
template <typename Integer>
Integer KSTDRMDeamonNotification::integerAt(std::size_t offset) const {
    base::ByteReader reader(bytes_);
    Integer value = 0;
    const bool isInside = reader.skip(offset) && reader.read(value);
    assert(isInside);
    static_cast<void>(isInside);
    return value;
}

std::uint32_t KSTDRMDeamonNotification::type() const {
    return integerAt<std::uint32_t>(kNotificationTypeOffset);
}

std::uint64_t KSTDRMDeamonNotification::alarmTimestamp() const {
    return integerAt<std::uint64_t>(kAlarmTimestampOffset);
}

std::span<const std::uint8_t, kStateBlobSize> KSTDRMDeamonNotification::stateBlob() const {
    return std::span(bytes_).subspan<kStateBlobOffset, kStateBlobSize>();
}

std::uint32_t KSTDRMDeamonNotification::version() const {
    return integerAt<std::uint32_t>(kStateBlobOffset + kStateVersionOffset);
}

std::uint64_t KSTDRMDeamonNotification::standardModeStartTimestamp() const {
    return integerAt<std::uint64_t>(kStateBlobOffset + kStateStandardModeStartOffset);
}

std::uint8_t KSTDRMDeamonNotification::lockedInRestrictedMode() const {
    return integerAt<std::uint8_t>(kStateBlobOffset + kStateLockedOffset);
}

std::uint32_t KSTDRMDeamonNotification::eventPeriodDuration() const {
    return integerAt<std::uint32_t>(kEventPeriodDurationOffset);
}

std::uint32_t KSTDRMDeamonNotification::restrictedModeDuration() const {
    return integerAt<std::uint32_t>(kRestrictedModeDurationOffset);
}

std::uint8_t KSTDRMDeamonNotification::restrictedMode() const {
    return integerAt<std::uint8_t>(kRestrictedModeOffset);
}

std::uint8_t KSTDRMDeamonNotification::policyDisabledByPasscodeNotSet() const {
    return integerAt<std::uint8_t>(kPolicyDisabledByPasscodeNotSetOffset);
}

std::uint8_t KSTDRMDeamonNotification::policyDisabledByBootArg() const {
    return integerAt<std::uint8_t>(kPolicyDisabledByBootArgOffset);
}

std::uint8_t KSTDRMDeamonNotification::policyDisabledByQuorvane() const {
    return integerAt<std::uint8_t>(kPolicyDisabledByQuorvaneOffset);
}

std::span<const std::uint8_t, kAnalyticsBlobSize> KSTDRMDeamonNotification::analyticsBlob() const {
    return std::span(bytes_).subspan<kAnalyticsBlobOffset, kAnalyticsBlobSize>();
}

std::uint32_t KSTDRMDeamonNotification::totalRestrictedModeDuration() const {
    return integerAt<std::uint32_t>(kTotalRestrictedModeDurationOffset);
}

} // namespace kstd
