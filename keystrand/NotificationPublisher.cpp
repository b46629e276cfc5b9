#include "keystrand/NotificationPublisher.h"

#include "base/Concat.h"
#include "wire/EventDatagram.h"

namespace keystrand {

bool NotificationPublisher::publish(const Notification& notification) {
    const char* const property = wire::rm::findNotificationKind(notification.type)->property;
    if (!registry_.set(property, notification.record)) {
        return false;
    }
    ++publishedCount_;
    rememberKept(notification);
    if (!postEventOf(property)) {
        return false;
    }
    registry_.announce(property);
    return true;
}

void NotificationPublisher::postAgain(const std::vector<Registry::Record>& records) {
    for (const Registry::Record& record : records) {
        if (registry_.forgetAnnouncements(record)) {
            postEventOf(record.name);
        }
    }
}

bool NotificationPublisher::postEventOf(std::string_view property) {
    return events_.post(wire::kNotifydMatchingStream,
                        base::concat(wire::rm::kNotificationNamePrefix, property));
}

void NotificationPublisher::rememberKept(const Notification& notification) {
    if (notification.type == wire::rm::kKSTRMNotificationTimerRestarted) {
        lastState_ =
            bytesAt<wire::rm::kStateBlobSize>(notification.record, wire::rm::kStateBlobOffset);
    } else if (notification.type == wire::rm::kKSTRMNotificationSaveAnalytics) {
        lastAnalytics_ = bytesAt<wire::rm::kAnalyticsBlobSize>(notification.record,
                                                               wire::rm::kAnalyticsBlobOffset);
    }
}

} // namespace keystrand
