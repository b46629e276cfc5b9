#pragma once

#include "platform/Date.h"
#include "platform/Result.h"
#include "platform/linux/Paths.h"

#include <string>
#include <vector>

namespace kstctl {

/// An alarm that is registered.
struct RegisteredAlarm {
    std::string stream;
    std::string event;
    platform::Date date;
    /// Why its file cannot be understood, which makes it due; else empty.
    std::string problem;
};

/// All alarms that are on disk, by stream and name. None have ever been registered when there is no
/// directory for them. Fails when it cannot be read.
[[nodiscard]] platform::Result<std::vector<RegisteredAlarm>>
registeredAlarms(const platform::Paths& paths);

} // namespace kstctl
