#include "common/AssertLine.h"

#include "common/LogLine.h"

#include <cinttypes>
#include <cstdlib>

namespace kst {

void writeAssertLine(platform::SystemLog* log, const char* tag, const char* path, int line,
                     const char* condition, std::int64_t value) noexcept {
    // The message after the value is always empty.
    writeLogLine(log, {path, line, {}},
                 "%s: AssertMacros: %s (value: 0x%" PRIx64 "), %s file: %s:%d\n", tag, condition,
                 static_cast<std::uint64_t>(value), "", path, line);
}

void stop(const AssertionContext& context, const char* condition, int line) noexcept {
    static_cast<void>(fail(context, condition, 0, kKSTErrorUnexpected, line));
    std::abort();
}

} // namespace kst
