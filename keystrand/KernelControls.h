#pragma once

#include "keystrand/DispatchTable.h"
#include "keystrand/Registry.h"
#include "keystrand/RestrictedModeController.h"

namespace keystrand {

/// The control codes of the kernel-control command. The table refers to its arguments.
[[nodiscard]] DispatchTable makeKernelControls(RestrictedModeController& restrictedMode,
                                               Registry& registry);

} // namespace keystrand
