#pragma once

#include "platform/Clock.h"
#include "platform/SystemLog.h"
#include "platform/linux/AlarmTimerUnit.h"
#include "platform/linux/AlarmWaker.h"

#include <optional>

namespace platform {

/// AlarmWaker with a timer of the init system, which starts a program that sends the alarm's event
/// and so launches a daemon that has ended.
///
/// Where the init system gives no timer, a line in the log says why, and another waker, which must
/// be able to arm any date, takes over until the next registration.
class SystemdAlarmWaker final : public AlarmWaker {
  public:
    /// Whether a timer may wake the machine from sleep.
    enum class Machine { canBeWoken, cannotBeWoken };

    SystemdAlarmWaker(AlarmTimerUnit& timer, AlarmWaker& fallback, Clock& clock, SystemLog& log,
                      Machine machine);

    [[nodiscard]] bool arm(Date date) override;
    void disarm() override;
    void close() override { fallback_.close(); }

    /// Whether this machine has a clock that can wake it.
    [[nodiscard]] static Machine machineHere();

  private:
    [[nodiscard]] std::optional<Error> replaceTimer(Date date);
    [[nodiscard]] std::optional<Error> startTimer(Date date);
    [[nodiscard]] std::optional<Error> startWaiting(Date date, AlarmTimerUnit::Wakes wakes);
    void sayThatItDoesNotWake();

    AlarmTimerUnit& timer_;
    AlarmWaker& fallback_;
    Clock& clock_;
    SystemLog& log_;
    Machine machine_;
    bool saidThatItDoesNotWake_ = false;
};

} // namespace platform
