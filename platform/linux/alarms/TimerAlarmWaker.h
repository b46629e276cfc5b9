#pragma once

#include "platform/linux/LinuxRunLoop.h"
#include "platform/linux/alarms/AlarmWaker.h"
#include "platform/linux/alarms/RealTimeTimer.h"

#include <functional>
#include <memory>

namespace platform {

/// AlarmWaker with a timer in this process. It cannot launch a process that is gone, so while it is
/// armed it holds this one.
class TimerAlarmWaker final : public AlarmWaker {
  public:
    using Woke = std::function<void()>;

    /// `woke` is called when the date has come and when the clock was set; it arms again what is to
    /// be armed. The loop must outlive the waker.
    TimerAlarmWaker(LinuxRunLoop& loop, Woke woke);

    void arm(Date date) override;
    void disarm() override;
    [[nodiscard]] bool holdsProcess() const override { return isArmed_; }
    void tryAgain() override {}
    /// From then on nothing is armed.
    void close() override;

  private:
    void timerIsReadable();

    Woke woke_;
    RealTimeTimer timer_;
    std::unique_ptr<RunLoopSource> source_;
    bool isArmed_ = false;
};

} // namespace platform
