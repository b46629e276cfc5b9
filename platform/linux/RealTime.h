#pragma once

#include "platform/Date.h"

#include <time.h>

namespace platform {

/// The wall clock.
[[nodiscard]] inline Date realTimeNow() {
    timespec now{};
    ::clock_gettime(CLOCK_REALTIME, &now);
    return {now.tv_sec * kNanosecondsPerSecond + now.tv_nsec};
}

} // namespace platform
