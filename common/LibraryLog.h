#pragma once

#include "platform/SystemLog.h"

/// Which log the library writes to: one for the process, none at first. Not synchronised.
namespace kst {

/// Null while none is set.
[[nodiscard]] platform::SystemLog* libraryLog() noexcept;

/// Makes `log` the library's, or none when it is null. It must outlive its use.
void setLibraryLog(platform::SystemLog* log) noexcept;

} // namespace kst
