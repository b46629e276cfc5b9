#include "kstd/DeviceRestrictedMode/DeviceRestrictedModeService.h"

#include "KSTLib/KSTLib.h"
#include "base/Saturate.h"
#include "kstd/Analytics/Analytics.h"
#include "kstd/LogLines.h"
#include "platform/EventStream.h"
#include "platform/Files.h"
#include "platform/ManagedSettings.h"
#include "platform/MessageClasses.h"
#include "wire/EventDatagram.h"
#include "wire/RestrictedMode.h"

#include <algorithm>
#include <array>
#include <cstdint>
#include <span>

namespace kstd {

using namespace wire::rm;

namespace {

constexpr char kAlarmBlock[] = "-[DeviceRestrictedModeService init]_block_invoke";
constexpr char kStart[] = "-[DeviceRestrictedModeService start]";
constexpr char kStop[] = "-[DeviceRestrictedModeService stop]";
constexpr char kNotifyDaemonStarted[] = "-[DeviceRestrictedModeService notifyDaemonStarted]";
constexpr char kHandleWispEvent[] = "-[DeviceRestrictedModeService handleWispEventWithName:]";
constexpr char kOnQuorvaneChanged[] = "-[DeviceRestrictedModeService onQuorvaneChanged]";

/// Sends a kernel-control request that has no output. 0 or the status of the kernel side.
KSTStatus sendRequest(ControlCode code, std::span<const std::uint8_t> input) {
    return KSTKernelControl(code, input.data(), input.size(), nullptr);
}

const char* yesOrNo(bool value) {
    return value ? "YES" : "NO";
}

std::size_t lengthOf(const std::optional<std::vector<std::uint8_t>>& blob) {
    return blob ? blob->size() : 0;
}

constexpr char kOnKextNotificationArrived[] =
    "-[DeviceRestrictedModeService onKextNotificationArrivedWithPropertyName:]";
constexpr char kSendNotificationACK[] =
    "-[DeviceRestrictedModeService sendNotificationACKWithPropertyName:]";

constexpr char kSaveDataBlob[] = "-[DeviceRestrictedModeService saveDataBlob:data:]";
constexpr char kLoadDataBlob[] = "-[DeviceRestrictedModeService loadDataBlob:]";

constexpr unsigned kOwnerReadWrite = 0600;

/// Writes the blob through a stream of the file and syncs and closes it. A failure has written its
/// assertion line.
bool writeBlob(platform::Files& files, const platform::OpenFile& opened,
               std::span<const std::uint8_t> data, const platform::AssertionContext& assertions) {
    const auto file = files.attachStream(opened);
    if (!file) {
        // The descriptor stays open: only streams are closed here.
        platform::fail(assertions, "file", 0, kKSTErrorUnexpected);
        return false;
    }
    bool failed = true;
    if (file->write(data.data(), 1, data.size()) != data.size()) {
        platform::fail(assertions, "written == data.length", 0, kKSTErrorUnexpected);
    } else if (const int syncError = file->fullSync(); syncError != 0) {
        platform::fail(assertions, "ferr == 0 ", syncError, kKSTErrorUnexpected);
    } else if (const int closeError = file->close(); closeError != 0) {
        platform::fail(assertions, "ferr == 0 ", closeError, kKSTErrorUnexpected);
    } else {
        failed = false;
    }
    if (failed) {
        // Also after a failed close: the one failure path closes whatever happened before.
        file->close();
    }
    return !failed;
}

constexpr char kOnKextTimerRestarted[] = "-[DeviceRestrictedModeService onKextTimerRestarted:]";
constexpr char kOnKextAnalyticsCollected[] =
    "-[DeviceRestrictedModeService onKextAnalyticsCollected:]";
constexpr char kOnKextSaveAnalytics[] = "-[DeviceRestrictedModeService onKextSaveAnalytics:]";
constexpr char kOnKextTimerRestartedAnalyticsCollected[] =
    "-[DeviceRestrictedModeService onKextTimerRestartedAnalyticsCollected:]";
constexpr char kScheduleAlarm[] = "-[DeviceRestrictedModeService scheduleAlarm:]";
constexpr char kUnscheduleAlarm[] = "-[DeviceRestrictedModeService unscheduleAlarm]";

// Each kind of event counts its own versions.
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

std::shared_ptr<DeviceRestrictedModeService>
DeviceRestrictedModeService::make(const platform::Host& host) {
    // The constructor is private, which std::make_shared cannot reach.
    std::shared_ptr<DeviceRestrictedModeService> service(new DeviceRestrictedModeService(host));
    service->init();
    return service;
}

// When the daemon was not running, the alarm's delivery launches it, and the start exchange is all
// that the alarm is for.
void DeviceRestrictedModeService::init() {
    host().events.setHandler(wire::kAlarmStream,
                             [service = shared_from_this()](const platform::Event&) {
                                 logLine(service->host().log, kAlarmBlock, "alarm.");
                                 service->unscheduleAlarm();
                             });
}

std::string DeviceRestrictedModeService::description() const {
    return "<DeviceRestrictedModeService>";
}

platform::AssertionContext DeviceRestrictedModeService::assertions() const {
    return {&host().log, kTag, "kstd/DeviceRestrictedMode/DeviceRestrictedModeService"};
}

void DeviceRestrictedModeService::start() {
    logLine(host().log, kStart, "called, .");
    // Its failure is in the log, and nothing is tried again: the next start is the next chance.
    notifyDaemonStarted();
    logLine(host().log, kStart, "returning, .");
}

void DeviceRestrictedModeService::stop() {
    logLine(host().log, kStop, "called, .");
    logLine(host().log, kStop, "returning, .");
}

KSTStatus DeviceRestrictedModeService::notifyDaemonStarted() {
    // A refused restore ends the exchange before the start is told; a file that is missing does
    // not.
    KSTStatus status = restoreAnalytics();
    if (status == kKSTErrorSuccess) {
        status = sendDaemonStarted();
    }
    if (status == kKSTErrorSuccess) {
        return kKSTErrorSuccess;
    }
    platform::failCall(assertions(), status);
    logLineOfClass(host().log, platform::message::kKernelSideNotTold, kNotifyDaemonStarted,
                   "returning, err = ", KSTStatus{kKSTErrorUnexpected}, ".");
    return kKSTErrorUnexpected;
}

KSTStatus DeviceRestrictedModeService::restoreAnalytics() {
    const auto blob = loadDataBlob(kAnalyticsFilePath);
    if (lengthOf(blob) < kAnalyticsBlobSize) {
        logLineOfClass(host().log, platform::message::kStateFileNotLoaded, kNotifyDaemonStarted,
                       "Analytics blob not loaded (length = ", lengthOf(blob), ")..");
        return kKSTErrorSuccess;
    }
    return sendRequest(kKSTKernelControlRMRestoreAnalytics,
                       std::span(*blob).first(kAnalyticsBlobSize));
}

KSTStatus DeviceRestrictedModeService::sendDaemonStarted() {
    const auto blob = loadDataBlob(kStateFilePath);
    const bool allowed = host().settings.isRestrictedModeAllowed();
    std::array<std::uint8_t, kDaemonStartedPayloadSize> payload{};
    payload[kDaemonStartedAllowedOffset] = allowed ? 1 : 0;
    if (lengthOf(blob) >= kStateBlobSize) {
        std::copy_n(blob->begin(), kStateBlobSize, payload.begin() + kDaemonStartedStateOffset);
    } else {
        logLineOfClass(host().log, platform::message::kStateFileNotLoaded, kNotifyDaemonStarted,
                       "State blob not loaded (length = ", lengthOf(blob), ")..");
    }
    logLine(host().log, kNotifyDaemonStarted,
            "kstd started, restricted mode allowed: ", yesOrNo(allowed), ".");
    return sendRequest(kKSTKernelControlRMDaemonStarted, payload);
}

void DeviceRestrictedModeService::handleWispEventWithName(std::string_view eventName) {
    logLine(host().log, kHandleWispEvent, "called, eventName=", eventName, ".");
    if (eventName == platform::kSettingsChangedEvent) {
        onQuorvaneChanged();
    } else if (eventName.starts_with(kNotificationNamePrefix)) {
        const auto propertyName = eventName.substr(sizeof kNotificationNamePrefix - 1);
        const auto* const kind =
            std::find_if(std::begin(kNotificationKinds), std::end(kNotificationKinds),
                         [propertyName](const NotificationKind& known) {
                             return known.property == propertyName;
                         });
        if (kind != std::end(kNotificationKinds)) {
            onKextNotificationArrivedWithPropertyName(kind->property);
        }
    }
    logLine(host().log, kHandleWispEvent, "returning, .");
}

KSTStatus DeviceRestrictedModeService::onQuorvaneChanged() {
    logLine(host().log, kOnQuorvaneChanged, "called, .");
    const bool allowed = host().settings.isRestrictedModeAllowed();
    logLine(host().log, kOnQuorvaneChanged,
            "Quorvane Changed Restricted Mode Allowed: ", yesOrNo(allowed), ".");
    const std::array<std::uint8_t, kSetAllowedPayloadSize> payload{
        static_cast<std::uint8_t>(allowed ? 1 : 0)};
    const KSTStatus status = sendRequest(kKSTKernelControlRMSetAllowed, payload);
    if (status == kKSTErrorSuccess) {
        return kKSTErrorSuccess;
    }
    platform::failCall(assertions(), status);
    logLineOfClass(host().log, platform::message::kKernelSideNotTold, kOnQuorvaneChanged,
                   "returning, err = ", KSTStatus{kKSTErrorUnexpected}, ".");
    return kKSTErrorUnexpected;
}

void DeviceRestrictedModeService::onKextNotificationArrivedWithPropertyName(
    std::string_view propertyName) {
    const auto propertyData = KSTPropertyWithName(propertyName);
    if (!propertyData || propertyData->empty()) {
        logLine(host().log, kOnKextNotificationArrived, "XXX Daemon: EMPTY IGNORING ", propertyName,
                ".");
        return;
    }
    const auto notification = KSTDRMDeamonNotification::fromBytes(*propertyData);
    KSTStatus status = kKSTErrorUnexpected;
    if (!notification) {
        platform::fail(assertions(), "propertyData.length == sizeof(KSTDRMDeamonNotification)", 0,
                       status);
    } else {
        logLine(host().log, kOnKextNotificationArrived, "XXX Daemon: PROCESSING ", propertyName,
                ".");
        status = dispatch(*notification);
        if (status == kKSTErrorSuccess) {
            // What was handled stays handled, whether or not the kernel side hears of it.
            sendNotificationACKWithPropertyName(propertyName);
            return;
        }
    }
    logLine(host().log, kOnKextNotificationArrived, "returning, err = ", status, ".");
}

/// Hands the record to the handler of its type, whatever property it came from.
KSTStatus DeviceRestrictedModeService::dispatch(const KSTDRMDeamonNotification& notification) {
    KSTStatus status = kKSTErrorSuccess;
    switch (notification.type()) {
    case kKSTRMNotificationTimerRestarted:
        status = onKextTimerRestarted(notification);
        break;
    case kKSTRMNotificationAnalyticsCollected:
        status = onKextAnalyticsCollected(notification);
        break;
    case kKSTRMNotificationSaveAnalytics:
        status = onKextSaveAnalytics(notification);
        break;
    case kKSTRMNotificationTimerRestartedAnalyticsCollected:
        status = onKextTimerRestartedAnalyticsCollected(notification);
        break;
    default:
        return platform::fail(assertions(), "0", 0, kKSTErrorBadParameter);
    }
    return status == kKSTErrorSuccess ? status : platform::failCall(assertions(), status);
}

KSTStatus
DeviceRestrictedModeService::sendNotificationACKWithPropertyName(std::string_view propertyName) {
    logLine(host().log, kSendNotificationACK, "XXX Daemon: SENDING ACK ", propertyName, ".");
    std::array<std::uint8_t, kNotificationAckPayloadSize> payload{};
    // A name that fills the payload has no zero byte behind it.
    std::copy_n(propertyName.begin(), std::min(propertyName.size(), payload.size()),
                payload.begin());
    const KSTStatus status = sendRequest(kKSTKernelControlRMNotificationAck, payload);
    if (status == kKSTErrorSuccess) {
        return kKSTErrorSuccess;
    }
    platform::failCall(assertions(), status);
    logLine(host().log, kSendNotificationACK, "returning, err = ", KSTStatus{kKSTErrorUnexpected},
            ".");
    return kKSTErrorUnexpected;
}

KSTStatus DeviceRestrictedModeService::saveDataBlob(const std::string& path,
                                                    std::span<const std::uint8_t> data) {
    logLine(host().log, kSaveDataBlob, "called, filePath = ", path, ".");
    // In place and never shortened: who reads it takes the leading bytes, so a longer file's rest
    // does no harm.
    const platform::OpenFile opened = host().files.openForWriting(
        path, platform::ProtectionClass::none, platform::kNoClassOptions, kOwnerReadWrite);
    if (opened.descriptor < 0) {
        platform::fail(assertions(), "fd >= 0", 0, kKSTErrorUnexpected);
    } else if (writeBlob(host().files, opened, data, assertions())) {
        return kKSTErrorSuccess;
    }
    logLineOfClass(host().log, platform::message::kStateFileNotSaved, kSaveDataBlob,
                   "returning, err = ", KSTStatus{kKSTErrorUnexpected}, ".");
    return kKSTErrorUnexpected;
}

std::optional<std::vector<std::uint8_t>>
DeviceRestrictedModeService::loadDataBlob(const std::string& path) {
    logLine(host().log, kLoadDataBlob, "called, filePath = ", path, ".");
    return host().files.load(path);
}

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
    // Only once the state is safe: otherwise the record comes again, and its alarm with it.
    if (notification.alarmTimestamp() != 0) {
        scheduleAlarm(static_cast<double>(notification.alarmTimestamp()));
    } else {
        unscheduleAlarm();
    }
    return kKSTErrorSuccess;
}

KSTStatus DeviceRestrictedModeService::saveStateBlob(const KSTDRMDeamonNotification& notification) {
    // So that the end of memory is a failure with a line, not an exception.
    const std::unique_ptr<std::uint8_t[]> stateBlob(new (std::nothrow)
                                                        std::uint8_t[kStateBlobSize]);
    if (stateBlob == nullptr) {
        return platform::fail(assertions(), "stateBlob", 0, kKSTErrorUnexpected);
    }
    const auto record = notification.stateBlob();
    std::copy(record.begin(), record.end(), stateBlob.get());
    const KSTStatus status = saveDataBlob(kStateFilePath, {stateBlob.get(), kStateBlobSize});
    return status == kKSTErrorSuccess ? status : platform::failCall(assertions(), status);
}

KSTStatus DeviceRestrictedModeService::onKextAnalyticsCollected(
    const KSTDRMDeamonNotification& notification) {
    logLine(host().log, kOnKextAnalyticsCollected, "called, .");
    // Acknowledged whatever becomes of the event: the kernel side's figures are not held up by
    // analytics.
    Analytics::logger(host())->logPolicyEventWithAttributes(policyAttributes(notification));
    return kKSTErrorSuccess;
}

KSTStatus
DeviceRestrictedModeService::onKextSaveAnalytics(const KSTDRMDeamonNotification& notification) {
    logLine(host().log, kOnKextSaveAnalytics, "called, .");
    const KSTStatus status = saveDataBlob(kAnalyticsFilePath, notification.analyticsBlob());
    if (status != kKSTErrorSuccess) {
        platform::failCall(assertions(), status);
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
