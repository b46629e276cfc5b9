#include "common/LibraryLog.h"

#include <algorithm>
#include <array>
#include <cstdarg>
#include <cstdio>
#include <string_view>

namespace kst {

void writeLogLine(platform::SystemLog* log, const platform::LogFields& place, const char* format,
                  ...) noexcept {
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
    log->write(platform::LogLevel::info, std::string_view(line.data(), length), place);
}

} // namespace kst
