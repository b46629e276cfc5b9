#pragma once

#include "base/NotCopied.h"
#include "platform/Date.h"

namespace platform {

/// The run loop of the main thread.
class MainRunLoop : private base::NotCopied {
  public:
    virtual ~MainRunLoop() = default;

    /// Waits until a source has something or the deadline has come, and handles what there is.
    /// Returns true when the loop ran (also when only the deadline came), false at once when it
    /// has no source left and so could not be run. A deadline in the past handles what is ready
    /// and does not wait.
    [[nodiscard]] virtual bool runOnce(Date deadline) = 0;
};

} // namespace platform
