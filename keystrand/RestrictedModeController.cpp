#include "keystrand/RestrictedModeController.h"

#include <algorithm>
#include <utility>

namespace keystrand {

namespace {

/// Whether bytes that come back from the daemon are newer than what is known here.
template <typename Bytes>
bool isNews(const Bytes& handedBack, const std::optional<Bytes>& lastPublished,
            const Registry& registry, const char* property) {
    return handedBack != lastPublished && registry.find(property) == nullptr;
}

template <typename Hook, typename... Arguments>
void call(const Hook& hook, const Arguments&... arguments) {
    if (hook) {
        hook(arguments...);
    }
}

} // namespace

RestrictedModeController::RestrictedModeController(RestrictedModeTimer::Periods periods,
                                                   const ModelClock& clock, Registry& registry,
                                                   NotificationPublisher& publisher)
    : clock_(clock), timer_(periods, clock.now()), registry_(registry), publisher_(publisher) {}

void RestrictedModeController::setHooks(Hooks hooks) {
    hooks_ = std::move(hooks);
    call(hooks_.rearm);
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
    takeUp(allowed, hooks_.adaptState ? hooks_.adaptState(state) : state);
    call(hooks_.daemonStarted, allowed, state);
    return [this, unacknowledged = std::move(unacknowledged)] {
        publisher_.postAgain(unacknowledged);
        for (const Record& record : unacknowledged) {
            awaitAcknowledgement(record.name);
        }
        announceAlarmAgain();
        call(hooks_.rearm);
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

void RestrictedModeController::restoreAnalytics(const AnalyticsBytes& handedBack) {
    const AnalyticsBytes blob = hooks_.adaptFigures ? hooks_.adaptFigures(handedBack) : handedBack;
    if (isNews(blob, publisher_.lastAnalytics(), registry_, wire::rm::kSaveAnalyticsProperty)) {
        publish(timer_.restoreAnalytics(clock_.now(), blob));
    }
}

void RestrictedModeController::announceState() {
    publish({makeTimerRestarted(timer_.timerRestarted())});
}

void RestrictedModeController::announceFigures() {
    publish({makeSaveAnalytics(encodeFigures(timer_.figures()))});
}

void RestrictedModeController::clockMoved(std::int64_t seconds) {
    for (auto& [property, awaited] : awaited_) {
        awaited.until = RestrictedModeTimer::moved(awaited.until, seconds);
    }
    publish(timer_.clockMoved(seconds));
}

void RestrictedModeController::acknowledge(std::string_view name) {
    const auto dropped = registry_.acknowledge(name);
    if (!dropped) {
        return;
    }
    awaited_.erase(dropped->name);
    call(hooks_.acknowledged, *dropped);
    call(hooks_.rearm);
}

void RestrictedModeController::catchUp() {
    tellWhatIsUnacknowledged();
    publish(timer_.advance(clock_.now()));
}

RestrictedModeController::Seconds RestrictedModeController::nextDeadline() const {
    Seconds next = timer_.nextDeadline();
    for (const auto& [property, awaited] : awaited_) {
        next = std::min(next, awaited.until);
    }
    return next;
}

void RestrictedModeController::publish(const RestrictedModeTimer::Notifications& notifications) {
    // Whoever reads a record that restricted mode has begun finds it in force.
    if (timer_.restricted() != toldRestricted_) {
        toldRestricted_ = timer_.restricted();
        call(hooks_.restrictedModeChanged, toldRestricted_);
    }
    if (!quiet_) {
        for (const Notification& notification : notifications) {
            if (hooks_.publishes && !hooks_.publishes(notification)) {
                continue;
            }
            publisher_.publish(notification);
            awaitAcknowledgement(wire::rm::findNotificationKind(notification.type)->property);
        }
    }
    call(hooks_.rearm);
}

void RestrictedModeController::awaitAcknowledgement(const std::string& property) {
    const Registry::Property* record = registry_.find(property);
    if (record == nullptr || hooks_.patience == kForever) {
        return;
    }
    const Seconds now = clock_.now();
    const Seconds until = hooks_.patience < kForever - now ? now + hooks_.patience : kForever;
    awaited_.insert_or_assign(property, Awaited{.generation = record->generation, .until = until});
}

void RestrictedModeController::tellWhatIsUnacknowledged() {
    const Seconds now = clock_.now();
    for (auto it = awaited_.begin(); it != awaited_.end();) {
        if (it->second.until > now) {
            ++it;
            continue;
        }
        const auto waited = awaited_.extract(it++);
        const Record record{.name = waited.key(), .generation = waited.mapped().generation};
        // What was put in its place by others than the model is not waited for.
        const Registry::Property* present = registry_.find(record.name);
        if (present != nullptr && present->generation == record.generation) {
            call(hooks_.unacknowledged, record);
        }
    }
}

void RestrictedModeController::setPolicy(const RestrictedModePolicy& policy) {
    publish(timer_.setPolicy(clock_.now(), policy));
}

} // namespace keystrand
