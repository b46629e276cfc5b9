#include "platform/linux/alarms/TimerAlarmWaker.h"

#include <algorithm>
#include <cerrno>
#include <cstdint>
#include <sys/timerfd.h>
#include <system_error>
#include <unistd.h>
#include <utility>

namespace platform {

namespace {

/// How often the clock may be set while a timer is armed.
constexpr int kArmAttempts = 100;

int makeTimer() {
    // The clock that wakes a sleeping machine takes a privilege, which a container may not give.
    const int waking = ::timerfd_create(CLOCK_REALTIME_ALARM, TFD_CLOEXEC | TFD_NONBLOCK);
    return waking >= 0 ? waking : ::timerfd_create(CLOCK_REALTIME, TFD_CLOEXEC | TFD_NONBLOCK);
}

} // namespace

RealTimeTimer::RealTimeTimer() : descriptor_(makeTimer()) {
    if (!descriptor_.isOpen()) {
        throw std::system_error(errno, std::generic_category(), "the timer");
    }
}

void RealTimeTimer::arm(Date date) {
    // A time of 0 would disarm the timer.
    const std::int64_t nanoseconds = std::max<std::int64_t>(date.nanosecondsSince1970, 1);
    itimerspec time{};
    time.it_value.tv_sec = nanoseconds / kNanosecondsPerSecond;
    time.it_value.tv_nsec = nanoseconds % kNanosecondsPerSecond;
    // A clock that is set then shows as ECANCELED: here, where the timer is to be armed once more,
    // or as it is waited for.
    int attempts = kArmAttempts;
    while (::timerfd_settime(descriptor_.get(), TFD_TIMER_ABSTIME | TFD_TIMER_CANCEL_ON_SET, &time,
                             nullptr) != 0 &&
           errno == ECANCELED && --attempts > 0) {
    }
}

void RealTimeTimer::disarm() {
    const itimerspec never{};
    ::timerfd_settime(descriptor_.get(), 0, &never, nullptr);
}

RealTimeTimer::Wake RealTimeTimer::acknowledge() {
    std::uint64_t expirations = 0;
    if (::read(descriptor_.get(), &expirations, sizeof expirations) >= 0) {
        return Wake::due;
    }
    return errno == ECANCELED ? Wake::clockWasSet : Wake::nothing;
}

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
