#pragma once

#include "base/NotCopied.h"
#include "platform/Date.h"

namespace platform {

/// Sees to it that somebody looks at the alarms when the earliest of them becomes due: this
/// process, or one that is launched for it. Main thread only.
class AlarmWaker : private base::NotCopied {
  public:
    virtual ~AlarmWaker() = default;

    /// Waits for `date`, in the place of what was armed. One that is past wakes at once; one beyond
    /// what can be expressed is held at the latest that can.
    virtual void arm(Date date) = 0;

    /// Waits for nothing.
    virtual void disarm() = 0;

    /// Whether the alarm is lost to a process that ends now: only this one waits for it.
    [[nodiscard]] virtual bool holdsProcess() const = 0;

    /// An idle time has passed: what has failed is tried again.
    virtual void tryAgain() = 0;

    /// Takes this process out of it: it is woken no more. What wakes without it stays armed.
    virtual void close() = 0;
};

} // namespace platform
