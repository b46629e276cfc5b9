#include "keystrand/EventLoop.h"

#include <utility>

namespace keystrand {

namespace {

constexpr std::uint64_t kAccuracyMicroseconds = 1;

int callIo(sd_event_source* /*source*/, int /*fd*/, std::uint32_t events, void* handler) {
    (*static_cast<EventLoop::IoHandler*>(handler))(events);
    return 0;
}

int callTimer(sd_event_source* /*source*/, std::uint64_t /*time*/, void* handler) {
    (*static_cast<EventLoop::Handler*>(handler))();
    return 0;
}

int callSignal(sd_event_source* /*source*/, const signalfd_siginfo* /*info*/, void* handler) {
    (*static_cast<EventLoop::Handler*>(handler))();
    return 0;
}

// The library calls this when the source is really gone, which is after its running handler.
template <typename HandlerType>
void deleteWithSource(sd_event_source* source, std::unique_ptr<HandlerType> handler) {
    sd_event_source_set_destroy_callback(
        source, [](void* owned) { delete static_cast<HandlerType*>(owned); });
    static_cast<void>(handler.release());
}

} // namespace

void EventSource::listenFor(std::uint32_t events) {
    sd_event_source_set_io_events(source_.get(), events);
    sd_event_source_set_enabled(source_.get(), SD_EVENT_ON);
}

void EventSource::expireAt(std::uint64_t microseconds) {
    sd_event_source_set_time(source_.get(), microseconds);
    sd_event_source_set_enabled(source_.get(), SD_EVENT_ONESHOT);
}

void EventSource::expireIn(std::chrono::milliseconds delay) {
    const std::chrono::microseconds microseconds = delay;
    sd_event_source_set_time_relative(source_.get(),
                                      static_cast<std::uint64_t>(microseconds.count()));
    sd_event_source_set_enabled(source_.get(), SD_EVENT_ONESHOT);
}

void EventSource::disable() {
    sd_event_source_set_enabled(source_.get(), SD_EVENT_OFF);
}

std::unique_ptr<EventLoop> EventLoop::create() {
    sd_event* event = nullptr;
    if (sd_event_new(&event) < 0) {
        return nullptr;
    }
    return std::unique_ptr<EventLoop>(new EventLoop(event));
}

EventSource EventLoop::watch(int fd, std::uint32_t events, IoHandler handler) {
    auto owned = std::make_unique<IoHandler>(std::move(handler));
    sd_event_source* source = nullptr;
    if (sd_event_add_io(event_.get(), &source, fd, events, callIo, owned.get()) < 0) {
        return {};
    }
    deleteWithSource(source, std::move(owned));
    return EventSource(source);
}

EventSource EventLoop::timer(clockid_t clock, Handler handler) {
    auto owned = std::make_unique<Handler>(std::move(handler));
    sd_event_source* source = nullptr;
    if (sd_event_add_time(event_.get(), &source, clock, 0, kAccuracyMicroseconds, callTimer,
                          owned.get()) < 0) {
        return {};
    }
    sd_event_source_set_enabled(source, SD_EVENT_OFF);
    deleteWithSource(source, std::move(owned));
    return EventSource(source);
}

EventSource EventLoop::signal(int number, Handler handler) {
    auto owned = std::make_unique<Handler>(std::move(handler));
    sd_event_source* source = nullptr;
    if (sd_event_add_signal(event_.get(), &source, number | SD_EVENT_SIGNAL_PROCMASK, callSignal,
                            owned.get()) < 0) {
        return {};
    }
    deleteWithSource(source, std::move(owned));
    return EventSource(source);
}

void EventLoop::turn(std::chrono::microseconds most) {
    const auto limit = std::max<std::chrono::microseconds::rep>(most.count(), 0);
    static_cast<void>(sd_event_run(event_.get(), static_cast<std::uint64_t>(limit)));
}

bool EventLoop::run() {
    if (!turns_.work) {
        return sd_event_loop(event_.get()) >= 0;
    }
    while (sd_event_get_state(event_.get()) != SD_EVENT_FINISHED) {
        int ready = wait(0);
        if (ready == 0) {
            turns_.rest();
            ready = wait(UINT64_MAX);
            turns_.work();
        }
        if (ready < 0 || (ready > 0 && sd_event_dispatch(event_.get()) < 0)) {
            return false;
        }
    }
    return true;
}

/// Positive when something is to be dispatched.
int EventLoop::wait(std::uint64_t microseconds) {
    const int ready = sd_event_prepare(event_.get());
    return ready == 0 ? sd_event_wait(event_.get(), microseconds) : ready;
}

void EventLoop::stop() {
    sd_event_exit(event_.get(), 0);
}

} // namespace keystrand
