#include "common/Failure.h"

#include "common/LibraryLog.h"

#include <cinttypes>
#include <cstdio>
#include <cstdlib>

namespace kst {

void writeAssertLine(platform::SystemLog* log, const char* tag, const char* path,
                     const CheckPlace& place, const char* condition, std::int64_t value) noexcept {
    // The message after the value is always empty.
    writeLogLine(log, {place.file, place.line, {}},
                 "%s: AssertMacros: %s (value: 0x%" PRIx64 "), %s file: %s:%d\n", tag, condition,
                 static_cast<std::uint64_t>(value), "", path, place.line);
}

void stop(const AssertionContext& context, const char* condition, CheckPlace place) noexcept {
    static_cast<void>(fail(context, condition, 0, kKSTErrorUnexpected, place));
    std::abort();
}

KSTStatus printReturn(const char* function, KSTStatus status) noexcept {
    if (status != kKSTErrorSuccess) {
        // There is nobody to tell when standard output cannot be written to.
        static_cast<void>(
            std::printf("%s: %s: returning, err = %" PRId32 ".\n", kLibCallTag, function, status));
        static_cast<void>(std::fflush(stdout));
    }
    return status;
}

} // namespace kst
