#include "kstctl/status/RegisteredAlarms.h"

#include "base/Concat.h"
#include "kstctl/ExitStatus.h"
#include "kstctl/Output.h"
#include "kstctl/RecordingLog.h"
#include "kstctl/Report.h"
#include "kstctl/status/Section.h"
#include "platform/linux/LinuxClock.h"
#include "platform/linux/alarms/AlarmStore.h"
#include "wire/EventDatagram.h"

#include <algorithm>
#include <cerrno>
#include <filesystem>
#include <tuple>
#include <unistd.h>
#include <utility>

namespace kstctl {

namespace {

namespace fs = std::filesystem;

/// The names in a directory. `error` becomes 0 also when there is no such directory.
std::vector<std::string> namesIn(const std::string& directory, int& error) {
    std::vector<std::string> names;
    std::error_code code;
    // Its ++ would throw, whatever it was made with.
    for (fs::directory_iterator entry(directory, code), end; !code && entry != end;
         entry.increment(code)) {
        names.push_back(entry->path().filename().string());
    }
    const bool isNone =
        code == std::errc::no_such_file_or_directory || code == std::errc::not_a_directory;
    error = isNone ? 0 : code.value();
    return names;
}

/// An alarm whose file the caller may not read is not the same as one that nobody can.
int errorOfReading(const std::string& directory, const std::vector<std::string>& files) {
    for (const std::string& file : files) {
        if (::access(base::concat(directory, '/', file).c_str(), R_OK) != 0 && isRefusal(errno)) {
            return errno;
        }
    }
    return 0;
}

bool speaksOf(const std::string& line, const std::string& path) {
    return line.find(base::concat(path, '.')) != std::string::npos;
}

/// Appends the alarms of one stream, as the daemon's own code reads them.
void append(std::vector<RegisteredAlarm>& alarms, const std::string& directory,
            const std::string& stream) {
    RecordingLog log;
    for (const auto& [event, date] :
         platform::AlarmStore(directory, {wire::kAlarmName}, log).load(stream)) {
        RegisteredAlarm alarm{.stream = stream, .event = event, .date = date, .problem = {}};
        const std::string path = base::concat(directory, '/', stream, '/', event);
        for (const std::string& line : log.lines()) {
            if (speaksOf(line, path)) {
                alarm.problem = line;
            }
        }
        alarms.push_back(std::move(alarm));
    }
}

} // namespace

platform::Result<std::vector<RegisteredAlarm>> registeredAlarms(const platform::Paths& paths) {
    const std::string directory = paths.alarmDirectory();
    int error = 0;
    const std::vector<std::string> streams = namesIn(directory, error);
    if (error != 0) {
        return fileError(directory, error);
    }
    std::vector<RegisteredAlarm> alarms;
    for (const std::string& stream : streams) {
        const std::string path = base::concat(directory, '/', stream);
        const std::vector<std::string> files = namesIn(path, error);
        error = error == 0 ? errorOfReading(path, files) : error;
        if (error != 0) {
            return fileError(path, error);
        }
        if (!files.empty()) {
            append(alarms, directory, stream);
        }
    }
    std::sort(alarms.begin(), alarms.end(),
              [](const RegisteredAlarm& one, const RegisteredAlarm& other) {
                  return std::tie(one.stream, one.event) < std::tie(other.stream, other.event);
              });
    return alarms;
}

Section alarmSection(const Environment& environment) {
    Section section;
    section.report.add("path", environment.paths.alarmDirectory());
    const auto alarms = registeredAlarms(environment.paths);
    if (!alarms) {
        section.addUnknown("registered", alarms.error());
        return section;
    }
    const platform::Date now = platform::LinuxClock().now();
    Data list;
    for (const RegisteredAlarm& alarm : alarms.value()) {
        Report report;
        report.add("stream", alarm.stream).add("name", alarm.event);
        if (alarm.problem.empty()) {
            report.add("date", alarm.date.nanosecondsSince1970, timeText(alarm.date));
        } else {
            report.add("date", Report::Unknown{alarm.problem});
            section.note(failure(ExitStatus::malformed, alarm.problem));
        }
        report.add("isDue", !alarm.problem.empty() || alarm.date <= now);
        list.emplace_back(std::move(report));
    }
    section.report.add("registered", std::move(list));
    return section;
}

} // namespace kstctl
