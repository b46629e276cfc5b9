#pragma once

#include "base/NotCopied.h"
#include "keystrand/EventLoop.h"

#include <chrono>
#include <ctime>
#include <functional>
#include <memory>
#include <utility>

namespace keystrand {

/// Calls its handler once, when the time is over that it was started for last. It goes on while the
/// machine sleeps.
class Timer : private base::NotCopied {
  public:
    virtual ~Timer() = default;

    virtual void startFor(std::chrono::milliseconds time) = 0;
    virtual void stop() = 0;
};

/// Makes timers, which are not started yet and do not outlive it. None is made null.
class Timers : private base::NotCopied {
  public:
    virtual ~Timers() = default;

    [[nodiscard]] virtual std::unique_ptr<Timer> timer(std::function<void()> handler) = 0;
};

/// Timers of the loop, which outlives them.
class LoopTimers : public Timers {
  public:
    explicit LoopTimers(EventLoop& loop) : loop_(loop) {}

    [[nodiscard]] std::unique_ptr<Timer> timer(std::function<void()> handler) override {
        return std::make_unique<LoopTimer>(loop_.timer(CLOCK_BOOTTIME, std::move(handler)));
    }

  private:
    class LoopTimer : public Timer {
      public:
        explicit LoopTimer(EventSource source) : source_(std::move(source)) {}

        void startFor(std::chrono::milliseconds time) override { source_.expireIn(time); }
        void stop() override { source_.disable(); }

      private:
        EventSource source_;
    };

    EventLoop& loop_;
};

} // namespace keystrand
