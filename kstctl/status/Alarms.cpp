#include "kstctl/Alarms.h"

#include "kstctl/Environment.h"
#include "kstctl/TimeText.h"
#include "kstctl/status/Section.h"
#include "platform/linux/LinuxClock.h"

#include <utility>

namespace kstctl {

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
    for (const Alarm& alarm : alarms.value()) {
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
