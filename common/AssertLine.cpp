#include "common/AssertLine.h"

#include "common/LibraryLog.h"

#include <cinttypes>
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

} // namespace kst
