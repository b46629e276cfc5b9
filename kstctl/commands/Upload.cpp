#include "base/Concat.h"
#include "kstctl/CommandLine.h"
#include "kstctl/Forms.h"
#include "kstctl/Output.h"
#include "kstctl/database/EventDatabase.h"
#include "kstctl/status/UploadSection.h"
#include "kstd/Analytics/Analytics.h"
#include "kstd/Analytics/ServerDocuments.h"
#include "platform/formats/JSONCodec.h"
#include "platform/formats/PropertyListCodec.h"
#include "platform/linux/LinuxClock.h"
#include "platform/linux/LinuxSystemVersion.h"

#include <functional>

namespace kstctl {

namespace {

constexpr std::string_view kDocumentStart = R"({"events":[)";

using Put = std::function<void(std::string_view text)>;

/// Writes the document piece by piece: its beginning, each event, and the rest of one without
/// events. The first fault is what is returned.
class DocumentWriter {
  public:
    DocumentWriter(const Environment& environment, const EventDatabase& database)
        : environment_(environment), database_(database) {}

    [[nodiscard]] std::optional<platform::Error> write(const std::optional<std::string>& topic,
                                                       double postTime, const Put& put) {
        platform::LinuxSystemVersion version(environment_.paths);
        const auto rest = kstd::makeUploadDocument(
            json_, propertyLists_, [](const auto& /*visitor*/) {},
            kstd::uploadSummary({}, topic, version, postTime), postTime);
        if (!rest) {
            return rest.error();
        }
        put(kDocumentStart);
        auto fault = writeEvents(put);
        put(rest.value().view().substr(kDocumentStart.size()));
        return fault;
    }

  private:
    [[nodiscard]] std::optional<platform::Error> writeEvents(const Put& put) {
        environment_.progress.begin("writing events", database_.events.size());
        auto fault = database_.events.visit([&](const StoredEvent& event) {
            environment_.progress.advance();
            if (environment_.output.isTerminal()) {
                environment_.progress.end();
            }
            // What holds no event leaves no trace.
            const auto text = json_.makeText();
            if (!event.data || !propertyLists_.read(*event.data, *text)) {
                return;
            }
            if (const auto written = text->finish()) {
                put(written.value().view());
                put(",");
            }
        });
        environment_.progress.end();
        return fault;
    }

    const Environment& environment_;
    const EventDatabase& database_;
    platform::JSONCodec json_;
    platform::PropertyListCodec propertyLists_;
};

/// All but the document.
Report reportOf(const kstd::AnalyticsConfiguration& analytics, std::uint64_t events) {
    const auto& address =
        analytics.splunkUploadURL ? analytics.splunkUploadURL : analytics.splunkBagURL;
    Report report;
    report.add("events", events)
        .add("address", address ? Report::Datum(address->text) : Report::None())
        .add("isBagAddress", !analytics.splunkUploadURL && analytics.splunkBagURL);
    return report;
}

/// With --json: the document as one text among the values of a report.
std::optional<platform::Error> writeAsJSON(DocumentWriter& document, Output& output,
                                           const UploadConfiguration& configuration,
                                           std::uint64_t events, double postTime) {
    std::string head = JSONForm(reportOf(configuration.analytics, events));
    head.erase(head.rfind('}'));
    output.put(base::concat(head, R"(,"document":")"));
    auto fault =
        document.write(configuration.analytics.splunkTopicName, postTime,
                       [&output](std::string_view text) { output.put(JSONTextForm(text)); });
    output.put("\"}\n");
    return fault;
}

std::optional<platform::Error> writeAsItIs(DocumentWriter& document, Output& output,
                                           const UploadConfiguration& configuration,
                                           double postTime) {
    auto fault = document.write(configuration.analytics.splunkTopicName, postTime,
                                [&output](std::string_view text) { output.put(text); });
    output.put(output.isTerminal() ? "\n" : "");
    return fault;
}

ExitStatus showDocument(const UploadCommand& command, const Environment& environment) {
    Output& output = environment.output;
    const auto database = readEventDatabase(
        environment.paths.under(kstd::kAnalyticsDatabasePath),
        {.withEvents = true, .id = {}, .progress = &environment.progress}, environment.patience);
    environment.progress.end();
    if (!database) {
        return output.finish(database.error());
    }
    const auto configuration = UploadConfiguration::read(environment.paths);
    const double postTime =
        command.postTime.value_or(platform::millisecondsSince1970(platform::LinuxClock().now()));
    DocumentWriter document(environment, database.value());
    const auto fault = output.isJSON() ? writeAsJSON(document, output, configuration,
                                                     database.value().count, postTime)
                                       : writeAsItIs(document, output, configuration, postTime);
    if (fault) {
        return output.finish(*fault);
    }
    for (const std::string& remark : configuration.remarks) {
        Output::complain(remark);
    }
    return output.finish(configuration.status);
}

/// The daemon uploads when the date has passed, not in its very second.
ExitStatus makeDue(const Environment& environment) {
    Output& output = environment.output;
    platform::Timestamp date = platform::timestampOf(platform::LinuxClock().now());
    date.secondsSince2001 -= 1;
    const auto stored = storeUploadDate(environment.paths.under(kstd::kAnalyticsDatabasePath), date,
                                        environment.patience);
    if (!stored) {
        return output.finish(stored.error());
    }
    const auto analytics = UploadConfiguration::read(environment.paths).analytics;
    const bool isConfigured = analytics.splunkUploadURL || analytics.splunkBagURL;
    output.show(Report()
                    .add("uploadDate", stored.value(), "the next event uploads")
                    .add("isConfigured", isConfigured,
                         isConfigured ? "" : "no upload address: nothing will be sent"));
    return output.finish(ExitStatus::success);
}

} // namespace

ExitStatus run(const UploadCommand& command, const Environment& environment) {
    return command.isNow ? makeDue(environment) : showDocument(command, environment);
}

} // namespace kstctl
