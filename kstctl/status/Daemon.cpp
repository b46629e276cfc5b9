#include "base/Concat.h"
#include "kstctl/Environment.h"
#include "kstctl/EventSocketFile.h"
#include "kstctl/TimeText.h"
#include "kstctl/status/DaemonProcess.h"
#include "kstctl/status/InitSystem.h"
#include "kstctl/status/Section.h"

namespace kstctl {

namespace {

void addSocket(Section& section, const EventSocketFile& socket) {
    Report report;
    report.add("path", socket.path).add("isPresent", socket.isPresent);
    if (socket.isPresent) {
        report.add("owner", socket.owner).add("mode", octalMode(socket.mode));
    }
    if (!socket.problem) {
        report.add("isOpen", true);
    } else if (statusOf(*socket.problem) == ExitStatus::missing) {
        report.add("isOpen", false, socket.problem->description);
    } else {
        report.add("isOpen", Report::Unknown{socket.problem->description});
    }
    if (socket.problem) {
        section.note(*socket.problem);
    }
    section.report.add("eventSocket", std::move(report));
}

void addProcess(Section& section, const DaemonState& state) {
    if (state.problem) {
        section.addUnknown("isRunning", *state.problem);
        section.report.add("lastStart", Report::Unknown{state.problem->description});
        return;
    }
    section.report.add("isRunning", state.pid.has_value());
    if (state.pid) {
        section.report.add("pid", *state.pid);
    }
    if (state.lastStart) {
        section.report.add("lastStart", timeText(*state.lastStart));
    } else {
        section.report.add("lastStart", Report::Unknown{state.whyNoStart});
    }
    section.report.add("source", state.source);
}

} // namespace

Section daemonSection(const Environment& environment) {
    Section section;
    const EventSocketFile socket = EventSocketFile::look(environment.paths);
    addSocket(section, socket);
    addProcess(section, environment.paths.isSystemRoot() && isInitSystemThere()
                            ? askInitSystem()
                            : findDaemonProcess(socket.path));
    return section;
}

} // namespace kstctl
