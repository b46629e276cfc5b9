#pragma once

#include "keystrand/Clock.h"

namespace keystrand::test {

/// Stands still where a test has set it.
class SetClock final : public Clock {
  public:
    explicit SetClock(Seconds start) : time(start) {}
    [[nodiscard]] Seconds now() const override { return time; }

    Seconds time;
};

} // namespace keystrand::test
