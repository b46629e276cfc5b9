#pragma once

#include "keystrand/ContextTable.h"
#include "keystrand/CredentialSet.h"
#include "keystrand/NumberedValues.h"
#include "keystrand/PolicyTable.h"
#include "keystrand/Registry.h"

#include <cstdint>

namespace keystrand {

/// What the kernel service holds besides the restricted-mode timer.
struct KernelState {
    Registry registry;
    NumberedValues environment;
    ContextTable contexts;
    CredentialSet globalCredentials;
    PolicyTable policies;
    std::uint8_t logLevel = 40;
};

} // namespace keystrand
