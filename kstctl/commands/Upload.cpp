#include "kstctl/Output.h"
#include "kstctl/commands/Commands.h"
#include "kstctl/database/EventDatabase.h"
#include "kstctl/status/UploadConfiguration.h"
#include "kstd/Analytics/Analytics.h"
#include "kstd/Analytics/UploadDocument.h"
#include "platform/linux/LinuxClock.h"
#include "platform/linux/LinuxPropertyLists.h"
#include "platform/linux/LinuxSystemVersion.h"
#include "platform/shared/JSONCodec.h"

namespace kstctl {

namespace {

platform::Result<base::TextBuffer> documentOf(const EventDatabase& database,
                                              const std::optional<std::string>& topic,
                                              const platform::Paths& paths, double postTime) {
    platform::JSONCodec json;
    platform::LinuxPropertyLists propertyLists;
    platform::LinuxSystemVersion version(paths);
    return kstd::makeUploadDocument(
        json, propertyLists,
        [&database](const auto& visitor) {
            for (const StoredEvent& event : database.events) {
                if (event.data) {
                    visitor(*event.data);
                }
            }
        },
        kstd::uploadSummary({}, topic, version, postTime), postTime);
}

Report reportOf(const kstd::AnalyticsConfiguration& analytics, std::uint64_t events,
                std::string_view document) {
    const auto& address =
        analytics.splunkUploadURL ? analytics.splunkUploadURL : analytics.splunkBagURL;
    Report report;
    report.add("events", events)
        .add("address", address ? Report::Datum(address->text) : Report::None())
        .add("isBagAddress", !analytics.splunkUploadURL && analytics.splunkBagURL)
        .add("document", document);
    return report;
}

} // namespace

ExitStatus run(const UploadCommand& command, const Environment& environment) {
    Output& output = environment.output;
    const auto database = readEventDatabase(environment.paths.under(kstd::kAnalyticsDatabasePath),
                                            {.withEvents = true, .id = {}}, environment.patience);
    if (!database) {
        return output.finish(database.error());
    }
    const auto [analytics, remarks] = UploadConfiguration::read(environment.paths);
    const double postTime =
        command.postTime.value_or(platform::millisecondsSince1970(platform::LinuxClock().now()));
    const auto document =
        documentOf(database.value(), analytics.splunkTopicName, environment.paths, postTime);
    if (!document) {
        return output.finish(document.error());
    }
    for (const std::string& remark : remarks) {
        Output::complain(remark);
    }
    if (output.isJSON()) {
        output.show(reportOf(analytics, database.value().count, document.value().view()));
    } else {
        output.put(document.value().view());
        output.put(output.isTerminal() ? "\n" : "");
    }
    return output.finish(remarks.empty() ? ExitStatus::success : ExitStatus::malformed);
}

} // namespace kstctl
