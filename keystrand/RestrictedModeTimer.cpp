#include "keystrand/RestrictedModeTimer.h"

#include "base/Saturate.h"

#include <algorithm>
#include <limits>

namespace keystrand {

namespace {

using Seconds = RestrictedModeTimer::Seconds;

Seconds later(Seconds time, Seconds delay) {
    constexpr Seconds kEnd = std::numeric_limits<Seconds>::max();
    return time > kEnd - delay ? kEnd : time + delay;
}

Seconds elapsed(Seconds from, Seconds until) {
    return until > from ? until - from : 0;
}

} // namespace

RestrictedModeTimer::RestrictedModeTimer(Periods periods, Seconds now)
    : periods_(periods), periodStart_(now), announced_(timerRestarted()) {}

RestrictedModeTimer::Notifications RestrictedModeTimer::lock(Seconds now) {
    Notifications notifications = advance(now);
    if (locked_) {
        return notifications;
    }
    locked_ = true;
    standardModeStart_ = now;
    endedStays_ = 0;
    settle(now, notifications);
    return notifications;
}

RestrictedModeTimer::Notifications RestrictedModeTimer::unlock(Seconds now) {
    Notifications notifications = advance(now);
    if (!locked_) {
        return notifications;
    }
    const bool wasRestricted = restricted();
    endStay(now);
    locked_ = false;
    standardModeStart_ = 0;
    notifications.push_back(makeTimerRestartedAnalytics(totalRestricted(now)));
    announce(notifications);
    if (wasRestricted) {
        saveFigures(notifications);
    }
    return notifications;
}

RestrictedModeTimer::Notifications
RestrictedModeTimer::setPolicy(Seconds now, const RestrictedModePolicy& policy) {
    Notifications notifications = advance(now);
    policy_ = policy;
    settle(now, notifications);
    return notifications;
}

RestrictedModeTimer::Notifications RestrictedModeTimer::restoreState(Seconds now, bool allowed,
                                                                     const TimerState& state) {
    Notifications notifications = advance(now);
    policy_.allowed = allowed;
    const bool inRestrictedMode = state.lockedInRestrictedMode != 0;
    version_ = state.version;
    standardModeStart_ = state.standardModeStart;
    locked_ = inRestrictedMode || state.standardModeStart != 0;
    if (!inRestrictedMode) {
        endStay(now);
    } else if (!restricted()) {
        restrictedSince_ = unfinishedStay_.value_or(now);
    }
    unfinishedStay_.reset();
    // The daemon knows this state; whether it still holds the alarm of a running timer is not
    // known, so such a timer is announced again.
    announced_ = timerRestarted();
    announced_.alarm = 0;
    settle(now, notifications);
    return notifications;
}

RestrictedModeTimer::Notifications
RestrictedModeTimer::restoreAnalytics(Seconds now, const AnalyticsBytes& blob) {
    Notifications notifications = advance(now);
    const auto saved = decodeFigures(blob);
    if (!saved || saved->periodStart == 0 || saved->periodStart > now ||
        saved->restrictedSince > now) {
        return notifications;
    }
    periodStart_ = saved->periodStart;
    endedStaysInPeriod_ = saved->restrictedInPeriod;
    endedStays_ = saved->totalRestricted;
    if (saved->restrictedSince != 0) {
        unfinishedStay_ = saved->restrictedSince;
    }
    doWhatIsDue(now, notifications);
    return notifications;
}

RestrictedModeTimer::Seconds RestrictedModeTimer::moved(Seconds time, std::int64_t seconds) {
    if (seconds < 0) {
        const Seconds back = Seconds{0} - static_cast<Seconds>(seconds);
        return time > back ? time - back : 1;
    }
    return std::min(later(time, static_cast<Seconds>(seconds)), kLatestTime);
}

RestrictedModeTimer::Notifications RestrictedModeTimer::clockMoved(std::int64_t seconds) {
    Notifications notifications;
    if (standardModeStart_ != 0) {
        standardModeStart_ = moved(standardModeStart_, seconds);
    }
    for (auto* const time : {&restrictedSince_, &unfinishedStay_}) {
        if (*time) {
            *time = moved(**time, seconds);
        }
    }
    periodStart_ = moved(periodStart_, seconds);
    if (timerRestarted() != announced_) {
        announce(notifications);
    }
    return notifications;
}

RestrictedModeTimer::Notifications RestrictedModeTimer::advance(Seconds now) {
    Notifications notifications;
    doWhatIsDue(now, notifications);
    return notifications;
}

void RestrictedModeTimer::doWhatIsDue(Seconds now, Notifications& notifications) {
    while (nextDeadline() <= now) {
        const auto restriction = restrictionDeadline();
        if (restriction && *restriction <= analyticsDeadline()) {
            settle(*restriction, notifications);
        } else {
            collect(collectionTime(now), notifications);
        }
    }
}

RestrictedModeTimer::Seconds RestrictedModeTimer::nextDeadline() const {
    return std::min(analyticsDeadline(),
                    restrictionDeadline().value_or(std::numeric_limits<Seconds>::max()));
}

TimerRestarted RestrictedModeTimer::timerRestarted() const {
    return {.alarm = restrictionDeadline().value_or(0),
            .state = {.version = version_,
                      .standardModeStart = standardModeStart_,
                      .lockedInRestrictedMode = static_cast<std::uint8_t>(restricted())}};
}

AnalyticsCollected RestrictedModeTimer::analyticsCollected(Seconds now) const {
    return {.eventPeriodDuration = base::saturate<std::uint32_t>(elapsed(periodStart_, now)),
            .restrictedModeDuration = base::saturate<std::uint32_t>(restrictedInPeriod(now)),
            .restrictedMode = static_cast<std::uint8_t>(restricted()),
            .policyDisabledByPasscodeNotSet = static_cast<std::uint8_t>(!policy_.passcodeSet),
            .policyDisabledByBootArg = static_cast<std::uint8_t>(policy_.bootArg),
            .policyDisabledByQuorvane = static_cast<std::uint8_t>(!policy_.allowed)};
}

AnalyticsFigures RestrictedModeTimer::figures() const {
    return {.periodStart = periodStart_,
            .restrictedInPeriod = base::saturate<std::uint32_t>(endedStaysInPeriod_),
            .totalRestricted = base::saturate<std::uint32_t>(endedStays_),
            .restrictedSince = restrictedSince_.value_or(0)};
}

std::uint32_t RestrictedModeTimer::totalRestricted(Seconds now) const {
    return base::saturate<std::uint32_t>(totalAt(now));
}

std::optional<Seconds> RestrictedModeTimer::restrictionDeadline() const {
    if (!locked_ || !policy_.enabled() || restricted()) {
        return std::nullopt;
    }
    return later(standardModeStart_, periods_.untilRestricted);
}

RestrictedModeTimer::Seconds RestrictedModeTimer::analyticsDeadline() const {
    return later(periodStart_, periods_.analytics);
}

RestrictedModeTimer::Seconds RestrictedModeTimer::collectionTime(Seconds now) const {
    if (elapsed(periodStart_, now) / periods_.analytics <= kMaxPeriodsAtOnce) {
        return analyticsDeadline();
    }
    return std::min(now, restrictionDeadline().value_or(now));
}

/// Brings restricted mode in line with lock, policy and time, and tells what changed.
void RestrictedModeTimer::settle(Seconds at, Notifications& notifications) {
    const bool wasRestricted = restricted();
    const auto deadline = restrictionDeadline();
    if (deadline && *deadline <= at) {
        restrictedSince_ = at;
    } else if (!locked_ || !policy_.enabled()) {
        endStay(at);
    }
    if (timerRestarted() != announced_) {
        announce(notifications);
    }
    if (restricted() != wasRestricted) {
        saveFigures(notifications);
    }
}

void RestrictedModeTimer::announce(Notifications& notifications) {
    announced_ = timerRestarted();
    notifications.push_back(makeTimerRestarted(announced_));
}

void RestrictedModeTimer::collect(Seconds at, Notifications& notifications) {
    notifications.push_back(makeAnalyticsCollected(analyticsCollected(at)));
    periodStart_ = at;
    endedStaysInPeriod_ = 0;
    saveFigures(notifications);
}

void RestrictedModeTimer::endStay(Seconds at) {
    endedStaysInPeriod_ = restrictedInPeriod(at);
    endedStays_ = totalAt(at);
    restrictedSince_.reset();
}

void RestrictedModeTimer::saveFigures(Notifications& notifications) const {
    notifications.push_back(makeSaveAnalytics(encodeFigures(figures())));
}

RestrictedModeTimer::Seconds RestrictedModeTimer::restrictedInPeriod(Seconds at) const {
    if (!restrictedSince_) {
        return endedStaysInPeriod_;
    }
    return later(endedStaysInPeriod_, elapsed(std::max(*restrictedSince_, periodStart_), at));
}

RestrictedModeTimer::Seconds RestrictedModeTimer::totalAt(Seconds at) const {
    if (!restrictedSince_) {
        return endedStays_;
    }
    return later(endedStays_, elapsed(*restrictedSince_, at));
}

} // namespace keystrand
