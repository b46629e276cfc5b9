#include "kstctl/Output.h"
#include "kstctl/commands/Commands.h"
#include "kstctl/status/Section.h"

#include <utility>

namespace kstctl {

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
};

} // namespace

ExitStatus run(const StatusCommand& /*command*/, const Environment& environment) {
    Section all;
    for (const Part& part : kParts) {
        Section section = part.find(environment);
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
