#pragma once

#include "keystrand/DispatchTable.h"
#include "keystrand/RestrictedModeController.h"

namespace keystrand {

/// The control codes of the kernel-control command. The table refers to its argument.
[[nodiscard]] DispatchTable makeKernelControls(RestrictedModeController& restrictedMode);

} // namespace keystrand
