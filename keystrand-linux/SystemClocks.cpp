#include "keystrand-linux/SystemClocks.h"

#include <cerrno>
#include <ctime>
#include <limits>
#include <sys/epoll.h>
#include <sys/timerfd.h>
#include <unistd.h>
#include <utility>

namespace keystrand::usb {

namespace {

std::chrono::microseconds timeOf(clockid_t clock) {
    timespec now{};
    // Fails only for clocks that no kernel is without.
    static_cast<void>(::clock_gettime(clock, &now));
    return std::chrono::duration_cast<std::chrono::microseconds>(
        std::chrono::seconds(now.tv_sec) + std::chrono::nanoseconds(now.tv_nsec));
}

} // namespace

BootTime SystemClocks::sinceStart() const {
    return timeOf(CLOCK_BOOTTIME);
}

std::chrono::microseconds SystemClocks::wall() const {
    return timeOf(CLOCK_REALTIME);
}

DateWatch::DateWatch(EventLoop& loop, Handler handler)
    : timer_(::timerfd_create(CLOCK_REALTIME, TFD_CLOEXEC | TFD_NONBLOCK)),
      handler_(std::move(handler)) {
    if (timer_.isOpen() && arm()) {
        source_ = loop.watch(timer_.get(), EPOLLIN, [this](std::uint32_t) { hear(); });
    }
}

/// For a time that never comes: the timer is there to be cancelled.
bool DateWatch::arm() const {
    itimerspec never{};
    never.it_value.tv_sec = std::numeric_limits<time_t>::max();
    return ::timerfd_settime(timer_.get(), TFD_TIMER_ABSTIME | TFD_TIMER_CANCEL_ON_SET, &never,
                             nullptr) == 0;
}

void DateWatch::hear() {
    std::uint64_t expirations = 0;
    const bool wasSet = ::read(timer_.get(), &expirations, sizeof expirations) < 0;
    if (wasSet && errno == EAGAIN) {
        return;
    }
    // Before the handler looks at the clocks: a date that is set after that is told again.
    static_cast<void>(arm());
    const Handler handler = handler_;
    handler();
}

} // namespace keystrand::usb
