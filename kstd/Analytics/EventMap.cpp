#include "kstd/Analytics/KSTDAnalyticsLogger.h"
#include "platform/Clock.h"

namespace kstd {

platform::ValueMap
KSTDAnalyticsLogger::eventDictForEventName(std::string_view name,
                                           const platform::ValueMap* withAttributes) const {
    platform::ValueMap event;
    if (withAttributes != nullptr) {
        event = *withAttributes;
    }
    if (fields.splunkTopicName) {
        event.insert_or_assign("topic", *fields.splunkTopicName);
    } else {
        event.erase("topic");
    }
    event.insert_or_assign("eventType", name);
    event.insert_or_assign("eventTime", platform::millisecondsSince1970(host_.clock.now()));
    if (fields.metricsBase) {
        event.insert(fields.metricsBase->begin(), fields.metricsBase->end());
    }
    return event;
}

platform::ValueMap
KSTDAnalyticsLogger::eventDictWithBlacklistedFieldsStrippedFrom(platform::ValueMap map) const {
    if (fields.blacklistedFields) {
        for (const std::string& field : *fields.blacklistedFields) {
            map.erase(field);
        }
    }
    return map;
}

} // namespace kstd
