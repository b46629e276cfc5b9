#include "KSTLib/LibraryLogging.h"

#include "common/LogLine.h"

#include <cinttypes>

namespace kst {

std::uint8_t gLogLevel = kInitialLogLevel;

void logCalled(const char* function) noexcept {
    if (isShown(kTraceSeverity)) {
        writeLogLine(libraryLog(), {{}, 0, function}, "KSTLib: %s: called.\n", function);
    }
}

KSTStatus logReturning(const char* function, KSTStatus status) noexcept {
    if (isShown(status == kKSTErrorSuccess ? kTraceSeverity : kFailureSeverity)) {
        writeLogLine(libraryLog(), {{}, 0, function}, "KSTLib: %s: returning, err = %" PRId32 ".\n",
                     function, status);
    }
    return status;
}

void logReturning(const char* function) noexcept {
    if (isShown(kTraceSeverity)) {
        writeLogLine(libraryLog(), {{}, 0, function}, "KSTLib: %s: returning.\n", function);
    }
}

void logLevelSet(const char* function) noexcept {
    if (isShown(kTraceSeverity)) {
        writeLogLine(libraryLog(), {{}, 0, function}, "KSTLib: %s: log level set to %d.\n",
                     function, gLogLevel);
    }
}

} // namespace kst
