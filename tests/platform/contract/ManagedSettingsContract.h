#pragma once

#include "base/NotCopied.h"
#include "platform/ManagedSettings.h"
#include "tests/platform/contract/ContractTest.h"

#include <optional>

namespace contract {

/// Managed settings, nothing set at first.
struct ManagedSettingsFixture : private base::NotCopied {
    virtual ~ManagedSettingsFixture() = default;

    virtual platform::ManagedSettings& settings() = 0;

    /// Puts the setting in the place of what is there; none takes it away.
    virtual void put(std::optional<bool> allowed) = 0;
};

class ManagedSettingsContract : public ContractTest<ManagedSettingsFixture> {
  protected:
    [[nodiscard]] bool allowed() { return fixture().settings().isRestrictedModeAllowed(); }
};

} // namespace contract
