#pragma once

#include "platform/SystemLog.h"

#include <cstddef>

/// Which log the library writes to: one for the process, none at first. Not synchronised.
namespace kst {

/// What `libraryLog` reads and `setLibraryLog` writes; of no use to anyone else.
inline platform::SystemLog* installedLibraryLog = nullptr;

/// Null while none is set.
[[nodiscard]] inline platform::SystemLog* libraryLog() noexcept {
    return installedLibraryLog;
}

/// Makes `log` the library's, or none when it is null. It must outlive its use.
inline void setLibraryLog(platform::SystemLog* log) noexcept {
    installedLibraryLog = log;
}

/// What a line has room for; a longer one is cut there and ends in "...".
inline constexpr std::size_t kMaxLogLineLength = 1023;

/// Writes one line, formatted as printf does, at level info. Writes nothing when `log` is null.
/// The line is built on the stack, so that a failure to allocate can be reported too.
[[gnu::format(printf, 3, 4)]] void writeLogLine(platform::SystemLog* log,
                                                const platform::LogFields& place,
                                                const char* format, ...) noexcept;

} // namespace kst
