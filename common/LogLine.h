#pragma once

#include "platform/SystemLog.h"

#include <cstddef>

namespace kst {

/// What a line has room for; a longer one is cut there and ends in "...".
inline constexpr std::size_t kMaxLogLineLength = 1023;

/// Writes one line, formatted as printf does, at level info. Writes nothing when `log` is null.
/// The line is built on the stack, so that a failure to allocate can be reported too.
[[gnu::format(printf, 3, 4)]] void writeLogLine(platform::SystemLog* log,
                                                const platform::CodePlace& place,
                                                const char* format, ...) noexcept;

} // namespace kst
