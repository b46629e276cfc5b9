#pragma once

#include "keystrand/EventLoop.h"
#include "tests/support/Program.h"

#include <systemd/sd-event.h>

#include <chrono>
#include <cstdint>
#include <functional>

namespace keystrand {

/// Runs the loop until that is so. False when patience ended.
[[nodiscard]] inline bool turnUntil(EventLoop& loop, const std::function<bool()>& isDone) {
    using Steady = std::chrono::steady_clock;
    const auto end = Steady::now() + support::kPatience;
    while (!isDone()) {
        const auto left =
            std::chrono::duration_cast<std::chrono::microseconds>(end - Steady::now()).count();
        if (left <= 0 || sd_event_run(loop.handle(), static_cast<std::uint64_t>(left)) < 0) {
            return false;
        }
    }
    return true;
}

/// Runs the loop as long as it need not wait.
inline void turnAll(EventLoop& loop) {
    while (sd_event_run(loop.handle(), 0) > 0) {
    }
}

} // namespace keystrand
