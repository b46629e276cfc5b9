#pragma once

#include "keystrand/NotificationRecord.h"

#include <cstdint>
#include <optional>
#include <vector>

namespace keystrand {

/// What may switch the policy off.
struct RestrictedModePolicy {
    bool allowed = true;
    bool passcodeSet = true;
    bool bootArg = false;

    [[nodiscard]] bool enabled() const { return allowed && passcodeSet && !bootArg; }
};

/// The restricted-mode timer: a device that has been locked for `period` seconds goes into
/// restricted mode until it is unlocked or the policy is switched off.
///
/// Pure: it is told the time (seconds since 1970-01-01 UTC, 1 to kLatestTime) and hands back the
/// notifications that follow, oldest first. Every operation first does what became due until its
/// time. A time before one already seen fires nothing.
class RestrictedModeTimer {
  public:
    using Seconds = std::uint64_t;
    using Notifications = std::vector<Notification>;

    static constexpr Seconds kLatestTime = Seconds{1} << 53U;
    static constexpr std::uint32_t kStateVersion = 1;
    /// More analytics periods than this that end in one step are collected as one long period.
    static constexpr Seconds kMaxPeriodsAtOnce = 1000;

    struct Periods {
        /// With 0 a device that is locked is in restricted mode at once.
        std::uint32_t untilRestricted = 3600;
        /// At least 1 second.
        std::uint32_t analytics = 86400;
    };

    RestrictedModeTimer(Periods periods, Seconds now);

    /// Starts the timer. Nothing on a locked device.
    [[nodiscard]] Notifications lock(Seconds now);
    /// Stops the timer, ends restricted mode. Nothing on an unlocked device.
    [[nodiscard]] Notifications unlock(Seconds now);
    [[nodiscard]] Notifications setPolicy(Seconds now, const RestrictedModePolicy& policy);

    /// Takes over a saved state together with whether restricted mode is allowed: a start time or
    /// the restricted flag means a locked device.
    [[nodiscard]] Notifications restoreState(Seconds now, bool allowed, const TimerState& state);
    /// Takes over saved figures. They are left alone when they cannot be understood or lie in the
    /// future. A stay in restricted mode that had not ended goes on if the state that is restored
    /// next is restricted.
    [[nodiscard]] Notifications restoreAnalytics(Seconds now, const AnalyticsBytes& blob);

    /// The clock shows `seconds` more than it would have: all that is remembered by its time moves
    /// along, so that nothing becomes due earlier or later than it would have.
    [[nodiscard]] Notifications clockMoved(std::int64_t seconds);

    /// A time on a clock that shows so much more; it stays between 1 and kLatestTime.
    [[nodiscard]] static Seconds moved(Seconds time, std::int64_t seconds);

    /// Does everything that is due at `now`, each thing at its own time.
    [[nodiscard]] Notifications advance(Seconds now);
    /// The next time at which `advance` does something.
    [[nodiscard]] Seconds nextDeadline() const;

    [[nodiscard]] bool locked() const { return locked_; }
    [[nodiscard]] bool restricted() const { return restrictedSince_.has_value(); }
    [[nodiscard]] const RestrictedModePolicy& policy() const { return policy_; }
    [[nodiscard]] const Periods& periods() const { return periods_; }

    /// What a notification of each type says if it is made now.
    [[nodiscard]] TimerRestarted timerRestarted() const;
    [[nodiscard]] AnalyticsCollected analyticsCollected(Seconds now) const;
    [[nodiscard]] AnalyticsFigures figures() const;
    [[nodiscard]] std::uint32_t totalRestricted(Seconds now) const;

  private:
    [[nodiscard]] std::optional<Seconds> restrictionDeadline() const;
    [[nodiscard]] Seconds analyticsDeadline() const;
    [[nodiscard]] Seconds collectionTime(Seconds now) const;
    void doWhatIsDue(Seconds now, Notifications& notifications);
    void settle(Seconds at, Notifications& notifications);
    void announce(Notifications& notifications);
    void collect(Seconds at, Notifications& notifications);
    void endStay(Seconds at);
    void saveFigures(Notifications& notifications) const;
    [[nodiscard]] Seconds restrictedInPeriod(Seconds at) const;
    [[nodiscard]] Seconds totalAt(Seconds at) const;

    Periods periods_;
    RestrictedModePolicy policy_;
    bool locked_ = false;
    std::uint32_t version_ = kStateVersion;
    /// When standard mode's timer was started; 0 on an unlocked device.
    Seconds standardModeStart_ = 0;
    std::optional<Seconds> restrictedSince_;
    /// From restored figures: the stay that a restored restricted state continues.
    std::optional<Seconds> unfinishedStay_;
    Seconds periodStart_;
    Seconds endedStaysInPeriod_ = 0;
    Seconds endedStays_ = 0;
    TimerRestarted announced_;
};

} // namespace keystrand
