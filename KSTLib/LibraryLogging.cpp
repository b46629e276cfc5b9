#include "KSTLib/LibraryLogging.h"

#include "common/Failure.h"

#include <cinttypes>

namespace kst {

namespace {

/// The severity of a return.
std::uint8_t severityOf(KSTStatus status) {
    return status == kKSTErrorSuccess ? kTraceSeverity : kFailureSeverity;
}

} // namespace

std::uint8_t gLogLevel = kInitialLogLevel;

void logCalled(const char* function) noexcept {
    if (isShown(kTraceSeverity)) {
        writeLogLine(libraryLog(), {{}, 0, function}, "KSTLib: %s: called.\n", function);
    }
}

KSTStatus logReturning(const char* function, KSTStatus status) noexcept {
    if (isShown(severityOf(status))) {
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

void logReturningReference(const char* function, KSTStatus status, const void* reference) noexcept {
    if (isShown(severityOf(status))) {
        writeLogLine(libraryLog(), {{}, 0, function}, "KSTLib: %s: returning, ref = %p.\n",
                     function, reference);
    }
}

void logLevelSet(const char* function) noexcept {
    if (isShown(kTraceSeverity)) {
        writeLogLine(libraryLog(), {{}, 0, function}, "KSTLib: %s: log level set to %d.\n",
                     function, gLogLevel);
    }
}

} // namespace kst
