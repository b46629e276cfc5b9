#include "platform/linux/SystemdAlarmWaker.h"

#include "base/Concat.h"

#include <algorithm>
#include <time.h>
#include <utility>

namespace platform {

namespace {

constexpr std::int64_t kOneMicrosecondInNanoseconds = 1000;

/// Rounded up, so that the alarm is due when the timer elapses.
AlarmTimerUnit::Time timeOf(Date date) {
    const std::int64_t nanoseconds = std::max<std::int64_t>(date.nanosecondsSince1970, 0);
    const AlarmTimerUnit::Time time = nanoseconds / kOneMicrosecondInNanoseconds +
                                      (nanoseconds % kOneMicrosecondInNanoseconds == 0 ? 0 : 1);
    return std::min(time, AlarmTimerUnit::kLatest);
}

Error notWaiting() {
    return {kGenericErrorDomain, 0, "the timer does not wait"};
}

} // namespace

SystemdAlarmWaker::SystemdAlarmWaker(AlarmTimerUnit& timer, AlarmWaker& fallback, Clock& clock,
                                     SystemLog& log, Machine machine)
    : timer_(timer), fallback_(fallback), clock_(clock), log_(log), machine_(machine) {}

bool SystemdAlarmWaker::arm(Date date) {
    const std::optional<Error> error = replaceTimer(date);
    if (!error) {
        fallback_.disarm();
        return true;
    }
    if (date <= clock_.now()) {
        return false;
    }
    log_.write(LogLevel::warning,
               base::concat("kstd: AlarmWaker: no timer of the init system: ", error->description,
                            "; the daemon stays to wait for its alarm.\n"),
               {});
    return fallback_.arm(date);
}

void SystemdAlarmWaker::disarm() {
    fallback_.disarm();
    // A timer that stays finds nothing to send when it elapses.
    static_cast<void>(timer_.stop());
}

/// None when the timer waits for the date.
std::optional<Error> SystemdAlarmWaker::replaceTimer(Date date) {
    const auto present = timer_.elapses();
    if (!present) {
        return present.error();
    }
    if (present.value() == timeOf(date)) {
        return std::nullopt;
    }
    if (auto error = timer_.stop()) {
        return error;
    }
    return startTimer(date);
}

std::optional<Error> SystemdAlarmWaker::startTimer(Date date) {
    if (machine_ == Machine::canBeWoken) {
        auto error = startWaiting(date, AlarmTimerUnit::Wakes::machine);
        if (!error || date <= clock_.now()) {
            return error;
        }
    }
    auto error = startWaiting(date, AlarmTimerUnit::Wakes::nothing);
    if (!error) {
        machine_ = Machine::cannotBeWoken;
        sayThatItDoesNotWake();
    }
    return error;
}

std::optional<Error> SystemdAlarmWaker::startWaiting(Date date, AlarmTimerUnit::Wakes wakes) {
    if (auto error = timer_.start(timeOf(date), wakes)) {
        return error;
    }
    // A timer that failed in its job, or whose time has passed, is gone without a word.
    const auto started = timer_.elapses();
    if (!started) {
        return started.error();
    }
    return started.value() == timeOf(date) ? std::nullopt : std::optional(notWaiting());
}

/// Once in a process.
void SystemdAlarmWaker::sayThatItDoesNotWake() {
    if (std::exchange(saidThatItDoesNotWake_, true)) {
        return;
    }
    log_.write(LogLevel::info,
               "kstd: AlarmWaker: this machine cannot be woken from sleep; an alarm that comes due "
               "meanwhile waits until it is awake.\n",
               {});
}

SystemdAlarmWaker::Machine SystemdAlarmWaker::machineHere() {
    timespec now{};
    return ::clock_gettime(CLOCK_REALTIME_ALARM, &now) == 0 ? Machine::canBeWoken
                                                            : Machine::cannotBeWoken;
}

} // namespace platform
