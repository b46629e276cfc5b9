#include "kstctl/status/Section.h"

#include "base/Concat.h"
#include "kstctl/CommandLine.h"
#include "kstctl/ExitStatus.h"
#include "kstctl/Output.h"
#include "kstctl/RecordingLog.h"
#include "kstctl/Report.h"
#include "kstctl/database/EventDatabase.h"
#include "kstctl/decode/Decoders.h"
#include "kstd/Analytics/Analytics.h"
#include "kstd/Analytics/SQLite/DateFormatter.h"
#include "kstd/DeviceRestrictedMode/DeviceRestrictedModeService.h"
#include "platform/Files.h"
#include "platform/linux/LinuxClock.h"
#include "platform/linux/LinuxManagedSettings.h"
#include "platform/linux/RegularFile.h"
#include "wire/RestrictedMode.h"

#include <cerrno>
#include <unistd.h>
#include <utility>

namespace kstctl {

namespace {

int badness(ExitStatus status) {
    switch (status) {
    case ExitStatus::missing:
        return 5;
    case ExitStatus::unreadable:
        return 4;
    case ExitStatus::malformed:
        return 3;
    case ExitStatus::misconfigured:
        return 2;
    case ExitStatus::failed:
    case ExitStatus::usage:
        return 1;
    case ExitStatus::success:
        return 0;
    }
    return 0;
}

} // namespace

void Section::note(const platform::Error& fault) {
    if (!worst || badness(statusOf(fault)) > badness(statusOf(*worst))) {
        worst = fault;
    }
}

std::string octalMode(unsigned mode) {
    std::string digits;
    for (int shift = 9; shift >= 0; shift -= 3) {
        digits += static_cast<char>('0' + ((mode >> static_cast<unsigned>(shift)) & 7U));
    }
    return digits;
}

namespace {

/// The daemon may be able to read what the caller may not: the error's number, 0 when the caller
/// may.
int errorOfReading(const std::string& path) {
    return ::access(path.c_str(), R_OK) == 0 || !isRefusal(errno) ? 0 : errno;
}

} // namespace

Section settingsSection(const Environment& environment) {
    const std::string path = environment.paths.managedSettings();
    Section section;
    section.report.add("path", path);
    if (const int error = errorOfReading(path); error != 0) {
        section.addUnknown("restrictedModeAllowed", fileError(path, error));
        return section;
    }
    RecordingLog log;
    platform::LinuxManagedSettings settings(environment.paths, log);
    section.report.add("isPresent", ::access(path.c_str(), F_OK) == 0)
        .add("restrictedModeAllowed", settings.isRestrictedModeAllowed());
    for (const std::string& line : log.lines()) {
        section.addProblem(line);
    }
    return section;
}

namespace {

/// Why the daemon takes the file for one that is not there; empty when it does not.
std::string problemOf(const std::string& path, const platform::RegularFile& file,
                      std::size_t leastSize) {
    if (file.failure == platform::ReadFailure::notRegular) {
        return base::concat(path, ": not a regular file");
    }
    return file.bytes.size() < leastSize
               ? base::concat(path, ": shorter than ", leastSize, " bytes")
               : std::string();
}

Section fileSection(const Environment& environment, const char* path, std::size_t leastSize,
                    void (*addFields)(Report& report, decode::Bytes bytes)) {
    const std::string real = environment.paths.under(path);
    // As the daemon reads it.
    const platform::RegularFile file = platform::readRegularFile(
        real, platform::kMaxLoadSize, {.takesBeginning = true, .followsLink = false});
    Section section;
    section.report.add("path", real);
    if (file.failure == platform::ReadFailure::missing) {
        section.report.add("isPresent", false);
        return section;
    }
    if (file.failure == platform::ReadFailure::unreadable) {
        section.addUnknown("isPresent", fileError(real, file.error));
        return section;
    }
    section.report.add("isPresent", true);
    if (const std::string problem = problemOf(real, file, leastSize); !problem.empty()) {
        section.addProblem(problem);
        return section;
    }
    section.report.add("size", file.bytes.size());
    addFields(section.report, file.bytes);
    return section;
}

} // namespace

Section stateFileSection(const Environment& environment) {
    return fileSection(environment, kstd::kStateFilePath, wire::rm::kStateBlobSize,
                       decode::addStateFields);
}

Section analyticsFileSection(const Environment& environment) {
    return fileSection(environment, kstd::kAnalyticsFilePath, wire::rm::kAnalyticsBlobSize,
                       decode::addAnalyticsFields);
}

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

namespace {

struct Part {
    const char* name;
    Section (*find)(const Environment& environment);
};

constexpr Part kParts[] = {
    {"daemon", daemonSection},
    {"stateFile", stateFileSection},
    {"analyticsFile", analyticsFileSection},
    {"alarms", alarmSection},
    {"managedSettings", settingsSection},
    {"database", databaseSection},
    {"upload", uploadSection},
    {"gate", gateSection},
};

} // namespace

ExitStatus run(const StatusCommand& /*command*/, const Environment& environment) {
    Section all;
    for (const Part& part : kParts) {
        Section section = part.find(environment);
        if (section.report.isEmpty()) {
            continue;
        }
        all.report.add(part.name, std::move(section.report));
        if (section.worst) {
            all.note(*section.worst);
        }
    }
    environment.output.show(all.report);
    return all.worst ? environment.output.finish(*all.worst)
                     : environment.output.finish(ExitStatus::success);
}

} // namespace kstctl
