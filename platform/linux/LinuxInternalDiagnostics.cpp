#include "platform/linux/LinuxInternalDiagnostics.h"

#include <sys/stat.h>
#include <utility>

namespace platform {

LinuxInternalDiagnostics::LinuxInternalDiagnostics(Paths paths) : paths_(std::move(paths)) {}

bool LinuxInternalDiagnostics::isEnabled(std::string_view subsystem) {
    if (!isPlainFileName(subsystem)) {
        return false;
    }
    struct stat status {};
    return ::stat(paths_.internalDiagnostics(subsystem).c_str(), &status) == 0 &&
           S_ISREG(status.st_mode);
}

} // namespace platform
