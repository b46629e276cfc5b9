#pragma once

#include "platform/linux/Paths.h"

#include <chrono>

namespace kstctl {

class Output;
class Progress;

/// What every command works with.
struct Environment {
    platform::Paths paths;
    Output& output;
    Progress& progress;
    /// The longest wait for a database that is locked or a socket that is full.
    std::chrono::milliseconds patience;
};

} // namespace kstctl
