#pragma once

#include "base/NotCopied.h"
#include "keystrand-linux/GatePolicy.h"
#include "keystrand/ModelClock.h"

#include <algorithm>
#include <cstdint>

namespace keystrand::usb {

/// The two clocks of a machine.
class MachineClock : private base::NotCopied {
  public:
    virtual ~MachineClock() = default;

    /// Sleep included; nobody can set it.
    [[nodiscard]] virtual BootTime sinceStart() const = 0;
    /// Seconds since 1970-01-01 UTC, which somebody may set.
    [[nodiscard]] virtual std::int64_t wall() const = 0;
};

/// The model's clock: the date at which it began, counted on by the time since the machine's start,
/// so that nobody shortens the period by setting the date.
class CountedClock : public ModelClock {
  public:
    /// The machine's clock outlives it.
    explicit CountedClock(const MachineClock& machine) : machine_(machine), offset_(offsetNow()) {}

    [[nodiscard]] Seconds now() const override { return clamped(offset_ + secondsSinceStart()); }

    /// How far the date is ahead of what this clock shows, because it was set.
    [[nodiscard]] std::int64_t behind() const { return offsetNow() - offset_; }
    /// From now on it shows the date.
    void catchUp() { offset_ = offsetNow(); }

    /// When this clock will show that time, at the earliest.
    [[nodiscard]] BootTime whenIs(Seconds time) const {
        constexpr std::int64_t kFar = std::int64_t{1} << 40U;
        const auto at = static_cast<std::int64_t>(std::min(time, RestrictedModeTimer::kLatestTime));
        return std::chrono::seconds(std::clamp<std::int64_t>(at - offset_, 0, kFar));
    }

  private:
    [[nodiscard]] std::int64_t secondsSinceStart() const {
        return std::chrono::duration_cast<std::chrono::seconds>(machine_.sinceStart()).count();
    }
    [[nodiscard]] std::int64_t offsetNow() const { return machine_.wall() - secondsSinceStart(); }
    [[nodiscard]] static Seconds clamped(std::int64_t time) {
        constexpr auto kLatest = static_cast<std::int64_t>(RestrictedModeTimer::kLatestTime);
        return static_cast<Seconds>(std::clamp<std::int64_t>(time, 1, kLatest));
    }

    const MachineClock& machine_;
    std::int64_t offset_;
};

} // namespace keystrand::usb
