#pragma once

#include "base/Concat.h"
#include "platform/Result.h"

#include <cerrno>
#include <string>
#include <string_view>
#include <system_error>
#include <utility>

namespace kstctl {

/// What the program ends with. The numbers are documented and stay.
enum class ExitStatus : int {
    success = 0,
    /// Asked for and refused, or it did not work.
    failed = 1,
    /// The command line is wrong.
    usage = 2,
    /// The daemon, the simulator, a file or an event is not there.
    missing = 3,
    /// The caller may not read it.
    unreadable = 4,
    /// It is there and is not what it must be.
    malformed = 5,
    /// An upload setting is there that cannot be used, or not safely.
    misconfigured = 6,
};

/// An error whose code is the status that the program ends with.
inline constexpr char kCommandErrorDomain[] = "kstctl";

[[nodiscard]] inline platform::Error failure(ExitStatus status, std::string message) {
    return {kCommandErrorDomain, static_cast<int>(status), std::move(message)};
}

/// Any error of another domain is a plain failure.
[[nodiscard]] inline ExitStatus statusOf(const platform::Error& error) {
    return error.domain == kCommandErrorDomain ? static_cast<ExitStatus>(error.code)
                                               : ExitStatus::failed;
}

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
