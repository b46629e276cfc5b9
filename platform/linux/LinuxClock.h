#pragma once

#include "platform/Clock.h"
#include "platform/linux/RealTime.h"

namespace platform {

class LinuxClock final : public Clock {
  public:
    [[nodiscard]] Date now() override { return realTimeNow(); }
};

} // namespace platform
