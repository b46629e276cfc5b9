#pragma once

#include "base/FileDescriptor.h"
#include "platform/Date.h"

namespace platform {

/// A timer of the system on the wall clock. It wakes the machine from sleep where the system can.
class RealTimeTimer {
  public:
    enum class Wake { nothing, due, clockWasSet };

    RealTimeTimer();

    /// Readable when the timer has something to say.
    [[nodiscard]] int descriptor() const { return descriptor_.get(); }

    /// Replaces what was armed. A date beyond what the system can express waits until the latest it
    /// can; one that is past, even before 1970, is due at once.
    void arm(Date date);
    void disarm();

    /// Why the descriptor is readable. After clockWasSet the timer must be armed again.
    [[nodiscard]] Wake acknowledge();

  private:
    base::FileDescriptor descriptor_;
};

} // namespace platform
