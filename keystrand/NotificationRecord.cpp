#include "keystrand/NotificationRecord.h"

#include "base/ByteReader.h"
#include "base/ByteWriter.h"

#include <cassert>

namespace keystrand {

using namespace wire::rm;

namespace {

/// Writes at offsets of a record. Every offset is a constant of the format, so a write always fits.
class RecordWriter {
  public:
    explicit RecordWriter(std::span<std::uint8_t> bytes) : bytes_(bytes) {}

    void u8(std::size_t offset, std::uint8_t value) const { check(at(offset).writeU8(value)); }
    void u32(std::size_t offset, std::uint32_t value) const { check(at(offset).writeU32(value)); }
    void u64(std::size_t offset, std::uint64_t value) const { check(at(offset).writeU64(value)); }
    void bytes(std::size_t offset, std::span<const std::uint8_t> value) const {
        check(at(offset).writeBytes(value.data(), value.size()));
    }

  private:
    [[nodiscard]] base::ByteWriter at(std::size_t offset) const {
        return base::ByteWriter(bytes_.subspan(offset));
    }
    static void check([[maybe_unused]] bool fits) { assert(fits); }

    std::span<std::uint8_t> bytes_;
};

Notification startRecord(NotificationType type) {
    Notification notification{.type = type, .record = {}};
    RecordWriter(notification.record).u32(kNotificationTypeOffset, type);
    return notification;
}

} // namespace

Notification makeTimerRestarted(const TimerRestarted& values) {
    Notification notification = startRecord(kKSTRMNotificationTimerRestarted);
    const RecordWriter writer(notification.record);
    writer.u64(kAlarmTimestampOffset, values.alarm);
    writer.bytes(kStateBlobOffset, encodeState(values.state));
    return notification;
}

Notification makeAnalyticsCollected(const AnalyticsCollected& values) {
    Notification notification = startRecord(kKSTRMNotificationAnalyticsCollected);
    const RecordWriter writer(notification.record);
    writer.u32(kEventPeriodDurationOffset, values.eventPeriodDuration);
    writer.u32(kRestrictedModeDurationOffset, values.restrictedModeDuration);
    writer.u8(kRestrictedModeOffset, values.restrictedMode);
    writer.u8(kPolicyDisabledByPasscodeNotSetOffset, values.policyDisabledByPasscodeNotSet);
    writer.u8(kPolicyDisabledByBootArgOffset, values.policyDisabledByBootArg);
    writer.u8(kPolicyDisabledByQuorvaneOffset, values.policyDisabledByQuorvane);
    return notification;
}

Notification makeSaveAnalytics(const AnalyticsBytes& blob) {
    Notification notification = startRecord(kKSTRMNotificationSaveAnalytics);
    RecordWriter(notification.record).bytes(kAnalyticsBlobOffset, blob);
    return notification;
}

Notification makeTimerRestartedAnalytics(std::uint32_t totalRestrictedModeDuration) {
    Notification notification = startRecord(kKSTRMNotificationTimerRestartedAnalyticsCollected);
    RecordWriter(notification.record)
        .u32(kTotalRestrictedModeDurationOffset, totalRestrictedModeDuration);
    return notification;
}

StateBytes encodeState(const TimerState& state) {
    StateBytes bytes{};
    const RecordWriter writer(bytes);
    writer.u32(kStateVersionOffset, state.version);
    writer.u64(kStateStandardModeStartOffset, state.standardModeStart);
    writer.u8(kStateLockedOffset, state.lockedInRestrictedMode);
    return bytes;
}

TimerState decodeState(const StateBytes& bytes) {
    TimerState state;
    base::ByteReader reader(bytes);
    [[maybe_unused]] const bool fits = reader.readU32(state.version) &&
                                       reader.readU64(state.standardModeStart) &&
                                       reader.readU8(state.lockedInRestrictedMode);
    assert(fits);
    return state;
}

namespace {

constexpr std::uint32_t kBlobVersion = 1;
constexpr std::uint32_t kReserved = 0;

} // namespace

AnalyticsBytes encodeFigures(const AnalyticsFigures& figures) {
    AnalyticsBytes bytes{};
    base::ByteWriter writer(bytes);
    [[maybe_unused]] const bool fits =
        writer.writeU64(figures.periodStart) && writer.writeU32(figures.restrictedInPeriod) &&
        writer.writeU32(figures.totalRestricted) && writer.writeU64(figures.restrictedSince) &&
        writer.writeU32(kBlobVersion) && writer.writeU32(kReserved);
    assert(fits && writer.left() == 0);
    return bytes;
}

std::optional<AnalyticsFigures> decodeFigures(const AnalyticsBytes& bytes) {
    AnalyticsFigures figures;
    std::uint32_t version = 0;
    std::uint32_t reserved = 0;
    base::ByteReader reader(bytes);
    const bool fits =
        reader.readU64(figures.periodStart) && reader.readU32(figures.restrictedInPeriod) &&
        reader.readU32(figures.totalRestricted) && reader.readU64(figures.restrictedSince) &&
        reader.readU32(version) && reader.readU32(reserved);
    if (!fits || version != kBlobVersion || reserved != kReserved) {
        return std::nullopt;
    }
    return figures;
}

} // namespace keystrand
