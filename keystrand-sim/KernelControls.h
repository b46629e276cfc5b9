#pragma once

#include "keystrand-sim/DispatchTable.h"
#include "keystrand-sim/Registry.h"
#include "keystrand-sim/RestrictedModeController.h"

namespace sim {

/// The control codes of the kernel-control command. The table refers to its arguments.
[[nodiscard]] DispatchTable makeKernelControls(RestrictedModeController& restrictedMode,
                                               Registry& registry);

} // namespace sim
