#include "platform/linux/LinuxRunLoop.h"

#include "base/Concat.h"
#include "platform/linux/LinuxClock.h"

#include <systemd/sd-event.h>

#include <algorithm>
#include <cerrno>
#include <exception>
#include <sys/epoll.h>
#include <system_error>
#include <time.h>
#include <utility>

namespace platform {

namespace {

constexpr std::int64_t kPendingPriority = SD_EVENT_PRIORITY_NORMAL - 1;
constexpr std::int64_t kUrgentPriority = SD_EVENT_PRIORITY_NORMAL - 2;
constexpr std::uint64_t kOneMicrosecond = 1;
constexpr std::uint64_t kNoTimeout = UINT64_MAX;
constexpr std::int64_t kNanosecondsPerMicrosecond = 1000;

std::uint64_t microsecondsUntil(Date deadline) {
    if (deadline == kDistantFuture) {
        return kNoTimeout;
    }
    const Date now = realTimeNow();
    if (deadline <= now) {
        return 0;
    }
    const std::int64_t left = deadline.nanosecondsSince1970 - now.nanosecondsSince1970;
    // Rounded up, so that the deadline has passed when the wait is over.
    return static_cast<std::uint64_t>(left / kNanosecondsPerMicrosecond) + kOneMicrosecond;
}

void requireMade(int result) {
    if (result < 0) {
        throw std::system_error(-result, std::generic_category(), "the run loop");
    }
}

} // namespace

RunLoopSource::RunLoopSource(LinuxRunLoop& loop, Keeps keeps, Handler handler)
    : loop_(loop), handler_(std::move(handler)), keeps_(keeps) {}

RunLoopSource::~RunLoopSource() {
    countAs(false);
    sd_event_source_disable_unref(source_);
}

void RunLoopSource::countAs(bool enabled) {
    if (enabled == enabled_) {
        return;
    }
    enabled_ = enabled;
    if (keeps_ == Keeps::loopRunning) {
        loop_.liveSources_ += enabled ? 1 : -1;
    }
}

void RunLoopSource::setEnabled(bool enabled) {
    sd_event_source_set_enabled(source_, enabled ? SD_EVENT_ON : SD_EVENT_OFF);
    countAs(enabled);
}

void RunLoopSource::fireAfter(std::chrono::microseconds delay) {
    sd_event_source_set_time_relative(source_, static_cast<std::uint64_t>(delay.count()));
    sd_event_source_set_enabled(source_, SD_EVENT_ONESHOT);
    countAs(true);
}

int RunLoopSource::dispatch(void* self) {
    // Copies, because the handler may destroy its source.
    LinuxRunLoop& loop = static_cast<RunLoopSource*>(self)->loop_;
    try {
        const Handler handler = static_cast<RunLoopSource*>(self)->handler_;
        handler();
    } catch (const std::exception& error) {
        // What calls this is not C++ and lets nothing through.
        loop.fail(error.what());
    }
    return 0;
}

LinuxRunLoop::LinuxRunLoop(SystemLog& log) : log_(log) {
    requireMade(sd_event_new(&event_));
}

LinuxRunLoop::~LinuxRunLoop() {
    sd_event_unref(event_);
}

bool LinuxRunLoop::runOnce(Date deadline) {
    // Without a source the library would wait for ever, and nothing in it counts them.
    if (liveSources_ == 0 || hasFailed_) {
        return false;
    }
    const int result = sd_event_run(event_, microsecondsUntil(deadline));
    if (result < 0) {
        fail(std::generic_category().message(-result));
    }
    return !hasFailed_;
}

void LinuxRunLoop::fail(std::string_view reason) {
    hasFailed_ = true;
    log_.write(LogLevel::error, base::concat("kstd: MainRunLoop: cannot run: ", reason, ".\n"), {});
}

std::unique_ptr<RunLoopSource> LinuxRunLoop::addReadable(int descriptor,
                                                         RunLoopSource::Handler handler) {
    return addDescriptor(descriptor, RunLoopSource::Keeps::loopRunning, std::move(handler));
}

std::unique_ptr<RunLoopSource> LinuxRunLoop::addUrgent(int descriptor,
                                                       RunLoopSource::Handler handler) {
    auto source = addDescriptor(descriptor, RunLoopSource::Keeps::nothing, std::move(handler));
    requireMade(sd_event_source_set_priority(source->source_, kUrgentPriority));
    return source;
}

std::unique_ptr<RunLoopSource> LinuxRunLoop::addDescriptor(int descriptor,
                                                           RunLoopSource::Keeps keeps,
                                                           RunLoopSource::Handler handler) {
    std::unique_ptr<RunLoopSource> source(new RunLoopSource(*this, keeps, std::move(handler)));
    const auto callback = [](sd_event_source*, int, std::uint32_t, void* self) {
        return RunLoopSource::dispatch(self);
    };
    requireMade(
        sd_event_add_io(event_, &source->source_, descriptor, EPOLLIN, callback, source.get()));
    source->countAs(true);
    return source;
}

std::unique_ptr<RunLoopSource> LinuxRunLoop::addPending(RunLoopSource::Handler handler) {
    std::unique_ptr<RunLoopSource> source(
        new RunLoopSource(*this, RunLoopSource::Keeps::loopRunning, std::move(handler)));
    const auto callback = [](sd_event_source*, void* self) {
        return RunLoopSource::dispatch(self);
    };
    requireMade(sd_event_add_defer(event_, &source->source_, callback, source.get()));
    requireMade(sd_event_source_set_priority(source->source_, kPendingPriority));
    source->setEnabled(false);
    return source;
}

std::unique_ptr<RunLoopSource> LinuxRunLoop::addTimer(RunLoopSource::Handler handler,
                                                      RunLoopSource::Keeps keeps) {
    std::unique_ptr<RunLoopSource> source(new RunLoopSource(*this, keeps, std::move(handler)));
    const auto callback = [](sd_event_source*, std::uint64_t, void* self) {
        return RunLoopSource::dispatch(self);
    };
    // The accuracy is given because 0 would mean the library's own: a quarter of a second.
    requireMade(sd_event_add_time(event_, &source->source_, CLOCK_MONOTONIC, 0, kOneMicrosecond,
                                  callback, source.get()));
    source->setEnabled(false);
    return source;
}

} // namespace platform
