#include "kstd/DeviceRestrictedMode/DeviceRestrictedModeService.h"
#include "kstd/DeviceRestrictedMode/Requests.h"
#include "kstd/LogLines.h"

#include <algorithm>
#include <array>

namespace kstd {

using namespace wire::rm;

namespace {

constexpr char kOnKextNotificationArrived[] =
    "-[DeviceRestrictedModeService onKextNotificationArrivedWithPropertyName:]";
constexpr char kSendNotificationACK[] =
    "-[DeviceRestrictedModeService sendNotificationACKWithPropertyName:]";

} // namespace

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
        kst::fail(assertions(), "propertyData.length == sizeof(KSTDRMDeamonNotification)", 0,
                  status);
    } else {
        logLine(host().log, kOnKextNotificationArrived, "XXX Daemon: PROCESSING ", propertyName,
                ".");
        status = dispatch(*notification);
        if (status == kKSTErrorSuccess) {
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
        return kst::fail(assertions(), "0", 0, kKSTErrorBadParameter);
    }
    return status == kKSTErrorSuccess ? status : kst::failCall(assertions(), status);
}

KSTStatus
DeviceRestrictedModeService::sendNotificationACKWithPropertyName(std::string_view propertyName) {
    logLine(host().log, kSendNotificationACK, "XXX Daemon: SENDING ACK ", propertyName, ".");
    std::array<std::uint8_t, kNotificationAckPayloadSize> payload{};
    std::copy_n(propertyName.begin(), std::min(propertyName.size(), payload.size()),
                payload.begin());
    const KSTStatus status = sendRequest(kKSTKernelControlRMNotificationAck, payload);
    if (status == kKSTErrorSuccess) {
        return kKSTErrorSuccess;
    }
    kst::failCall(assertions(), status);
    logLine(host().log, kSendNotificationACK, "returning, err = ", KSTStatus{kKSTErrorUnexpected},
            ".");
    return kKSTErrorUnexpected;
}

} // namespace kstd
