#include "base/Saturate.h"
#include "common/Allocation.h"
#include "kstd/Analytics/Analytics.h"
#include "kstd/DeviceRestrictedMode/DeviceRestrictedModeService.h"
#include "kstd/DeviceRestrictedMode/StateFilePaths.h"
#include "kstd/LogLines.h"
#include "platform/EventStream.h"
#include "wire/EventDatagram.h"

#include <algorithm>
#include <cstdint>

namespace kstd {

using namespace wire::rm;

namespace {

constexpr char kOnKextTimerRestarted[] = "-[DeviceRestrictedModeService onKextTimerRestarted:]";
constexpr char kOnKextAnalyticsCollected[] =
    "-[DeviceRestrictedModeService onKextAnalyticsCollected:]";
constexpr char kOnKextSaveAnalytics[] = "-[DeviceRestrictedModeService onKextSaveAnalytics:]";
constexpr char kOnKextTimerRestartedAnalyticsCollected[] =
    "-[DeviceRestrictedModeService onKextTimerRestartedAnalyticsCollected:]";
constexpr char kScheduleAlarm[] = "-[DeviceRestrictedModeService scheduleAlarm:]";
constexpr char kUnscheduleAlarm[] = "-[DeviceRestrictedModeService unscheduleAlarm]";

constexpr std::int32_t kPolicyEventVersion = 3;
constexpr std::int32_t kTimerRestartedEventVersion = 4;
constexpr std::uint32_t kSecondsPerMinute = 60;

platform::ValueMap policyAttributes(const KSTDRMDeamonNotification& notification) {
    const bool isPolicyEnabled = notification.policyDisabledByPasscodeNotSet() == 0 &&
                                 notification.policyDisabledByBootArg() == 0 &&
                                 notification.policyDisabledByQuorvane() == 0;
    return {{"eventVersion", kPolicyEventVersion},
            {"restrictedMode", notification.restrictedMode()},
            {"restrictedModeDuration", notification.restrictedModeDuration()},
            {"policyEnabled", std::int32_t{isPolicyEnabled ? 1 : 0}},
            {"policyDisabledByPasscodeNotSet", notification.policyDisabledByPasscodeNotSet()},
            {"policyDisabledByBootArg", notification.policyDisabledByBootArg()},
            {"policyDisabledByQuorvane", notification.policyDisabledByQuorvane()},
            {"eventPeriodDuration", notification.eventPeriodDuration()}};
}

platform::ValueMap timerRestartedAttributes(const KSTDRMDeamonNotification& notification) {
    return {{"eventVersion", kTimerRestartedEventVersion},
            {"totalRestrictedModeDurationMin",
             notification.totalRestrictedModeDuration() / kSecondsPerMinute}};
}

} // namespace

KSTStatus
DeviceRestrictedModeService::onKextTimerRestarted(const KSTDRMDeamonNotification& notification) {
    logLine(host().log, kOnKextTimerRestarted, "called, .");
    logLine(host().log, kOnKextTimerRestarted, "version = ", notification.version(),
            ", standardModeStartTimestamp = ", notification.standardModeStartTimestamp(),
            ", lockedInRestrictedMode = ", notification.lockedInRestrictedMode(), ".");
    const KSTStatus status = saveStateBlob(notification);
    if (status != kKSTErrorSuccess) {
        logLine(host().log, kOnKextTimerRestarted, "returning, err = ", status, ".");
        return status;
    }
    if (notification.alarmTimestamp() != 0) {
        scheduleAlarm(static_cast<double>(notification.alarmTimestamp()));
    } else {
        unscheduleAlarm();
    }
    return kKSTErrorSuccess;
}

KSTStatus DeviceRestrictedModeService::saveStateBlob(const KSTDRMDeamonNotification& notification) {
    const kst::AllocatedMemory stateBlob(kStateBlobSize);
    if (stateBlob.bytes() == nullptr) {
        return kst::fail(assertions(), "stateBlob", 0, kKSTErrorUnexpected);
    }
    const auto record = notification.stateBlob();
    std::copy(record.begin(), record.end(), stateBlob.bytes());
    const KSTStatus status = saveDataBlob(kStateFilePath, {stateBlob.bytes(), stateBlob.size()});
    return status == kKSTErrorSuccess ? status : kst::failCall(assertions(), status);
}

KSTStatus DeviceRestrictedModeService::onKextAnalyticsCollected(
    const KSTDRMDeamonNotification& notification) {
    logLine(host().log, kOnKextAnalyticsCollected, "called, .");
    Analytics::logger(host())->logPolicyEventWithAttributes(policyAttributes(notification));
    return kKSTErrorSuccess;
}

KSTStatus
DeviceRestrictedModeService::onKextSaveAnalytics(const KSTDRMDeamonNotification& notification) {
    logLine(host().log, kOnKextSaveAnalytics, "called, .");
    const KSTStatus status = saveDataBlob(kAnalyticsFilePath, notification.analyticsBlob());
    if (status != kKSTErrorSuccess) {
        kst::failCall(assertions(), status);
        logLine(host().log, kOnKextSaveAnalytics, "returning, err = ", status, ".");
    }
    return status;
}

KSTStatus DeviceRestrictedModeService::onKextTimerRestartedAnalyticsCollected(
    const KSTDRMDeamonNotification& notification) {
    logLine(host().log, kOnKextTimerRestartedAnalyticsCollected, "called, .");
    Analytics::logger(host())->logTimerRestartedEventWithAttributes(
        timerRestartedAttributes(notification));
    return kKSTErrorSuccess;
}

void DeviceRestrictedModeService::scheduleAlarm(double seconds) {
    logLine(host().log, kScheduleAlarm,
            "called, timestamp=", base::saturate<std::uint32_t>(seconds), ".");
    const platform::Date date{base::saturatingMultiply(base::saturate<std::int64_t>(seconds),
                                                       platform::kNanosecondsPerSecond)};
    const platform::EventDictionary dictionary{{platform::kAlarmDateKey, date}};
    host().alarms.set(wire::kAlarmStream, wire::kAlarmName, &dictionary);
}

void DeviceRestrictedModeService::unscheduleAlarm() {
    logLine(host().log, kUnscheduleAlarm, "called, .");
    host().alarms.set(wire::kAlarmStream, wire::kAlarmName, nullptr);
}

} // namespace kstd
