#pragma once

#include "keystrand-sim/Clock.h"
#include "keystrand-sim/NotificationPublisher.h"
#include "keystrand-sim/Registry.h"
#include "keystrand-sim/RestrictedModeTimer.h"

#include <functional>

namespace sim {

/// Joins the timer to the clock, to what the daemon asks and to what it is told. The registry and
/// the publisher outlive it.
class RestrictedModeController {
  public:
    using Seconds = RestrictedModeTimer::Seconds;
    /// Called whenever the next deadline or the clock may have changed.
    using Rearm = std::function<void()>;

    RestrictedModeController(RestrictedModeTimer::Periods periods, Clock clock,
                             const Registry& registry, NotificationPublisher& publisher);

    void setRearm(Rearm rearm);

    void lock();
    void unlock();
    void setAllowed(bool allowed);
    void setPasscodeSet(bool passcodeSet);
    void setBootArg(bool bootArg);

    /// A quiet model goes on as it does, but what it would publish on its own is dropped.
    void setQuiet(bool quiet) { quiet_ = quiet; }
    [[nodiscard]] bool quiet() const { return quiet_; }

    /// The daemon hands back what it kept. That is news only when it differs from what was last
    /// published and nothing newer is waiting to be read; otherwise what is known here stays. A
    /// state of zeros means that the daemon has none.
    void daemonStarted(bool allowed, const StateBytes& state);
    void restoreAnalytics(const AnalyticsBytes& blob);

    /// Moves the manual clock; everything due on the way happens at its own time.
    void setManualClock(Seconds time);
    void setRealClock();
    /// Does what became due on the clock.
    void catchUp();

    [[nodiscard]] const Clock& clock() const { return clock_; }
    [[nodiscard]] const RestrictedModeTimer& timer() const { return timer_; }

  private:
    void publish(const RestrictedModeTimer::Notifications& notifications);
    void setPolicy(const RestrictedModePolicy& policy);

    Clock clock_;
    RestrictedModeTimer timer_;
    const Registry& registry_;
    NotificationPublisher& publisher_;
    bool quiet_ = false;
    Rearm rearm_ = [] {
    };
};

} // namespace sim
