#pragma once

#include "platform/Date.h"

namespace platform {

/// Sees to it that somebody looks at the alarms when the earliest of them becomes due: this
/// process, or one that is launched for it. Main thread only.
class AlarmWaker {
  public:
    AlarmWaker() = default;
    AlarmWaker(const AlarmWaker&) = delete;
    AlarmWaker& operator=(const AlarmWaker&) = delete;
    virtual ~AlarmWaker() = default;

    /// Waits for `date`, in the place of what was armed. A date beyond what can be expressed is
    /// held at the latest that can. False when nothing will wake because the date has passed
    /// meanwhile; the alarm is then due.
    [[nodiscard]] virtual bool arm(Date date) = 0;

    /// Waits for nothing.
    virtual void disarm() = 0;

    /// Takes this process out of it: it is woken no more. What wakes without it stays armed.
    virtual void close() = 0;
};

} // namespace platform
