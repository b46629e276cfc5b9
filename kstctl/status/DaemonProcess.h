#pragma once

#include "platform/Date.h"
#include "platform/Result.h"

#include <cstdint>
#include <optional>
#include <string>

struct sd_bus;

namespace kstctl {

/// The daemon's process as far as it is known.
struct DaemonState {
    /// None when no daemon runs.
    std::optional<std::int64_t> pid{};
    std::optional<platform::Date> lastStart{};
    /// Why the last start is not known.
    std::string whyNoStart{};
    /// Who said so: "init system" or "process".
    std::string source{};
    /// Why nothing is known.
    std::optional<platform::Error> problem{};
};

/// Looks for a daemon among the processes that hold the event socket at `path`. Only the start of
/// one that runs is known to this machine then.
[[nodiscard]] DaemonState findDaemonProcess(const std::string& path);

/// Whether this machine runs an init system that can be asked.
[[nodiscard]] bool isInitSystemThere();

/// What the init system knows of the daemon's unit, kstd.service, over the system's bus.
[[nodiscard]] DaemonState askInitSystem();

/// The same over a connection that is open, or null.
[[nodiscard]] DaemonState askInitSystem(sd_bus* bus);

} // namespace kstctl
