#include "platform/linux/TimerAlarmWaker.h"

#include <utility>

namespace platform {

namespace {

constexpr char kArmedLabel[] = "alarm armed";

} // namespace

TimerAlarmWaker::TimerAlarmWaker(LinuxRunLoop& loop, ProcessTransactions& transactions, Woke woke)
    : transactions_(transactions),
      woke_(std::move(woke)),
      source_(loop.addReadable(timer_.descriptor(), [this] { timerIsReadable(); })) {
    source_->setEnabled(false);
}

bool TimerAlarmWaker::arm(Date date) {
    if (source_) {
        timer_.arm(date);
        source_->setEnabled(true);
        if (!armed_) {
            armed_.emplace(transactions_, kArmedLabel);
        }
    }
    return true;
}

void TimerAlarmWaker::disarm() {
    if (armed_) {
        timer_.disarm();
        source_->setEnabled(false);
        armed_.reset();
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
