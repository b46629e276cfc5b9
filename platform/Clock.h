#pragma once

#include "base/NotCopied.h"
#include "platform/Date.h"

namespace platform {

/// The wall clock, which anybody may set forwards or backwards. May be called from any thread.
class Clock : private base::NotCopied {
  public:
    virtual ~Clock() = default;

    [[nodiscard]] virtual Date now() = 0;
};

} // namespace platform
