#pragma once

#include "kstd-notify/AlarmTimer.h"
#include "platform/fake/FakeClock.h"

#include <gtest/gtest.h>

#include <functional>
#include <string>
#include <utility>
#include <vector>

namespace notify {

/// The init system's timer as it behaves: there is one at most, and what is past never waits.
class FakeTimerUnit final : public AlarmTimerUnit {
  public:
    explicit FakeTimerUnit(platform::FakeClock& clock) : clock_(clock) {}

    platform::Result<std::optional<Time>> elapses() override {
        calls.emplace_back("elapses");
        if (elapsesError) {
            return *elapsesError;
        }
        return waits;
    }

    std::optional<platform::Error> start(Time time, Wakes wakes) override {
        calls.push_back((wakes == Wakes::machine ? "start waking " : "start ") +
                        std::to_string(time));
        EXPECT_FALSE(waits.has_value()) << "a timer stands in the way";
        if (onStart) {
            onStart();
        }
        if (startError) {
            return startError;
        }
        const bool canWake = wakes == Wakes::nothing || wakesMachine;
        if (!keepsNothing && canWake && time > clock_.now().nanosecondsSince1970 / 1000) {
            waits = time;
        }
        return std::nullopt;
    }

    std::optional<platform::Error> elapseNow() override {
        calls.emplace_back("elapse now");
        return elapseError;
    }

    std::optional<platform::Error> stop() override {
        calls.emplace_back("stop");
        waits.reset();
        return stopError;
    }

    std::vector<std::string> takeCalls() { return std::exchange(calls, {}); }

    std::vector<std::string> calls;
    std::optional<Time> waits;
    bool wakesMachine = true;
    bool keepsNothing = false;
    std::optional<platform::Error> elapsesError;
    std::optional<platform::Error> startError;
    std::optional<platform::Error> elapseError;
    std::optional<platform::Error> stopError;
    std::function<void()> onStart;

  private:
    platform::FakeClock& clock_;
};

} // namespace notify
