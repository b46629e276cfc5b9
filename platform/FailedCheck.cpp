#include "platform/FailedCheck.h"

#include <algorithm>
#include <array>
#include <cinttypes>
#include <cstdarg>
#include <cstdio>
#include <cstdlib>
#include <string_view>

namespace platform {

void writeLogLine(SystemLog* log, const LogFields& place, const char* format, ...) noexcept {
    if (log == nullptr) {
        return;
    }
    constexpr std::string_view kEllipsis = "...";
    std::array<char, kMaxLogLineLength + kEllipsis.size() + 1> line;
    std::va_list arguments;
    va_start(arguments, format);
    const int wanted = std::vsnprintf(line.data(), line.size(), format, arguments);
    va_end(arguments);
    if (wanted < 0) {
        return;
    }
    auto length = static_cast<std::size_t>(wanted);
    // The newline at the end is no part of the line.
    const bool isWhole = length <= kMaxLogLineLength ||
                         (length == kMaxLogLineLength + 1 && line[kMaxLogLineLength] == '\n');
    if (!isWhole) {
        std::copy(kEllipsis.begin(), kEllipsis.end(), line.begin() + kMaxLogLineLength);
        length = kMaxLogLineLength + kEllipsis.size();
    }
    log->write(LogLevel::info, std::string_view(line.data(), length), place);
}

void writeAssertLine(SystemLog* log, const char* tag, const char* path, const CheckPlace& place,
                     const char* condition, std::int64_t value) noexcept {
    // The message after the value is always empty.
    writeLogLine(log, {place.file, place.line, {}},
                 "%s: AssertMacros: %s (value: 0x%" PRIx64 "), %s file: %s:%d\n", tag, condition,
                 static_cast<std::uint64_t>(value), "", path, place.line);
}

void stop(const AssertionContext& context, const char* condition, CheckPlace place) noexcept {
    static_cast<void>(fail(context, condition, 0, 0, place));
    std::abort();
}

} // namespace platform
