#include "common/AssertLine.h"

#include "common/LogLine.h"

#include <cinttypes>
#include <cstdlib>

namespace kst {

KSTStatus fail(const AssertionContext& context, const char* condition, std::int64_t value,
               KSTStatus status, int line) noexcept {
    // The message after the value is always empty.
    writeLogLine(context.log, {context.path, line, {}},
                 "%s: AssertMacros: %s (value: 0x%" PRIx64 "), %s file: %s:%d\n", context.tag,
                 condition, static_cast<std::uint64_t>(value), "", context.path, line);
    return status;
}

void stop(const AssertionContext& context, const char* condition, int line) noexcept {
    static_cast<void>(fail(context, condition, 0, kKSTErrorUnexpected, line));
    std::abort();
}

} // namespace kst
