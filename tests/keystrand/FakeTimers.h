#pragma once

#include "keystrand/Timers.h"

#include <algorithm>
#include <chrono>
#include <functional>
#include <memory>
#include <optional>
#include <utility>
#include <vector>

namespace keystrand {

/// Timers of a clock that stands still until a test moves it.
class FakeTimers : public Timers {
  public:
    using Time = std::chrono::milliseconds;

    [[nodiscard]] std::unique_ptr<Timer> timer(std::function<void()> handler) override {
        return std::make_unique<FakeTimer>(*this, std::move(handler));
    }

    /// Lets time pass; what ends meanwhile does so in its order.
    void pass(Time time) {
        const Time end = now_ + time;
        while (FakeTimer* const next = first(end)) {
            now_ = *next->end;
            next->end.reset();
            next->handler();
        }
        now_ = end;
    }

    /// How many wait for their end.
    [[nodiscard]] std::size_t running() const {
        return static_cast<std::size_t>(
            std::count_if(timers_.begin(), timers_.end(), [](auto* each) { return each->end; }));
    }

  private:
    struct FakeTimer : Timer {
        FakeTimer(FakeTimers& timers, std::function<void()> called)
            : all(timers), handler(std::move(called)) {
            all.timers_.push_back(this);
        }
        ~FakeTimer() override { std::erase(all.timers_, this); }

        void startFor(Time time) override { end = all.now_ + time; }
        void stop() override { end.reset(); }

        FakeTimers& all;
        std::function<void()> handler;
        std::optional<Time> end;
    };

    [[nodiscard]] FakeTimer* first(Time latest) const {
        FakeTimer* found = nullptr;
        for (FakeTimer* const each : timers_) {
            if (each->end && *each->end <= latest &&
                (found == nullptr || *each->end < *found->end)) {
                found = each;
            }
        }
        return found;
    }

    Time now_{0};
    std::vector<FakeTimer*> timers_;
};

} // namespace keystrand
