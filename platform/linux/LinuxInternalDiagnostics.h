#pragma once

#include "platform/InternalDiagnostics.h"
#include "platform/linux/Paths.h"

namespace platform {

/// A subsystem's diagnostics are on as long as the file /etc/kstd/internal-diagnostics/<subsystem>
/// is there, whatever is in it: only root can put it there. Looked at on every call; may be called
/// from any thread.
class LinuxInternalDiagnostics final : public InternalDiagnostics {
  public:
    explicit LinuxInternalDiagnostics(Paths paths);

    [[nodiscard]] bool isEnabled(std::string_view subsystem) override;

  private:
    Paths paths_;
};

} // namespace platform
