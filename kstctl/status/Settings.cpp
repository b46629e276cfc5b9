#include "kstctl/Environment.h"
#include "kstctl/FileError.h"
#include "kstctl/RecordingLog.h"
#include "kstctl/status/Section.h"
#include "platform/linux/LinuxManagedSettings.h"

#include <cerrno>
#include <unistd.h>

namespace kstctl {

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

} // namespace kstctl
