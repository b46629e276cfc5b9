#include "kstctl/Environment.h"
#include "kstctl/TimeText.h"
#include "kstctl/database/EventDatabase.h"
#include "kstctl/status/Section.h"
#include "kstd/Analytics/Analytics.h"
#include "kstd/Analytics/SQLite/DateFormatter.h"
#include "platform/linux/LinuxClock.h"

namespace kstctl {

namespace {

void addUploadDate(Section& section, const std::optional<std::string>& text) {
    if (!text) {
        section.report.add("uploadDate", Report::None(), "the next event sets it");
        return;
    }
    section.report.add("uploadDate", *text);
    const auto date = kstd::DateFormatter().date(*text);
    if (!date) {
        section.addUnknown("isUploadDue",
                           failure(ExitStatus::malformed, "the stored upload date is no date"));
        return;
    }
    const platform::Timestamp now = platform::timestampOf(platform::LinuxClock().now());
    const bool isDue = now.secondsSince2001 > date->secondsSince2001;
    section.report.add("isUploadDue", isDue, isDue ? "the next event uploads" : "");
}

} // namespace

Section databaseSection(const Environment& environment) {
    const std::string path = environment.paths.under(kstd::kAnalyticsDatabasePath);
    Section section;
    section.report.add("path", path);
    const auto database = readEventDatabase(path, {}, environment.patience);
    if (!database && statusOf(database.error()) == ExitStatus::missing) {
        section.report.add("isPresent", false, "no event was kept yet");
    } else if (!database) {
        section.addUnknown("events", database.error());
    } else {
        section.report.add("isPresent", true).add("events", database.value().count);
        addUploadDate(section, database.value().uploadDate);
    }
    return section;
}

} // namespace kstctl
