#include "keystrand-linux/Keystrand.h"

#include "base/Concat.h"
#include "wire/RestrictedMode.h"

#include <algorithm>
#include <utility>

namespace keystrand::usb {

namespace {

constexpr BootTime kNever = BootTime::max();

/// An ended time is none.
std::optional<std::chrono::seconds> timeUntil(BootTime end, BootTime now) {
    return end > now ? std::optional(std::chrono::ceil<std::chrono::seconds>(end - now))
                     : std::nullopt;
}

} // namespace

Keystrand::Keystrand(Parts parts, const Settings& settings)
    : parts_(std::move(parts)),
      period_(settings.period),
      clock_(parts_.clock),
      publisher_(parts_.kernel.registry, parts_.events),
      model_({.untilRestricted = settings.period}, clock_, parts_.kernel.registry, publisher_),
      kernelControls_(makeKernelControls(model_)),
      gate_({.bus = parts_.bus,
             .record = parts_.record,
             .devices = parts_.devices,
             .log = parts_.log,
             .now = [this] { return now(); },
             .rearm =
                 [this] {
                     parts_.rearm();
                 }},
            settings.rules) {}

void Keystrand::start() {
    const auto record = gate_.resume();
    hadService_ = record && !record->service.starting;
    openUntil_ = record ? record->service.openUntil : std::nullopt;
    RestrictedModeController::Hooks hooks;
    hooks.rearm = [this] {
        parts_.rearm();
    };
    hooks.restrictedModeChanged = [this](bool) {
        update();
    };
    hooks.adaptState = [this](const StateBytes& state) {
        return adapt(state);
    };
    hooks.adaptFigures = [this](const AnalyticsBytes& figures) {
        return adapt(figures);
    };
    hooks.publishes = [this](const Notification& notification) {
        return publishes(notification);
    };
    hooks.daemonStarted = [this](bool, const StateBytes& state) {
        daemonStarted(state);
    };
    hooks.unacknowledged = [this](const Registry::Record& waited) {
        tellUnacknowledged(waited);
    };
    hooks.patience = kPatience;
    model_.setHooks(std::move(hooks));
    readSwitches();
    // Nobody has logged in yet, as far as is known.
    model_.lock();
    update();
    parts_.lockState.listen([this](LockState::Said what) { said(what); });
}

void Keystrand::said(LockState::Said said) {
    const bool isAlone = std::exchange(alone_, std::nullopt).has_value();
    switch (said) {
    case LockState::Said::locked:
        setLocked(true);
        break;
    case LockState::Said::unlocked:
        setLocked(false);
        break;
    case LockState::Said::goingToSleep:
        goToSleep();
        break;
    case LockState::Said::awake:
        wakeUp();
        break;
    case LockState::Said::away:
        // Whoever listens has told it.
        parts_.log.write(
            GateLine::listenerAway,
            base::concat("keystrand: nobody tells whether the machine is locked; it counts as ",
                         locked_ ? "locked" : "unlocked, for a minute"));
        break;
    }
    if (isAlone) {
        stayAwake();
    }
    parts_.rearm();
}

void Keystrand::setLocked(bool locked) {
    if (locked_ != locked) {
        parts_.log.write(GateLine::lockState, locked ? "keystrand: the machine is locked"
                                                     : "keystrand: the machine is unlocked");
    }
    locked_ = locked;
    readSwitches();
    if (locked) {
        model_.lock();
    } else if (!sleeping_) {
        sawUnlock_ = true;
        startIsOver();
        model_.unlock();
    }
    update();
}

void Keystrand::goToSleep() {
    model_.lock();
    if (!std::exchange(sleeping_, true)) {
        const std::uint64_t alarm = model_.timer().timerRestarted().alarm;
        alarmAt_ = alarm != 0 ? std::optional(clock_.whenIs(alarm)) : std::nullopt;
    }
    update();
    parts_.lockState.closed();
}

void Keystrand::wakeUp() {
    if (!std::exchange(sleeping_, false)) {
        return;
    }
    // Later than that somebody has woken a machine that its alarm could not wake.
    const bool wokeForAlarm = alarmAt_ && *alarmAt_ <= now() && now() <= *alarmAt_ + kLongestWaking;
    clockWasSet();
    if (!locked_ && !wokeForAlarm) {
        setLocked(false);
        return;
    }
    model_.catchUp();
    update();
    if (wokeForAlarm) {
        // Nobody needs it awake. Where nobody has locked it either, it is not unlocked for that
        // while: its next sleep would begin another period, with another alarm.
        alone_ = Alone{.until = now() + kAwakeForNothing, .isAsked = false};
    }
}

/// Whatever was waited for, there is somebody.
void Keystrand::stayAwake() {
    if (!locked_ && !sleeping_) {
        setLocked(false);
    }
}

void Keystrand::sleepAgain() {
    const bool isAsked = alone_->isAsked;
    alone_.reset();
    if (isAsked) {
        stayAwake();
        return;
    }
    parts_.log.write(GateLine::lockState, "keystrand: the machine woke for the end of the period "
                                          "alone and is asked to sleep again");
    parts_.sleepAgain();
    alone_ = Alone{.until = now() + kAwakeForNothing, .isAsked = true};
}

void Keystrand::readSwitches() {
    const PolicySwitches switches = parts_.switches();
    const RestrictedModePolicy before = model_.timer().policy();
    if (before.passcodeSet != switches.passwordSet) {
        model_.setPasscodeSet(switches.passwordSet);
    }
    if (before.bootArg != switches.bootArgument) {
        model_.setBootArg(switches.bootArgument);
    }
}

void Keystrand::update() {
    const RestrictedModePolicy& policy = model_.timer().policy();
    if (std::exchange(wasSwitchedOff_, !policy.enabled()) != wasSwitchedOff_) {
        parts_.log.write(GateLine::policyOff,
                         base::concat("keystrand: restricted mode is ",
                                      policy.enabled()  ? "in force again"
                                      : !policy.allowed ? "switched off by the management"
                                      : !policy.passcodeSet
                                          ? "switched off: the user has no password"
                                          : "switched off by the kernel's command line"));
    }
    const bool wanted = starting_ || sleeping_ || model_.timer().restricted();
    gate_.remember({.restricted = model_.timer().restricted(),
                    .starting = starting_,
                    .openUntil = openUntil_});
    // What is attached is looked at when the gate is closed.
    const bool locked = locked_ || sleeping_;
    if (!locked) {
        gate_.setLocked(false);
    }
    gate_.setClosed(wanted && policy.enabled() && !openUntil_);
    if (locked) {
        gate_.setLocked(true);
    }
    parts_.rearm();
}

void Keystrand::wake() {
    const BootTime present = now();
    model_.catchUp();
    if (openUntil_ && *openUntil_ <= present) {
        openUntil_.reset();
        parts_.log.write(GateLine::administrator,
                         "keystrand: the time for which the gate was opened is over");
        update();
    }
    if (gate_.nextLook().value_or(kNever) <= present) {
        gate_.look();
    }
    if (alone_ && alone_->until <= present) {
        sleepAgain();
    }
    parts_.rearm();
}

BootTime Keystrand::nextWake() const {
    return std::min({clock_.whenIs(model_.nextDeadline()), gate_.nextLook().value_or(kNever),
                     openUntil_.value_or(kNever), alone_ ? alone_->until : kNever});
}

void Keystrand::clockWasSet() {
    // What is due by the time that was counted comes first.
    model_.catchUp();
    const std::int64_t behind = clock_.behind();
    // The two clocks are not read at the same moment.
    if (behind < -1 || behind > 1) {
        clock_.catchUp();
        model_.clockMoved(behind);
        parts_.log.write(GateLine::clock, base::concat("keystrand: the date was moved by ",
                                                       std::to_string(behind), " seconds"));
    }
}

void Keystrand::openFor(std::chrono::seconds time) {
    if (std::exchange(alone_, std::nullopt)) {
        stayAwake();
    }
    if (time.count() == 0 && !openUntil_) {
        return;
    }
    openUntil_ = time.count() == 0 ? std::nullopt : std::optional(now() + BootTime(time));
    parts_.log.write(
        GateLine::administrator,
        time.count() == 0
            ? std::string(
                  "keystrand: an administrator has ended the time for which the gate was opened")
            : base::concat("keystrand: an administrator has opened the gate for ",
                           std::to_string(time.count()), " seconds"));
    update();
}

Keystrand::Status Keystrand::status() const {
    const RestrictedModeTimer& timer = model_.timer();
    const std::uint64_t alarm = timer.timerRestarted().alarm;
    return {.locked = locked_,
            .starting = starting_,
            .sleeping = sleeping_,
            .restricted = timer.restricted(),
            .closed = gate_.closed(),
            .gap = gate_.gap(),
            .policy = timer.policy(),
            .untilRestricted = alarm != 0 ? timeUntil(clock_.whenIs(alarm), now()) : std::nullopt,
            .untilClosed = openUntil_ ? timeUntil(*openUntil_, now()) : std::nullopt};
}

/// Of what the first daemon hands back the start of the timer and the flag count, and only while
/// nobody has unlocked since this service knows.
StateBytes Keystrand::adapt(const StateBytes& handedBack) {
    if (daemonKnown_ || sawUnlock_) {
        return {};
    }
    TimerState state = decodeState(handedBack);
    state.version = RestrictedModeTimer::kStateVersion;
    state.lockedInRestrictedMode = state.lockedInRestrictedMode != 0 ? 1 : 0;
    const RestrictedModeTimer::Seconds present = clock_.now();
    if (state.standardModeStart == 0) {
        state.standardModeStart = present;
    } else if (state.standardModeStart > present) {
        // The date was set back meanwhile; whoever did that gains nothing by it.
        state.standardModeStart = present > period_ ? present - period_ : 1;
        state.lockedInRestrictedMode = 1;
    }
    return encodeState(state);
}

/// Figures that were begun later than now are kept; the stay that had not ended has.
AnalyticsBytes Keystrand::adapt(const AnalyticsBytes& handedBack) const {
    auto figures = decodeFigures(handedBack);
    const RestrictedModeTimer::Seconds present = clock_.now();
    if (!figures || (figures->periodStart <= present && figures->restrictedSince <= present)) {
        return handedBack;
    }
    figures->periodStart = std::min(figures->periodStart, present);
    figures->restrictedSince = 0;
    return encodeFigures(*figures);
}

/// Until a daemon has said what it kept, nothing may take its place.
bool Keystrand::publishes(const Notification& notification) {
    if (daemonKnown_) {
        return true;
    }
    droppedState_ =
        droppedState_ || notification.type == wire::rm::kKSTRMNotificationTimerRestarted;
    droppedFigures_ =
        droppedFigures_ || notification.type == wire::rm::kKSTRMNotificationSaveAnalytics;
    return notification.type == wire::rm::kKSTRMNotificationAnalyticsCollected;
}

void Keystrand::daemonStarted(const StateBytes& handedBack) {
    if (std::exchange(daemonKnown_, true)) {
        update();
        return;
    }
    const bool restricted = model_.timer().restricted() && model_.timer().policy().enabled();
    if (starting_ && restricted && !hadService_) {
        gate_.keepOnlyKnown();
    }
    startIsOver();
    if (encodeState(model_.timer().timerRestarted().state) != handedBack || droppedState_) {
        model_.announceState();
    }
    if (droppedFigures_) {
        model_.announceFigures();
    }
    update();
}

void Keystrand::startIsOver() {
    if (std::exchange(starting_, false)) {
        gate_.keepDevices();
    }
}

void Keystrand::tellUnacknowledged(const Registry::Record& record) {
    if (record.name == wire::rm::kTimerRestartedProperty) {
        parts_.log.write(GateLine::unacknowledged,
                         "keystrand: the state was not taken over for a minute: is kstd there?");
    }
}

} // namespace keystrand::usb
