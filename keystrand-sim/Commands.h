#pragma once

#include "keystrand-sim/DispatchTable.h"
#include "keystrand-sim/EnvironmentVariables.h"

namespace sim {

/// The commands of a frame. The table refers to its arguments.
[[nodiscard]] DispatchTable makeCommands(EnvironmentVariables& environment,
                                         const DispatchTable& kernelControls);

} // namespace sim
