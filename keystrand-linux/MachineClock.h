#pragma once

#include "base/NotCopied.h"
#include "keystrand-linux/GatePolicy.h"
#include "keystrand/ModelClock.h"

#include <algorithm>
#include <chrono>
#include <cstdint>

namespace keystrand::usb {

/// The two clocks of a machine.
class MachineClock : private base::NotCopied {
  public:
    virtual ~MachineClock() = default;

    /// Sleep included; nobody can set it.
    [[nodiscard]] virtual BootTime sinceStart() const = 0;
    /// Since 1970-01-01 UTC; somebody may set it.
    [[nodiscard]] virtual std::chrono::microseconds wall() const = 0;
};

/// The model's clock: the date at which it began, counted on by the time since the machine's start,
/// so that nobody shortens the period by setting the date. Its seconds begin with the date's: what
/// is due by it is not due before an alarm of the same date.
class CountedClock : public ModelClock {
  public:
    /// The machine's clock outlives it.
    explicit CountedClock(const MachineClock& machine) : machine_(machine), offset_(offsetNow()) {}

    [[nodiscard]] Seconds now() const override {
        return clamped(
            std::chrono::floor<std::chrono::seconds>(offset_ + machine_.sinceStart()).count());
    }

    /// How many seconds the date is ahead of what this clock shows, because it was set.
    [[nodiscard]] std::int64_t behind() const {
        return std::chrono::round<std::chrono::seconds>(offsetNow() - offset_).count();
    }
    /// From now on it shows the date.
    void catchUp() { offset_ = offsetNow(); }

    /// When this clock will show that time, at the earliest.
    [[nodiscard]] BootTime whenIs(Seconds time) const {
        constexpr BootTime kFar = std::chrono::seconds(std::int64_t{1} << 40U);
        const auto at = static_cast<std::int64_t>(std::min(time, RestrictedModeTimer::kLatestTime));
        return std::clamp<BootTime>(std::chrono::seconds(at) - offset_, BootTime(0), kFar);
    }

  private:
    [[nodiscard]] std::chrono::microseconds offsetNow() const {
        return machine_.wall() - machine_.sinceStart();
    }
    [[nodiscard]] static Seconds clamped(std::int64_t time) {
        constexpr auto kLatest = static_cast<std::int64_t>(RestrictedModeTimer::kLatestTime);
        return static_cast<Seconds>(std::clamp<std::int64_t>(time, 1, kLatest));
    }

    const MachineClock& machine_;
    std::chrono::microseconds offset_;
};

} // namespace keystrand::usb
