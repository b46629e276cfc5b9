#pragma once

#include "kstd-notify/AlarmTimer.h"

#include <chrono>
#include <string>

namespace notify {

/// AlarmTimerUnit as systemd's transient unit kstd-alarm.timer, asked for over the system's message
/// bus. It starts kstd-alarm.service, which is installed.
///
/// Each call makes a connection of its own, and waits a few seconds at the most for an answer, and
/// as long for the end of a job, so that nothing is held while no alarm is set, and a bus that was
/// restarted does no harm. A bus that says much and not what is waited for gains no more time by
/// it.
class SystemdAlarmTimer final : public AlarmTimerUnit {
  public:
    static constexpr std::chrono::milliseconds kPatience{5000};

    /// `busSocket` is the file of the bus's socket.
    explicit SystemdAlarmTimer(std::string busSocket,
                               std::chrono::milliseconds patience = kPatience)
        : busSocket_(std::move(busSocket)), patience_(patience) {}

    [[nodiscard]] platform::Result<std::optional<Time>> elapses() override;
    [[nodiscard]] std::optional<platform::Error> start(Time time, Wakes wakes) override;
    [[nodiscard]] std::optional<platform::Error> elapseNow() override;
    [[nodiscard]] std::optional<platform::Error> stop() override;

  private:
    std::string busSocket_;
    std::chrono::milliseconds patience_;
};

/// The time as systemd's calendar writes it.
[[nodiscard]] std::string calendarText(AlarmTimerUnit::Time time);

} // namespace notify
