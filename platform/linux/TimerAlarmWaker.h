#pragma once

#include "platform/ProcessTransaction.h"
#include "platform/linux/AlarmWaker.h"
#include "platform/linux/LinuxRunLoop.h"
#include "platform/linux/RealTimeTimer.h"

#include <functional>
#include <memory>
#include <optional>

namespace platform {

/// AlarmWaker with a timer in this process. It cannot launch a process that is gone, so while it is
/// armed a transaction keeps this one from ending for being idle.
class TimerAlarmWaker final : public AlarmWaker {
  public:
    using Woke = std::function<void()>;

    /// `woke` is called when the date has come and when the clock was set; it arms again what is to
    /// be armed. Loop and transactions must outlive the waker.
    TimerAlarmWaker(LinuxRunLoop& loop, ProcessTransactions& transactions, Woke woke);

    /// Always true: a date that is past wakes at once.
    [[nodiscard]] bool arm(Date date) override;
    void disarm() override;
    /// From then on nothing is armed.
    void close() override;

  private:
    void timerIsReadable();

    ProcessTransactions& transactions_;
    Woke woke_;
    RealTimeTimer timer_;
    std::unique_ptr<RunLoopSource> source_;
    std::optional<ProcessTransaction> armed_;
};

} // namespace platform
