#pragma once

#include "platform/SystemLog.h"

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

} // namespace kst
