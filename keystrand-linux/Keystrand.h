#pragma once

#include "base/NotCopied.h"
#include "keystrand-linux/LockState.h"
#include "keystrand-linux/MachineClock.h"
#include "keystrand-linux/UsbGate.h"
#include "keystrand/Commands.h"
#include "keystrand/NotificationPublisher.h"
#include "keystrand/RestrictedModeController.h"

#include <cstdint>
#include <functional>
#include <optional>
#include <string>

namespace keystrand::usb {

/// What switches the policy off, beside the management.
struct PolicySwitches {
    /// The user who sits there, or who sat there last, has a password.
    bool passwordSet = true;
    /// The kernel's command line says that there is to be no restricted mode.
    bool bootArgument = false;

    bool operator==(const PolicySwitches&) const = default;
};

/// Keystrand for Linux without its sockets: the model of restricted mode, the lock state and the
/// clocks on one side, the gate on the other. The gate is closed while the machine is in restricted
/// mode, or asleep, or has just started and nobody knows yet.
///
/// Everything happens on one thread. What the parts refer to outlives it.
class Keystrand : private base::NotCopied {
  public:
    struct Settings {
        /// Seconds from locking to restricted mode.
        std::uint32_t period = 3600;
        GateRules rules = {};
    };

    struct Parts {
        KernelState& kernel;
        EventPoster& events;
        const MachineClock& clock;
        LockState& lockState;
        UsbBus& bus;
        const StateFile& record;
        const StateFile& devices;
        GateLog& log;
        /// Asked whenever the lock state may have changed.
        std::function<PolicySwitches()> switches;
        /// Asks for the machine to sleep again.
        std::function<void()> sleepAgain;
        /// `nextWake` may be another time.
        std::function<void()> rearm;
    };

    Keystrand(Parts parts, const Settings& settings);

    /// Takes up what an earlier service has left, closes the gate, and listens. Once.
    void start();

    /// Command 26 of the kernel service.
    [[nodiscard]] const DispatchTable& kernelControls() const { return kernelControls_; }

    /// Does what is due.
    void wake();
    [[nodiscard]] BootTime nextWake() const;
    /// Somebody has set the date.
    void clockWasSet();

    /// Opens the gate for that long, whatever else holds; 0 ends it.
    void openFor(std::chrono::seconds time);

    struct Status {
        bool locked = true;
        bool starting = true;
        bool sleeping = false;
        bool restricted = false;
        bool closed = false;
        /// What is open all the same, in words for people.
        std::string gap = {};
        RestrictedModePolicy policy;
        /// Until restricted mode, none when no timer runs.
        std::optional<std::chrono::seconds> untilRestricted;
        /// Until the end of what an administrator has opened.
        std::optional<std::chrono::seconds> untilClosed;
    };
    [[nodiscard]] Status status() const;
    [[nodiscard]] UsbGate& gate() { return gate_; }

  private:
    /// How long a machine stays awake that only its alarm woke.
    static constexpr BootTime kAwakeForNothing = std::chrono::seconds(30);
    /// How long after its alarm a machine may be awake that the alarm has woken.
    static constexpr BootTime kLongestWaking = std::chrono::minutes(5);
    static constexpr RestrictedModeTimer::Seconds kPatience = 60;

    void said(LockState::Said said);
    void setLocked(bool locked);
    void goToSleep();
    void wakeUp();
    void stayAwake();
    void sleepAgain();
    void readSwitches();
    /// The gate as everything that is known wants it.
    void update();

    [[nodiscard]] StateBytes adapt(const StateBytes& handedBack);
    [[nodiscard]] AnalyticsBytes adapt(const AnalyticsBytes& handedBack) const;
    [[nodiscard]] bool publishes(const Notification& notification);
    void daemonStarted(const StateBytes& handedBack);
    void startIsOver();
    void tellUnacknowledged(const Registry::Record& record);
    [[nodiscard]] BootTime now() const { return parts_.clock.sinceStart(); }

    Parts parts_;
    std::uint32_t period_;
    CountedClock clock_;
    NotificationPublisher publisher_;
    RestrictedModeController model_;
    DispatchTable kernelControls_;
    UsbGate gate_;

    bool locked_ = true;
    bool sleeping_ = false;
    /// Of the sleep that began last; none when it was restricted already.
    std::optional<BootTime> alarmAt_;
    /// Neither a daemon nor an unlock has said yet what holds.
    bool starting_ = true;
    bool sawUnlock_ = false;
    bool daemonKnown_ = false;
    /// This start of the machine had a service before this one.
    bool hadService_ = false;
    bool droppedState_ = false;
    bool droppedFigures_ = false;
    bool wasSwitchedOff_ = false;
    std::optional<BootTime> openUntil_;
    /// Awake for the alarm alone: until when it is waited for somebody, and then for sleep.
    struct Alone {
        BootTime until;
        bool isAsked;
    };
    std::optional<Alone> alone_;
};

} // namespace keystrand::usb
