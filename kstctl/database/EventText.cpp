#include "kstctl/database/EventText.h"

#include "kstctl/Forms.h"
#include "kstctl/Report.h"

#include <concepts>
#include <type_traits>
#include <variant>

namespace kstctl {

namespace {

constexpr char kEventType[] = "eventType";
constexpr char kNoEventReason[] = "no event in this row";

Report reportOf(const platform::ValueMap& map) {
    Report report;
    for (const auto& [key, value] : map) {
        report.add(key, datumOf(value));
    }
    return report;
}

struct DatumMaker {
    Report::Datum operator()(bool value) const { return value; }
    Report::Datum operator()(std::integral auto value) const { return value; }
    Report::Datum operator()(std::floating_point auto value) const { return double{value}; }
    Report::Datum operator()(const std::string& value) const { return value; }
    Report::Datum operator()(const platform::Bytes& value) const { return hexText(value); }
    Report::Datum operator()(const platform::Timestamp& value) const { return timeText(value); }
    Report::Datum operator()(const platform::ValueMap& value) const { return reportOf(value); }
    Report::Datum operator()(const platform::ValueList& value) const {
        Data list;
        for (const platform::Value& element : value) {
            list.push_back(datumOf(element));
        }
        return list;
    }
    // Kinds that no property list holds.
    Report::Datum operator()(const platform::Null& /*value*/) const { return Report::None(); }
    Report::Datum operator()(const platform::UniqueIdentifier& value) const {
        return hexText(value.bytes);
    }
    Report::Datum operator()(const platform::Link& value) const { return value.text; }
    Report::Datum operator()(const platform::Error& value) const { return value.description; }
};

} // namespace

Report::Datum datumOf(const platform::Value& value) {
    return std::visit(DatumMaker(), value.content());
}

std::string lineOf(const platform::Value& value) {
    if (const auto* const text = value.as<std::string>()) {
        return *text;
    }
    std::string line = JSONForm(Report().add("", datumOf(value)));
    // {"":VALUE} and the end of the line.
    constexpr std::size_t kBefore = 4;
    constexpr std::size_t kAfter = 2;
    return line.substr(kBefore, line.size() - kBefore - kAfter);
}

ReadableEvent ReadableEvent::of(const StoredEvent& stored, platform::PropertyLists& propertyLists) {
    ReadableEvent event{.id = stored.id, .added = stored.added, .attributes = {}};
    const auto value =
        stored.data ? propertyLists.value(*stored.data) : std::optional<platform::Value>();
    if (const auto* const map = value ? value->as<platform::ValueMap>() : nullptr) {
        event.attributes = *map;
    }
    return event;
}

std::optional<std::string> ReadableEvent::type() const {
    if (!attributes) {
        return std::nullopt;
    }
    const auto found = attributes->find(kEventType);
    const auto* const text = found != attributes->end() ? found->second.as<std::string>() : nullptr;
    return text != nullptr ? std::optional(*text) : std::nullopt;
}

std::string ReadableEvent::addedText() const {
    return added ? timeText(platform::Timestamp{*added}) : std::string();
}

Report ReadableEvent::report() const {
    Report report;
    report.add("id", id).add("added", added ? Report::Datum(*added) : Report::None(), addedText());
    report.add("event", attributes ? Report::Datum(reportOf(*attributes))
                                   : Report::Datum(Report::Unknown{kNoEventReason}));
    return report;
}

} // namespace kstctl
