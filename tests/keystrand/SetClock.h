#pragma once

#include "keystrand/ModelClock.h"

namespace keystrand::test {

/// Stands still where a test has set it.
class SetClock final : public ModelClock {
  public:
    explicit SetClock(Seconds start) : time(start) {}
    [[nodiscard]] Seconds now() const override { return time; }

    Seconds time;
};

} // namespace keystrand::test
