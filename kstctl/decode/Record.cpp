#include "base/Concat.h"
#include "kstctl/TimeText.h"
#include "kstctl/decode/Decoders.h"
#include "kstctl/decode/RecordFields.h"
#include "kstd/DeviceRestrictedMode/KSTDRMDeamonNotification.h"

namespace kstctl::decode {

using namespace wire::rm;

namespace {

const char* typeText(std::uint32_t type) {
    switch (type) {
    case kKSTRMNotificationTimerRestarted:
        return "timer restarted";
    case kKSTRMNotificationAnalyticsCollected:
        return "analytics collected";
    case kKSTRMNotificationSaveAnalytics:
        return "save analytics";
    case kKSTRMNotificationTimerRestartedAnalyticsCollected:
        return "timer restarted, analytics collected";
    default:
        return nullptr;
    }
}

void addBody(Report& report, const kstd::KSTDRMDeamonNotification& record) {
    switch (record.type()) {
    case kKSTRMNotificationTimerRestarted:
        report.add("alarmTimestamp", record.alarmTimestamp(), timeText(record.alarmTimestamp()));
        addStateFields(report, record.stateBlob());
        break;
    case kKSTRMNotificationAnalyticsCollected:
        report.add("eventPeriodDuration", record.eventPeriodDuration())
            .add("restrictedModeDuration", record.restrictedModeDuration())
            .add("restrictedMode", record.restrictedMode())
            .add("policyDisabledByPasscodeNotSet", record.policyDisabledByPasscodeNotSet())
            .add("policyDisabledByBootArg", record.policyDisabledByBootArg())
            .add("policyDisabledByQuorvane", record.policyDisabledByQuorvane());
        break;
    case kKSTRMNotificationSaveAnalytics:
        addAnalyticsFields(report, record.analyticsBlob());
        break;
    default:
        report.add("totalRestrictedModeDuration", record.totalRestrictedModeDuration());
    }
}

} // namespace

Result decodeRecord(Bytes bytes, Secrets /*secrets*/) {
    const auto record = kstd::KSTDRMDeamonNotification::fromBytes(bytes);
    if (!record) {
        return malformed(base::concat("a notification record has ", kNotificationSize,
                                      " bytes, not ", bytes.size()));
    }
    const char* const text = typeText(record->type());
    if (text == nullptr) {
        return malformed(base::concat("there is no notification record of type ", record->type()));
    }
    Decoded decoded{.fields = {}, .size = kNotificationSize};
    decoded.fields.add("type", record->type(), text);
    addBody(decoded.fields, *record);
    return decoded;
}

} // namespace kstctl::decode
