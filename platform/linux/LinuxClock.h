#pragma once

#include "platform/Clock.h"
#include "platform/Date.h"

#include <time.h>

namespace platform {

/// The wall clock.
[[nodiscard]] inline Date realTimeNow() {
    timespec now{};
    ::clock_gettime(CLOCK_REALTIME, &now);
    return {now.tv_sec * kNanosecondsPerSecond + now.tv_nsec};
}

class LinuxClock final : public Clock {
  public:
    [[nodiscard]] Date now() override { return realTimeNow(); }
};

} // namespace platform
