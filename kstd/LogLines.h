#pragma once

#include "base/Concat.h"
#include "common/Failure.h"
#include "platform/SystemLog.h"

#include <cstddef>
#include <cstdint>
#include <string_view>

namespace kstd {

inline constexpr char kTag[] = "kstd";

/// More than any log shows of a line.
inline constexpr std::size_t kLogLineRoom = 9000;

/// Writes "kstd: <function>: " and the joined parts, at info level. Nothing is allocated, so that a
/// failure for want of memory can be told.
template <typename... Parts>
void logLine(platform::SystemLog& log, std::string_view function, const Parts&... message) {
    base::BoundedText<kLogLineRoom> line;
    const auto add = [&line](const auto&... parts) {
        (base::append(line, parts), ...);
    };
    add(kTag, ": ", function, ": ", message..., "\n");
    log.write(platform::LogLevel::info, line.view(), {.function = function});
}

} // namespace kstd
