#pragma once

#include "base/NotCopied.h"
#include "platform/Clock.h"
#include "platform/Date.h"
#include "platform/Result.h"
#include "wire/AlarmAnswer.h"

#include <cstdint>
#include <optional>

namespace notify {

/// The init system's timer that starts the sender of due alarms. There is one, and it outlives this
/// process. A call has taken effect when it returns.
class AlarmTimerUnit : private base::NotCopied {
  public:
    /// Microseconds since 1970-01-01 UTC.
    using Time = std::int64_t;

    enum class Wakes { machine, nothing };

    /// The latest time that a timer can have: the end of the year 2199.
    static constexpr Time kLatest = 7'258'118'399'999'999;

    virtual ~AlarmTimerUnit() = default;

    /// When the timer elapses; none when there is no timer, or none that will.
    [[nodiscard]] virtual platform::Result<std::optional<Time>> elapses() = 0;

    /// Starts the timer, from 0 to kLatest. There must be none. A time that is past makes one that
    /// never elapses. Gives the error when the init system refuses; that it did not still leaves it
    /// to `elapses` to tell whether the timer waits.
    [[nodiscard]] virtual std::optional<platform::Error> start(Time time, Wakes wakes) = 0;

    /// Starts at once what the timer would start when it elapses.
    [[nodiscard]] virtual std::optional<platform::Error> elapseNow() = 0;

    /// Takes the timer away; that there is none is fine.
    [[nodiscard]] virtual std::optional<platform::Error> stop() = 0;
};

/// Brings the init system's timer to where it has to be.
class AlarmTimer {
  public:
    /// Whether a timer may wake the machine from sleep.
    enum class Machine { canBeWoken, cannotBeWoken };

    AlarmTimer(AlarmTimerUnit& unit, platform::Clock& clock, Machine machine);

    /// Has the timer wait for the date, which it may do already, or takes it away, and says what
    /// became of that. A date beyond the latest is held there.
    [[nodiscard]] wire::AlarmAnswer set(std::optional<platform::Date> date);

    /// Whether this machine has a clock that can wake it.
    [[nodiscard]] static Machine machineHere();

  private:
    [[nodiscard]] std::optional<platform::Error> replace(platform::Date date);
    [[nodiscard]] std::optional<platform::Error> start(platform::Date date);
    [[nodiscard]] std::optional<platform::Error> startWaiting(platform::Date date,
                                                              AlarmTimerUnit::Wakes wakes);

    AlarmTimerUnit& unit_;
    platform::Clock& clock_;
    Machine machine_;
    bool wakesMachine_ = true;
};

} // namespace notify
