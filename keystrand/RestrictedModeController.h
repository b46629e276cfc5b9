#pragma once

#include "keystrand/ModelClock.h"
#include "keystrand/NotificationPublisher.h"
#include "keystrand/Registry.h"
#include "keystrand/RestrictedModeTimer.h"

#include <cstdint>
#include <functional>
#include <limits>
#include <map>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

namespace keystrand {

/// Joins the timer to the clock, to what the daemon asks and to what it is told. The clock, the
/// registry and the publisher outlive it.
class RestrictedModeController {
  public:
    using Seconds = RestrictedModeTimer::Seconds;
    using Record = Registry::Record;
    static constexpr Seconds kForever = std::numeric_limits<Seconds>::max();

    /// What the program wants to be told; null for nothing. None of them changes the model.
    struct Hooks {
        /// The next deadline or the clock may have changed.
        std::function<void()> rearm = nullptr;
        /// Restricted mode was entered or left; no record says so yet. A stay that begins and ends
        /// in one step is none.
        std::function<void(bool restricted)> restrictedModeChanged = nullptr;
        /// A daemon has started and handed back what it kept. The model has taken up what of it is
        /// news, and the daemon has no reply yet.
        std::function<void(bool allowed, const StateBytes& state)> daemonStarted = nullptr;
        /// A record was acknowledged and is gone.
        std::function<void(const Record& record)> acknowledged = nullptr;
        /// A record of the model has waited for `patience` seconds since it was published, or since
        /// a daemon that started was told again. Once for each time.
        std::function<void(const Record& record)> unacknowledged = nullptr;
        Seconds patience = kForever;
        /// What is taken up of a state, or of figures, that a daemon hands back; as it is without.
        std::function<StateBytes(const StateBytes& handedBack)> adaptState = nullptr;
        std::function<AnalyticsBytes(const AnalyticsBytes& handedBack)> adaptFigures = nullptr;
        /// Whether a record is published; each is without.
        std::function<bool(const Notification& notification)> publishes = nullptr;
    };

    RestrictedModeController(RestrictedModeTimer::Periods periods, const ModelClock& clock,
                             Registry& registry, NotificationPublisher& publisher);

    /// Calls the new `rearm`, and no other of them.
    void setHooks(Hooks hooks);

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

    /// Drops the record that the name stands for if it was read; nothing otherwise.
    void acknowledge(std::string_view name);

    /// Publishes the present state, or the present figures, whatever was published before.
    void announceState();
    void announceFigures();

    /// The clock shows `seconds` more than it would if nobody had set it: what is counted goes on
    /// from where it was, and a running timer's alarm has another date.
    void clockMoved(std::int64_t seconds);

    /// Does what became due on the clock, each thing at its own time.
    void catchUp();
    /// The next time on the clock at which `catchUp` does something.
    [[nodiscard]] Seconds nextDeadline() const;

    [[nodiscard]] const RestrictedModeTimer& timer() const { return timer_; }

  private:
    void takeUp(bool allowed, const StateBytes& state);
    void announceAlarmAgain();
    void publish(const RestrictedModeTimer::Notifications& notifications);
    void setPolicy(const RestrictedModePolicy& policy);
    void awaitAcknowledgement(const std::string& property);
    void tellWhatIsUnacknowledged();

    /// A record whose acknowledgement is waited for.
    struct Awaited {
        std::uint64_t generation = 0;
        Seconds until = 0;
    };

    const ModelClock& clock_;
    RestrictedModeTimer timer_;
    Registry& registry_;
    NotificationPublisher& publisher_;
    bool quiet_ = false;
    Hooks hooks_;
    bool toldRestricted_ = false;
    /// By their properties.
    std::map<std::string, Awaited> awaited_;
};

} // namespace keystrand
