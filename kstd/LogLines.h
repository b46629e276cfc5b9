#pragma once

#include "base/Concat.h"
#include "common/AssertLine.h"
#include "platform/SystemLog.h"

#include <cstdint>
#include <string_view>

namespace kstd {

inline constexpr char kTag[] = "kstd";

/// Writes "kstd: <function>: " and the joined parts, at info level.
template <typename... Parts>
void logLine(platform::SystemLog& log, std::string_view function, const Parts&... message) {
    log.write(platform::LogLevel::info, base::concat(kTag, ": ", function, ": ", message..., "\n"),
              {.function = function});
}

} // namespace kstd
