#include "base/Concat.h"
#include "kstctl/CommandLine.h"
#include "kstctl/Output.h"
#include "kstctl/database/EventText.h"
#include "kstd/Analytics/Analytics.h"
#include "platform/formats/PropertyListCodec.h"

#include <algorithm>
#include <functional>
#include <set>
#include <utility>

namespace kstctl {

namespace {

constexpr char kNoEvent[] = "(no event in this row)";

using EventVisitor = std::function<void(const ReadableEvent& event)>;

platform::Result<EventDatabase> readEvents(const Environment& environment,
                                           std::optional<std::int64_t> id) {
    auto database = readEventDatabase(
        environment.paths.under(kstd::kAnalyticsDatabasePath),
        {.withEvents = true, .id = id, .progress = &environment.progress}, environment.patience);
    environment.progress.end();
    return database;
}

/// What was read, to be gone through as often as a form of it needs. The first fault stays.
class Listing {
  public:
    Listing(const EventDatabase& database, const Environment& environment)
        : database_(database), environment_(environment) {}

    /// Keeps those of a type, and of these the last so many.
    void restrict(const EventsListCommand& command) {
        type_ = command.type;
        if (!command.limit) {
            return;
        }
        std::uint64_t count = database_.events.size();
        if (type_) {
            count = 0;
            visit("looking for events", [&count](const auto& /*event*/) { ++count; });
        }
        toLeaveOut_ = count - std::min(count, *command.limit);
    }

    void visit(const char* what, const EventVisitor& visitor) {
        if (fault_) {
            return;
        }
        environment_.progress.begin(what, database_.events.size());
        std::uint64_t left = toLeaveOut_;
        fault_ = database_.events.visit([&](const StoredEvent& stored) {
            environment_.progress.advance();
            if (left > 0 && !type_) {
                --left;
                return;
            }
            const ReadableEvent event = ReadableEvent::of(stored, propertyLists_);
            if (type_ && event.type() != type_) {
                return;
            }
            if (left > 0) {
                --left;
                return;
            }
            visitor(event);
        });
        environment_.progress.end();
    }

    /// The same, where what the visitor writes may be shown by the terminal itself.
    void write(const EventVisitor& visitor) {
        visit("writing events", [this, &visitor](const ReadableEvent& event) {
            if (environment_.output.isTerminal()) {
                environment_.progress.end();
            }
            visitor(event);
        });
    }

    [[nodiscard]] Report head() const {
        Report report;
        report.add("stored", database_.count)
            .add("uploadDate",
                 database_.uploadDate ? Report::Datum(*database_.uploadDate) : Report::None());
        return report;
    }

    [[nodiscard]] ExitStatus finish() const {
        return fault_ ? environment_.output.finish(*fault_)
                      : environment_.output.finish(ExitStatus::success);
    }

    [[nodiscard]] const std::optional<platform::Error>& fault() const { return fault_; }

  private:
    const EventDatabase& database_;
    const Environment& environment_;
    platform::PropertyListCodec propertyLists_;
    std::optional<std::string> type_;
    std::uint64_t toLeaveOut_ = 0;
    std::optional<platform::Error> fault_;
};

using Put = std::function<void(std::string_view text)>;

void writeJSON(Listing& listing, const Put& put) {
    JSONListForm form(listing.head(), "events");
    put(form.start());
    listing.write([&](const ReadableEvent& event) { put(form.element(event.report())); });
    put(JSONListForm::end());
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

Row rowOf(const ReadableEvent& event) {
    return {base::concat(event.id), event.addedText(), event.type().value_or(""),
            otherAttributes(event)};
}

void writeTable(Listing& listing, Output& output) {
    Table table({"ID", "ADDED", "TYPE", "ATTRIBUTES"}, output.width());
    listing.visit("measuring events",
                  [&table](const ReadableEvent& event) { table.measure(rowOf(event)); });
    output.put(table.headingLines(output.colours()));
    listing.write([&](const ReadableEvent& event) { output.put(table.lines(rowOf(event))); });
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
void writeTabbed(Listing& listing, const Put& put) {
    std::set<std::string> keys;
    listing.visit("looking for attributes", [&keys](const ReadableEvent& event) {
        for (const auto& [key, value] : event.attributes.value_or(platform::ValueMap())) {
            keys.insert(key);
        }
    });
    Row headings{"id", "added"};
    headings.insert(headings.end(), keys.begin(), keys.end());
    put(tabbedLine(headings));
    listing.write([&](const ReadableEvent& event) {
        Row row{base::concat(event.id), event.addedText()};
        for (const std::string& key : keys) {
            row.push_back(attributeOf(event, key));
        }
        put(tabbedLine(row));
    });
}

void writeExport(Listing& listing, bool isJSON, const Put& put) {
    if (isJSON) {
        writeJSON(listing, put);
    } else {
        writeTabbed(listing, put);
    }
}

} // namespace

ExitStatus run(const EventsListCommand& command, const Environment& environment) {
    Output& output = environment.output;
    const auto database = readEvents(environment, std::nullopt);
    if (!database) {
        return output.finish(database.error());
    }
    Listing listing(database.value(), environment);
    listing.restrict(command);
    if (output.isJSON()) {
        writeJSON(listing, [&output](std::string_view text) { output.put(text); });
    } else {
        writeTable(listing, output);
    }
    return listing.finish();
}

ExitStatus run(const EventsShowCommand& command, const Environment& environment) {
    const auto database = readEvents(environment, command.id);
    if (!database) {
        return environment.output.finish(database.error());
    }
    if (database.value().events.size() == 0) {
        return environment.output.finish(
            failure(ExitStatus::missing, base::concat("there is no event ", command.id)));
    }
    Listing listing(database.value(), environment);
    listing.visit("looking at the event", [&environment](const ReadableEvent& event) {
        environment.output.show(event.report());
    });
    return listing.finish();
}

ExitStatus run(const EventsExportCommand& command, const Environment& environment) {
    Output& output = environment.output;
    const auto database = readEvents(environment, std::nullopt);
    if (!database) {
        return output.finish(database.error());
    }
    Listing listing(database.value(), environment);
    if (!command.output) {
        writeExport(listing, output.isJSON(),
                    [&output](std::string_view text) { output.put(text); });
        return listing.finish();
    }
    auto made = NewFile::make(*command.output);
    if (!made) {
        return output.finish(made.error());
    }
    NewFile file = std::move(made).value();
    writeExport(listing, output.isJSON(), [&file](std::string_view text) { file.put(text); });
    const auto fault = listing.fault() ? listing.fault() : file.finish();
    return fault ? output.finish(*fault) : output.finish(ExitStatus::success);
}

} // namespace kstctl
