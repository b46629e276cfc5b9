#pragma once

#include "keystrand-sim/ContextTable.h"
#include "keystrand-sim/CredentialSet.h"
#include "keystrand-sim/NumberedValues.h"
#include "keystrand-sim/PolicyTable.h"
#include "keystrand-sim/Registry.h"

#include <cstdint>

namespace sim {

/// What the kernel service holds besides the restricted-mode timer.
struct KernelState {
    Registry registry;
    NumberedValues environment;
    ContextTable contexts;
    CredentialSet globalCredentials;
    PolicyTable policies;
    std::uint8_t logLevel = 40;
};

} // namespace sim
