#pragma once

#include "kstd-notify/AlarmTimerUnit.h"
#include "platform/Clock.h"
#include "platform/Date.h"
#include "wire/AlarmAnswer.h"

#include <optional>

namespace notify {

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
