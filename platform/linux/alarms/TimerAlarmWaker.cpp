#include "platform/linux/alarms/TimerAlarmWaker.h"

#include <utility>

namespace platform {

TimerAlarmWaker::TimerAlarmWaker(LinuxRunLoop& loop, Woke woke)
    : woke_(std::move(woke)),
      source_(loop.addReadable(timer_.descriptor(), [this] { timerIsReadable(); })) {
    source_->setEnabled(false);
}

void TimerAlarmWaker::arm(Date date) {
    if (source_) {
        timer_.arm(date);
        source_->setEnabled(true);
        isArmed_ = true;
    }
}

void TimerAlarmWaker::disarm() {
    if (isArmed_) {
        timer_.disarm();
        source_->setEnabled(false);
        isArmed_ = false;
    }
}

void TimerAlarmWaker::close() {
    disarm();
    source_.reset();
}

void TimerAlarmWaker::timerIsReadable() {
    if (timer_.acknowledge() != RealTimeTimer::Wake::nothing) {
        woke_();
    }
}

} // namespace platform
