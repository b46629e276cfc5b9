#pragma once

#include <systemd/sd-event.h>

#include <chrono>
#include <cstdint>
#include <ctime>
#include <functional>
#include <memory>
#include <utility>

namespace keystrand {

/// One thing that the loop watches. Destroying it ends the watch, also from within its own handler.
class EventSource {
  public:
    EventSource() = default;

    [[nodiscard]] explicit operator bool() const { return source_ != nullptr; }

    /// For a descriptor: the epoll events to wait for. EPOLLHUP and EPOLLERR always come.
    void listenFor(std::uint32_t events);

    /// For a timer: calls the handler once at that time of the timer's clock.
    void expireAt(std::uint64_t microseconds);
    void expireIn(std::chrono::milliseconds delay);

    void disable();

  private:
    friend class EventLoop;
    struct Release {
        void operator()(sd_event_source* source) const { sd_event_source_disable_unref(source); }
    };
    explicit EventSource(sd_event_source* source) : source_(source) {}

    std::unique_ptr<sd_event_source, Release> source_;
};

/// The one loop of the program. Everything happens on the thread that calls `run`.
///
/// A source that could not be made is empty. The loop outlives its sources.
class EventLoop {
  public:
    using IoHandler = std::function<void(std::uint32_t events)>;
    using Handler = std::function<void()>;

    /// None when the system has no room for a loop.
    [[nodiscard]] static std::unique_ptr<EventLoop> create();

    [[nodiscard]] EventSource watch(int fd, std::uint32_t events, IoHandler handler);
    /// A timer that is not armed yet.
    [[nodiscard]] EventSource timer(clockid_t clock, Handler handler);
    /// Blocks the signal for the process and has the handler called for it.
    [[nodiscard]] EventSource signal(int number, Handler handler);

    struct Turns {
        /// Something has come, and its handlers are called next.
        Handler work;
        /// All is done; whatever comes next is waited for.
        Handler rest;
    };
    /// To be told of the turns of `run`. Before it runs.
    void setTurns(Turns turns) { turns_ = std::move(turns); }

    /// Waits for something to come, at most that long, and has it handled. Not for `run`.
    void turn(std::chrono::microseconds most);

    /// Runs until `stop`. False when the loop itself failed.
    [[nodiscard]] bool run();
    void stop();

    /// For what brings sources of its own, as a connection to the message bus does.
    [[nodiscard]] sd_event* handle() const { return event_.get(); }

  private:
    struct Release {
        void operator()(sd_event* event) const { sd_event_unref(event); }
    };
    explicit EventLoop(sd_event* event) : event_(event) {}
    [[nodiscard]] int wait(std::uint64_t microseconds);

    std::unique_ptr<sd_event, Release> event_;
    Turns turns_;
};

} // namespace keystrand
