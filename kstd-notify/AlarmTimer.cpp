#include "kstd-notify/AlarmTimer.h"

#include <algorithm>
#include <time.h>

namespace notify {

namespace {

using platform::Date;
using platform::Error;

constexpr std::int64_t kOneMicrosecondInNanoseconds = 1000;

/// Rounded up, so that the alarm is due when the timer elapses.
AlarmTimerUnit::Time timeOf(Date date) {
    const std::int64_t nanoseconds = std::max<std::int64_t>(date.nanosecondsSince1970, 0);
    const AlarmTimerUnit::Time time = nanoseconds / kOneMicrosecondInNanoseconds +
                                      (nanoseconds % kOneMicrosecondInNanoseconds == 0 ? 0 : 1);
    return std::min(time, AlarmTimerUnit::kLatest);
}

wire::AlarmAnswer failure(std::int64_t date, const Error& error) {
    return {wire::AlarmAnswer::Timer::failed, true, date, error.description};
}

} // namespace

AlarmTimer::AlarmTimer(AlarmTimerUnit& unit, platform::Clock& clock, Machine machine)
    : unit_(unit), clock_(clock), machine_(machine) {}

wire::AlarmAnswer AlarmTimer::set(std::optional<Date> date) {
    wakesMachine_ = true;
    if (!date) {
        const auto error = unit_.stop();
        return error ? failure(0, *error) : wire::AlarmAnswer();
    }
    if (const auto error = replace(*date)) {
        return failure(date->nanosecondsSince1970, *error);
    }
    return {wire::AlarmAnswer::Timer::waits, wakesMachine_, date->nanosecondsSince1970, {}};
}

/// None when the timer waits for the date.
std::optional<Error> AlarmTimer::replace(Date date) {
    const auto present = unit_.elapses();
    if (!present) {
        return present.error();
    }
    // Left alone: between a stop and a start there would be none, and the process may end there.
    if (present.value() == timeOf(date)) {
        return std::nullopt;
    }
    if (auto error = unit_.stop()) {
        return error;
    }
    return start(date);
}

std::optional<Error> AlarmTimer::start(Date date) {
    if (machine_ == Machine::canBeWoken) {
        auto error = startWaiting(date, AlarmTimerUnit::Wakes::machine);
        // That a timer of the past does not wait is not the machine's fault.
        if (!error || date <= clock_.now()) {
            return error;
        }
    }
    auto error = startWaiting(date, AlarmTimerUnit::Wakes::nothing);
    if (!error) {
        machine_ = Machine::cannotBeWoken;
        wakesMachine_ = false;
    }
    return error;
}

std::optional<Error> AlarmTimer::startWaiting(Date date, AlarmTimerUnit::Wakes wakes) {
    if (auto error = unit_.start(timeOf(date), wakes)) {
        return error;
    }
    // A timer that failed in its job, or whose time has passed, is gone without a word.
    const auto started = unit_.elapses();
    if (!started) {
        return started.error();
    }
    if (started.value() == timeOf(date)) {
        return std::nullopt;
    }
    return Error{platform::kGenericErrorDomain, 0, "the timer does not wait"};
}

AlarmTimer::Machine AlarmTimer::machineHere() {
    timespec now{};
    return ::clock_gettime(CLOCK_REALTIME_ALARM, &now) == 0 ? Machine::canBeWoken
                                                            : Machine::cannotBeWoken;
}

} // namespace notify
