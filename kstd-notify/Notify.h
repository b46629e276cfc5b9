#pragma once

#include "platform/Clock.h"
#include "platform/linux/Paths.h"

#include <chrono>
#include <iosfwd>
#include <span>
#include <string_view>

namespace notify {

enum ExitStatus : int {
    /// Everything there was to send was sent, which may be nothing; the timer is as it has to be,
    /// or the daemon knows that it is not.
    kSent = 0,
    /// Something was not sent, or there is no timer; a message says what and why.
    kNotSent = 1,
    kWrongUsage = 2,
};

/// The program: sends the notices of the subject that is its one argument, or is the alarm's helper
/// when that is "arm". Messages go to `errors`, a line each.
[[nodiscard]] ExitStatus run(std::span<const std::string_view> arguments,
                             const platform::Paths& paths, platform::Clock& clock,
                             std::chrono::milliseconds patience, std::ostream& errors);

} // namespace notify
