#pragma once

#include "keystrand-sim/RestrictedModeTimer.h"

#include <algorithm>
#include <chrono>
#include <cstdint>
#include <optional>

namespace sim {

/// The time in whole seconds since 1970-01-01 UTC: the system's, or one that is moved by hand.
/// Always between 1 and RestrictedModeTimer::kLatestTime.
class Clock {
  public:
    using Seconds = RestrictedModeTimer::Seconds;

    Clock() = default;
    explicit Clock(std::optional<Seconds> manual) : manual_(manual) {}

    [[nodiscard]] bool isManual() const { return manual_.has_value(); }

    [[nodiscard]] Seconds now() const {
        using std::chrono::system_clock;
        if (manual_) {
            return *manual_;
        }
        const auto sinceEpoch = std::chrono::duration_cast<std::chrono::seconds>(
            system_clock::now().time_since_epoch());
        return static_cast<Seconds>(std::max<std::int64_t>(sinceEpoch.count(), 1));
    }

    void setManual(Seconds time) { manual_ = time; }
    void setReal() { manual_.reset(); }

  private:
    std::optional<Seconds> manual_;
};

} // namespace sim
