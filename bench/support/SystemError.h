#pragma once

#include <cerrno>
#include <string>
#include <system_error>

namespace bench {

/// What to throw when a system call has just failed.
[[nodiscard]] inline std::system_error systemError(const std::string& what) {
    return {errno, std::generic_category(), what};
}

} // namespace bench
