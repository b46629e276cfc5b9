#pragma once

#include "platform/Date.h"

namespace platform {

/// The wall clock, which anybody may set forwards or backwards. May be called from any thread.
class Clock {
  public:
    Clock() = default;
    Clock(const Clock&) = delete;
    Clock& operator=(const Clock&) = delete;
    virtual ~Clock() = default;

    [[nodiscard]] virtual Date now() = 0;
};

} // namespace platform
