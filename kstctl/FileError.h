#pragma once

#include "base/Concat.h"
#include "kstctl/ExitStatus.h"

#include <cerrno>
#include <string_view>
#include <system_error>

namespace kstctl {

[[nodiscard]] inline bool isRefusal(int error) {
    return error == EACCES || error == EPERM;
}

/// Why a file, by its path and the error's number, could not be had.
[[nodiscard]] inline platform::Error fileError(std::string_view path, int error) {
    const ExitStatus status = error == ENOENT || error == ENOTDIR ? ExitStatus::missing
                              : isRefusal(error)                  ? ExitStatus::unreadable
                                                                  : ExitStatus::failed;
    return failure(status, base::concat(path, ": ", std::generic_category().message(error)));
}

} // namespace kstctl
