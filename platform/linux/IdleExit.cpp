#include "platform/linux/IdleExit.h"

#include <utility>

namespace platform {

void LinuxProcessTransactions::begin(std::string_view /*label*/) {
    ++count_;
}

void LinuxProcessTransactions::end(std::string_view /*label*/) {
    --count_;
}

IdleExit::IdleExit(LinuxRunLoop& loop, std::chrono::microseconds idleTime, Busy busy,
                   Close closeStreams)
    : idleTime_(idleTime),
      busy_(std::move(busy)),
      closeStreams_(std::move(closeStreams)),
      timer_(loop.addTimer([this] { timeIsUp(); })) {
    timer_->fireAfter(idleTime_);
}

// The timer is not moved at every event: when it fires after an event, it waits another idle time.
// The process so ends between one and two idle times after the last event.
void IdleExit::timeIsUp() {
    const bool isBusy = busy_();
    if (std::exchange(touched_, false) || isBusy) {
        timer_->fireAfter(idleTime_);
    } else {
        closeStreams_();
    }
}

} // namespace platform
