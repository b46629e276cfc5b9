#include "keystrand/RestrictedModeController.h"

#include <utility>

namespace keystrand {

namespace {

/// Whether bytes that come back from the daemon are newer than what is known here.
template <typename Bytes>
bool isNews(const Bytes& handedBack, const std::optional<Bytes>& lastPublished,
            const Registry& registry, const char* property) {
    return handedBack != lastPublished && registry.find(property) == nullptr;
}

} // namespace

RestrictedModeController::RestrictedModeController(RestrictedModeTimer::Periods periods,
                                                   const Clock& clock, const Registry& registry,
                                                   NotificationPublisher& publisher)
    : clock_(clock), timer_(periods, clock.now()), registry_(registry), publisher_(publisher) {}

void RestrictedModeController::setRearm(Rearm rearm) {
    rearm_ = std::move(rearm);
    rearm_();
}

void RestrictedModeController::lock() {
    publish(timer_.lock(clock_.now()));
}

void RestrictedModeController::unlock() {
    publish(timer_.unlock(clock_.now()));
}

void RestrictedModeController::setAllowed(bool allowed) {
    RestrictedModePolicy policy = timer_.policy();
    policy.allowed = allowed;
    setPolicy(policy);
}

void RestrictedModeController::setPasscodeSet(bool passcodeSet) {
    RestrictedModePolicy policy = timer_.policy();
    policy.passcodeSet = passcodeSet;
    setPolicy(policy);
}

void RestrictedModeController::setBootArg(bool bootArg) {
    RestrictedModePolicy policy = timer_.policy();
    policy.bootArg = bootArg;
    setPolicy(policy);
}

std::function<void()> RestrictedModeController::daemonStarted(bool allowed,
                                                              const StateBytes& state) {
    // What is published from here on has its event already.
    auto unacknowledged = publisher_.unacknowledged();
    takeUp(allowed, state);
    return [this, unacknowledged = std::move(unacknowledged)] {
        publisher_.postAgain(unacknowledged);
        announceAlarmAgain();
    };
}

void RestrictedModeController::announceAlarmAgain() {
    // What was acknowledged may be lost all the same: an alarm that did not get onto disk goes with
    // the daemon.
    const TimerRestarted record = timer_.timerRestarted();
    if (record.alarm != 0 && registry_.find(wire::rm::kTimerRestartedProperty) == nullptr) {
        publish({makeTimerRestarted(record)});
    }
}

void RestrictedModeController::takeUp(bool allowed, const StateBytes& state) {
    if (state == StateBytes{} ||
        !isNews(state, publisher_.lastState(), registry_, wire::rm::kTimerRestartedProperty)) {
        setAllowed(allowed);
        return;
    }
    publish(timer_.restoreState(clock_.now(), allowed, decodeState(state)));
}

void RestrictedModeController::restoreAnalytics(const AnalyticsBytes& blob) {
    if (isNews(blob, publisher_.lastAnalytics(), registry_, wire::rm::kSaveAnalyticsProperty)) {
        publish(timer_.restoreAnalytics(clock_.now(), blob));
    }
}

void RestrictedModeController::catchUp() {
    publish(timer_.advance(clock_.now()));
}

void RestrictedModeController::publish(const RestrictedModeTimer::Notifications& notifications) {
    if (!quiet_) {
        for (const Notification& notification : notifications) {
            publisher_.publish(notification);
        }
    }
    rearm_();
}

void RestrictedModeController::setPolicy(const RestrictedModePolicy& policy) {
    publish(timer_.setPolicy(clock_.now(), policy));
}

} // namespace keystrand
