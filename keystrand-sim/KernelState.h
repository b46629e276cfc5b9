#pragma once

#include "keystrand-sim/EnvironmentVariables.h"
#include "keystrand-sim/Registry.h"

#include <cstdint>

namespace sim {

/// What the kernel service holds besides the restricted-mode timer.
struct KernelState {
    Registry registry;
    EnvironmentVariables environment;
    std::uint8_t logLevel = 40;
};

} // namespace sim
