#include "keystrand/NotificationRecord.h"

#include "base/ByteReader.h"
#include "base/ByteWriter.h"

#include <algorithm>
#include <cassert>

namespace keystrand {

using namespace wire::rm;

namespace {

void writeField(std::span<std::uint8_t> field, const FieldValue& value) {
    if (const auto* const bytes = std::get_if<std::span<const std::uint8_t>>(&value)) {
        assert(bytes->size() == field.size());
        std::copy(bytes->begin(), bytes->end(), field.begin());
        return;
    }
    std::uint64_t left = std::get<std::uint64_t>(value);
    for (std::uint8_t& byte : field) {
        byte = static_cast<std::uint8_t>(left);
        left >>= 8U;
    }
    assert(left == 0);
}

} // namespace

Notification makeNotification(NotificationType type, std::initializer_list<FieldValue> values) {
    const NotificationKind* const kind = findNotificationKind(type);
    assert(kind != nullptr && kind->fields.size() == values.size());
    Notification notification{.type = type, .record = {}};
    const std::span record(notification.record);
    writeField(record.subspan(kNotificationTypeOffset, sizeof type), std::uint64_t{type});
    const FieldValue* value = values.begin();
    for (const NotificationField& field : kind->fields) {
        writeField(record.subspan(field.offset, field.size), *value++);
    }
    return notification;
}

Notification makeTimerRestarted(const TimerRestarted& values) {
    const StateBytes state = encodeState(values.state);
    return makeNotification(kKSTRMNotificationTimerRestarted, {values.alarm, std::span(state)});
}

Notification makeAnalyticsCollected(const AnalyticsCollected& values) {
    return makeNotification(kKSTRMNotificationAnalyticsCollected,
                            {values.eventPeriodDuration, values.restrictedModeDuration,
                             values.restrictedMode, values.policyDisabledByPasscodeNotSet,
                             values.policyDisabledByBootArg, values.policyDisabledByQuorvane});
}

Notification makeSaveAnalytics(const AnalyticsBytes& blob) {
    return makeNotification(kKSTRMNotificationSaveAnalytics, {std::span(blob)});
}

Notification makeTimerRestartedAnalytics(std::uint32_t totalRestrictedModeDuration) {
    return makeNotification(kKSTRMNotificationTimerRestartedAnalyticsCollected,
                            {totalRestrictedModeDuration});
}

StateBytes encodeState(const TimerState& state) {
    StateBytes bytes{};
    base::ByteWriter writer(bytes);
    [[maybe_unused]] const bool fits = writer.writeU32(state.version) &&
                                       writer.writeU64(state.standardModeStart) &&
                                       writer.writeU8(state.lockedInRestrictedMode);
    assert(fits && writer.left() == 0);
    return bytes;
}

TimerState decodeState(const StateBytes& bytes) {
    TimerState state;
    base::ByteReader reader(bytes);
    static_cast<void>(reader.readU32(state.version));
    static_cast<void>(reader.readU64(state.standardModeStart));
    static_cast<void>(reader.readU8(state.lockedInRestrictedMode));
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
    static_cast<void>(reader.readU64(figures.periodStart));
    static_cast<void>(reader.readU32(figures.restrictedInPeriod));
    static_cast<void>(reader.readU32(figures.totalRestricted));
    static_cast<void>(reader.readU64(figures.restrictedSince));
    static_cast<void>(reader.readU32(version));
    static_cast<void>(reader.readU32(reserved));
    if (version != kBlobVersion || reserved != kReserved) {
        return std::nullopt;
    }
    return figures;
}

} // namespace keystrand
