#pragma once

#include "base/FileDescriptor.h"
#include "platform/Date.h"
#include "platform/linux/LinuxRunLoop.h"
#include "platform/linux/alarms/AlarmWaker.h"

#include <functional>
#include <memory>

namespace platform {

/// A timer of the system on the wall clock. It wakes the machine from sleep where the system can.
class RealTimeTimer {
  public:
    enum class Wake { nothing, due, clockWasSet };

    RealTimeTimer();

    /// Readable when the timer has something to say.
    [[nodiscard]] int descriptor() const { return descriptor_.get(); }

    /// Replaces what was armed. A date beyond what the system can express waits until the latest it
    /// can; one that is past, even before 1970, is due at once.
    void arm(Date date);
    void disarm();

    /// Why the descriptor is readable. After clockWasSet the timer must be armed again.
    [[nodiscard]] Wake acknowledge();

  private:
    base::FileDescriptor descriptor_;
};

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
