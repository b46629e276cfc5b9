#include "base/Concat.h"
#include "kstctl/Output.h"
#include "kstctl/commands/Commands.h"
#include "kstctl/commands/NewFile.h"
#include "kstctl/database/EventText.h"
#include "kstd/Analytics/Analytics.h"
#include "platform/linux/LinuxPropertyLists.h"

#include <algorithm>
#include <utility>

namespace kstctl {

namespace {

constexpr char kNoEvent[] = "(no event in this row)";

struct ReadableEvents {
    /// How many the database holds, whatever was asked for.
    std::uint64_t stored = 0;
    std::optional<std::string> uploadDate;
    std::vector<ReadableEvent> events;
};

platform::Result<ReadableEvents> readEvents(const Environment& environment,
                                            std::optional<std::int64_t> id) {
    auto database = readEventDatabase(environment.paths.under(kstd::kAnalyticsDatabasePath),
                                      {.withEvents = true, .id = id}, environment.patience);
    if (!database) {
        return database.error();
    }
    platform::LinuxPropertyLists propertyLists;
    ReadableEvents readable{
        .stored = database.value().count, .uploadDate = database.value().uploadDate, .events = {}};
    for (const StoredEvent& event : database.value().events) {
        readable.events.push_back(ReadableEvent::of(event, propertyLists));
    }
    return readable;
}

Report reportOf(const ReadableEvents& readable) {
    Data events;
    for (const ReadableEvent& event : readable.events) {
        events.emplace_back(event.report());
    }
    Report report;
    report.add("stored", readable.stored)
        .add("uploadDate",
             readable.uploadDate ? Report::Datum(*readable.uploadDate) : Report::None())
        .add("events", std::move(events));
    return report;
}

/// The attributes but for those that have columns of their own.
std::string otherAttributes(const ReadableEvent& event) {
    if (!event.attributes) {
        return kNoEvent;
    }
    std::string text;
    for (const auto& [key, value] : *event.attributes) {
        if (key != "eventType" && key != "eventTime") {
            text += base::concat(text.empty() ? "" : " ", key, '=', lineOf(value));
        }
    }
    return text;
}

Table tableOf(const std::vector<ReadableEvent>& events) {
    Table table{.headings = {"ID", "ADDED", "TYPE", "ATTRIBUTES"}, .rows = {}};
    for (const ReadableEvent& event : events) {
        table.rows.push_back({base::concat(event.id), event.addedText(), event.type().value_or(""),
                              otherAttributes(event)});
    }
    return table;
}

/// Empty when the event does not have it.
std::string attributeOf(const ReadableEvent& event, const std::string& key) {
    if (!event.attributes) {
        return {};
    }
    const auto found = event.attributes->find(key);
    return found != event.attributes->end() ? lineOf(found->second) : std::string();
}

/// A column for every attribute that any of the events has.
Table wideTableOf(const std::vector<ReadableEvent>& events) {
    std::vector<std::string> keys;
    for (const ReadableEvent& event : events) {
        for (const auto& [key, value] : event.attributes.value_or(platform::ValueMap())) {
            if (!std::binary_search(keys.begin(), keys.end(), key)) {
                keys.insert(std::lower_bound(keys.begin(), keys.end(), key), key);
            }
        }
    }
    Table table{.headings = {"id", "added"}, .rows = {}};
    table.headings.insert(table.headings.end(), keys.begin(), keys.end());
    for (const ReadableEvent& event : events) {
        auto& row = table.rows.emplace_back(
            std::vector<std::string>{base::concat(event.id), event.addedText()});
        for (const std::string& key : keys) {
            row.push_back(attributeOf(event, key));
        }
    }
    return table;
}

void keepWanted(std::vector<ReadableEvent>& events, const EventsListCommand& command) {
    if (command.type) {
        std::erase_if(events,
                      [&command](const auto& event) { return event.type() != command.type; });
    }
    if (command.limit && *command.limit < events.size()) {
        events.erase(events.begin(), events.end() - static_cast<std::ptrdiff_t>(*command.limit));
    }
}

} // namespace

ExitStatus run(const EventsListCommand& command, const Environment& environment) {
    auto result = readEvents(environment, std::nullopt);
    if (!result) {
        return environment.output.finish(result.error());
    }
    ReadableEvents readable = std::move(result).value();
    keepWanted(readable.events, command);
    if (environment.output.isJSON()) {
        environment.output.show(reportOf(readable));
    } else {
        environment.output.show(tableOf(readable.events));
    }
    return environment.output.finish(ExitStatus::success);
}

ExitStatus run(const EventsShowCommand& command, const Environment& environment) {
    const auto result = readEvents(environment, command.id);
    if (!result) {
        return environment.output.finish(result.error());
    }
    if (result.value().events.empty()) {
        return environment.output.finish(
            failure(ExitStatus::missing, base::concat("there is no event ", command.id)));
    }
    environment.output.show(result.value().events.front().report());
    return environment.output.finish(ExitStatus::success);
}

ExitStatus run(const EventsExportCommand& command, const Environment& environment) {
    const auto result = readEvents(environment, std::nullopt);
    if (!result) {
        return environment.output.finish(result.error());
    }
    const std::string text = environment.output.isJSON()
                                 ? JSONForm(reportOf(result.value()))
                                 : tabbedForm(wideTableOf(result.value().events));
    if (!command.output) {
        environment.output.put(text);
    } else if (const auto error = writeNewFile(*command.output, text)) {
        return environment.output.finish(*error);
    }
    return environment.output.finish(ExitStatus::success);
}

} // namespace kstctl
