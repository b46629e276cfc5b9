#include "common/LogLine.h"

#include <algorithm>
#include <array>
#include <cstdarg>
#include <cstdio>
#include <string_view>

namespace kst {

void writeLogLine(platform::SystemLog* log, const platform::CodePlace& place, const char* format,
                  ...) noexcept {
    if (log == nullptr) {
        return;
    }
    std::array<char, kMaxLogLineLength + 1> line;
    std::va_list arguments;
    va_start(arguments, format);
    const int wanted = std::vsnprintf(line.data(), line.size(), format, arguments);
    va_end(arguments);
    if (wanted < 0) {
        return;
    }
    const std::size_t length = std::min(static_cast<std::size_t>(wanted), kMaxLogLineLength);
    log->write(platform::LogLevel::info, std::string_view(line.data(), length), place);
}

} // namespace kst
