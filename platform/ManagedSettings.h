#pragma once

#include "base/NotCopied.h"

namespace platform {

/// The settings that a device management has put on this machine.
///
/// A change is announced by the event "com.zerva.quorvane.effectivesettingschanged" on the stream
/// "com.zerva.notifyd.matching". Called on the main thread only.
class ManagedSettings : private base::NotCopied {
  public:
    virtual ~ManagedSettings() = default;

    /// Whether restricted mode is allowed, as it stands now. Only a setting that can be read,
    /// understood and trusted, and says no, gives false: the protection stays on in any doubt, and
    /// doubt is said in the log.
    [[nodiscard]] virtual bool isRestrictedModeAllowed() = 0;
};

inline constexpr char kSettingsChangedEvent[] = "com.zerva.quorvane.effectivesettingschanged";

} // namespace platform
