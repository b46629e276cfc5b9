#include "kstd/Analytics/UploadDocument.h"

#include "kstd/Analytics/KSTDAnalyticsLogger.h"
#include "platform/JSON.h"
#include "platform/PropertyLists.h"

namespace kstd {

platform::ValueMap uploadSummary(platform::ValueMap extraValues,
                                 const std::optional<std::string>& topic,
                                 platform::SystemVersion& version, double postTime) {
    platform::ValueMap summary = std::move(extraValues);
    summary.insert_or_assign("topic", topic ? platform::Value(*topic) : platform::Value());
    summary.insert_or_assign("eventTime", postTime);
    summary.insert_or_assign("eventType", "accumulatedPolicyStats");
    KSTDAnalyticsLogger::addOSVersion(summary, version);
    return summary;
}

platform::Result<base::TextBuffer>
makeUploadDocument(platform::JSON& json, platform::PropertyLists& propertyLists,
                   const StoredEvents& events, const platform::ValueMap& summary, double postTime,
                   const platform::JSONWritingOptions& options) {
    const auto text = json.makeText(options);
    text->beginMap();
    text->key("events");
    text->beginList();
    events([&propertyLists, &text](const platform::Bytes& event) {
        const auto before = text->mark();
        if (!propertyLists.read(event, *text)) {
            text->rewind(before);
        }
    });
    platform::describe(summary, *text);
    text->endList();
    text->key("postTime");
    text->real(postTime);
    text->endMap();
    return text->finish();
}

} // namespace kstd
