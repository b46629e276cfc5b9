#pragma once

#include "keystrand/Clock.h"

#include <optional>

namespace keystrand::sim {

/// The system's clock, until it is set by hand: then it stands still where it was set.
class ManualClock final : public SystemClock {
  public:
    explicit ManualClock(std::optional<Seconds> manual) : manual_(manual) {}

    [[nodiscard]] bool isManual() const { return manual_.has_value(); }
    [[nodiscard]] Seconds now() const override { return manual_ ? *manual_ : SystemClock::now(); }
    void set(Seconds time) { manual_ = time; }
    void setReal() { manual_.reset(); }

  private:
    std::optional<Seconds> manual_;
};

} // namespace keystrand::sim
