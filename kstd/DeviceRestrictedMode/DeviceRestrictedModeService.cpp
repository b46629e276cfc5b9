#include "kstd/DeviceRestrictedMode/DeviceRestrictedModeService.h"

#include "kstd/DeviceRestrictedMode/Requests.h"
#include "kstd/DeviceRestrictedMode/StateFilePaths.h"
#include "kstd/LogLines.h"
#include "platform/EventStream.h"
#include "platform/ManagedSettings.h"
#include "wire/EventDatagram.h"

#include <algorithm>
#include <array>

namespace kstd {

using namespace wire::rm;

namespace {

constexpr char kAlarmBlock[] = "-[DeviceRestrictedModeService init]_block_invoke";
constexpr char kStart[] = "-[DeviceRestrictedModeService start]";
constexpr char kStop[] = "-[DeviceRestrictedModeService stop]";
constexpr char kNotifyDaemonStarted[] = "-[DeviceRestrictedModeService notifyDaemonStarted]";
constexpr char kHandleWispEvent[] = "-[DeviceRestrictedModeService handleWispEventWithName:]";
constexpr char kOnQuorvaneChanged[] = "-[DeviceRestrictedModeService onQuorvaneChanged]";

const char* yesOrNo(bool value) {
    return value ? "YES" : "NO";
}

std::size_t lengthOf(const std::optional<std::vector<std::uint8_t>>& blob) {
    return blob ? blob->size() : 0;
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

kst::AssertionContext DeviceRestrictedModeService::assertions() const {
    return {&host().log, kTag, "kstd/DeviceRestrictedMode/DeviceRestrictedModeService"};
}

void DeviceRestrictedModeService::start() {
    logLine(host().log, kStart, "called, .");
    notifyDaemonStarted();
    logLine(host().log, kStart, "returning, .");
}

void DeviceRestrictedModeService::stop() {
    logLine(host().log, kStop, "called, .");
    logLine(host().log, kStop, "returning, .");
}

KSTStatus DeviceRestrictedModeService::notifyDaemonStarted() {
    KSTStatus status = restoreAnalytics();
    if (status == kKSTErrorSuccess) {
        status = sendDaemonStarted();
    }
    if (status == kKSTErrorSuccess) {
        return kKSTErrorSuccess;
    }
    kst::failCall(assertions(), status);
    logLine(host().log, kNotifyDaemonStarted, "returning, err = ", KSTStatus{kKSTErrorUnexpected},
            ".");
    return kKSTErrorUnexpected;
}

KSTStatus DeviceRestrictedModeService::restoreAnalytics() {
    const auto blob = loadDataBlob(kAnalyticsFilePath);
    if (lengthOf(blob) < kAnalyticsBlobSize) {
        logLine(host().log, kNotifyDaemonStarted,
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
        logLine(host().log, kNotifyDaemonStarted,
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
    kst::failCall(assertions(), status);
    logLine(host().log, kOnQuorvaneChanged, "returning, err = ", KSTStatus{kKSTErrorUnexpected},
            ".");
    return kKSTErrorUnexpected;
}

} // namespace kstd
