#pragma once

#include "base/NotCopied.h"
#include "keystrand/RestrictedModeTimer.h"

#include <algorithm>
#include <chrono>
#include <cstdint>

namespace keystrand {

/// The time that the model of the timer knows: seconds since 1970-01-01 UTC, always between 1 and
/// RestrictedModeTimer::kLatestTime.
class ModelClock : private base::NotCopied {
  public:
    using Seconds = RestrictedModeTimer::Seconds;

    virtual ~ModelClock() = default;

    [[nodiscard]] virtual Seconds now() const = 0;
};

/// The machine's date.
class DateClock : public ModelClock {
  public:
    [[nodiscard]] Seconds now() const override {
        using std::chrono::system_clock;
        const auto sinceEpoch = std::chrono::duration_cast<std::chrono::seconds>(
            system_clock::now().time_since_epoch());
        return static_cast<Seconds>(std::max<std::int64_t>(sinceEpoch.count(), 1));
    }
};

} // namespace keystrand
