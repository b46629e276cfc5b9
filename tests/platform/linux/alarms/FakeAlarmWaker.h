#pragma once

#include "platform/linux/alarms/AlarmWaker.h"

#include <string>
#include <utility>
#include <vector>

namespace platform {

/// A waker that notes what it is asked for, such as "arm 5".
struct FakeAlarmWaker final : AlarmWaker {
    void arm(Date date) override {
        calls.push_back("arm " + std::to_string(date.nanosecondsSince1970));
    }
    void disarm() override { calls.emplace_back("disarm"); }
    [[nodiscard]] bool holdsProcess() const override { return holds; }
    void tryAgain() override { calls.emplace_back("try again"); }
    void close() override { calls.emplace_back("close"); }

    std::vector<std::string> takeCalls() { return std::exchange(calls, {}); }

    std::vector<std::string> calls;
    bool holds = false;
};

} // namespace platform
