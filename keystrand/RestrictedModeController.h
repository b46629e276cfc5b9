#pragma once

#include "keystrand/Clock.h"
#include "keystrand/NotificationPublisher.h"
#include "keystrand/Registry.h"
#include "keystrand/RestrictedModeTimer.h"

#include <functional>

namespace keystrand {

/// Joins the timer to the clock, to what the daemon asks and to what it is told. The clock, the
/// registry and the publisher outlive it.
class RestrictedModeController {
  public:
    using Seconds = RestrictedModeTimer::Seconds;
    /// Called whenever the next deadline or the clock may have changed.
    using Rearm = std::function<void()>;

    RestrictedModeController(RestrictedModeTimer::Periods periods, const Clock& clock,
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
    ///
    /// What is returned is to be called when the daemon has its reply: it posts the events of the
    /// records that an earlier daemon has left unacknowledged.
    [[nodiscard]] std::function<void()> daemonStarted(bool allowed, const StateBytes& state);
    void restoreAnalytics(const AnalyticsBytes& blob);

    /// Does what became due on the clock, each thing at its own time.
    void catchUp();

    [[nodiscard]] const RestrictedModeTimer& timer() const { return timer_; }

  private:
    void takeUp(bool allowed, const StateBytes& state);
    void announceAlarmAgain();
    void publish(const RestrictedModeTimer::Notifications& notifications);
    void setPolicy(const RestrictedModePolicy& policy);

    const Clock& clock_;
    RestrictedModeTimer timer_;
    const Registry& registry_;
    NotificationPublisher& publisher_;
    bool quiet_ = false;
    Rearm rearm_ = [] {
    };
};

} // namespace keystrand
