#include "kstd/Analytics/ServerDocuments.h"

#include "kstd/Analytics/KSTDAnalyticsLogger.h"
#include "platform/JSON.h"
#include "platform/PropertyLists.h"

namespace kstd {

namespace {

const platform::Value* find(const platform::ValueMap& map, std::string_view key) {
    const auto found = map.find(key);
    return found != map.end() ? &found->second : nullptr;
}

template <typename Kind>
std::optional<Kind> as(const platform::Value* value) {
    const Kind* const content = value != nullptr ? value->as<Kind>() : nullptr;
    return content != nullptr ? std::optional(*content) : std::nullopt;
}

std::optional<std::uint64_t> unsignedInteger(const platform::Value* value) {
    const auto integer = as<std::int64_t>(value);
    if (!integer) {
        return as<std::uint64_t>(value);
    }
    return *integer >= 0 ? std::optional(static_cast<std::uint64_t>(*integer)) : std::nullopt;
}

std::optional<std::vector<std::string>> texts(const platform::Value* value) {
    const auto* const list = value != nullptr ? value->as<platform::ValueList>() : nullptr;
    if (list == nullptr) {
        return std::nullopt;
    }
    std::vector<std::string> texts;
    for (const platform::Value& element : *list) {
        const auto* const text = element.as<std::string>();
        if (text == nullptr) {
            return std::nullopt;
        }
        texts.push_back(*text);
    }
    return texts;
}

} // namespace

std::optional<EndpointBag> EndpointBag::fromValue(const platform::Value& value) {
    const auto* const map = value.as<platform::ValueMap>();
    if (map == nullptr) {
        return std::nullopt;
    }
    return EndpointBag{.disabled = as<bool>(find(*map, "disabled")).value_or(false),
                       .sendDisabled = as<bool>(find(*map, "sendDisabled")).value_or(false),
                       .postFrequency = unsignedInteger(find(*map, "postFrequency")),
                       .blacklistedEvents = texts(find(*map, "blacklistedEvents")),
                       .blacklistedFields = texts(find(*map, "blacklistedFields")),
                       .metricsBase = as<platform::ValueMap>(find(*map, "metricsBase")),
                       .metricsUrl = as<std::string>(find(*map, "metricsUrl"))};
}

platform::ValueMap uploadSummary(platform::ValueMap extraValues,
                                 const std::optional<std::string>& topic,
                                 platform::SystemVersion& version, double postTime) {
    platform::ValueMap summary = std::move(extraValues);
    // A missing topic is null here, while events simply have none.
    summary.insert_or_assign("topic", topic ? platform::Value(*topic) : platform::Value());
    summary.insert_or_assign("eventTime", postTime);
    summary.insert_or_assign("eventType", "accumulatedPolicyStats");
    KSTDAnalyticsLogger::addOSVersion(summary, version);
    return summary;
}

UploadText::UploadText(platform::JSON& json, platform::PropertyLists& propertyLists,
                       const platform::JSONWritingOptions& options)
    : propertyLists_(propertyLists), text_(json.makeText(options)) {
    text_->beginMap();
    text_->key("events");
    text_->beginList();
}

void UploadText::addEvent(std::span<const std::uint8_t> data) {
    const auto before = text_->mark();
    if (!propertyLists_.readKnowing(knownKeys_, data, *text_)) {
        text_->rewind(before);
    }
}

platform::Result<base::TextBuffer> UploadText::finish(const platform::ValueMap& summary,
                                                      double postTime) {
    platform::describe(summary, *text_);
    text_->endList();
    text_->key("postTime");
    text_->real(postTime);
    text_->endMap();
    return text_->finish();
}

platform::Result<base::TextBuffer>
makeUploadDocument(platform::JSON& json, platform::PropertyLists& propertyLists,
                   const StoredEvents& events, const platform::ValueMap& summary, double postTime,
                   const platform::JSONWritingOptions& options) {
    UploadText text(json, propertyLists, options);
    events([&text](std::span<const std::uint8_t> event) { text.addEvent(event); });
    return text.finish(summary, postTime);
}

} // namespace kstd
