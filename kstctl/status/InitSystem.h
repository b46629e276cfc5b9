#pragma once

#include "kstctl/status/DaemonProcess.h"

struct sd_bus;

namespace kstctl {

/// Whether this machine runs an init system that can be asked.
[[nodiscard]] bool isInitSystemThere();

/// What the init system knows of the daemon's unit, kstd.service, over the system's bus.
[[nodiscard]] DaemonState askInitSystem();

/// The same over a connection that is open, or null.
[[nodiscard]] DaemonState askInitSystem(sd_bus* bus);

} // namespace kstctl
