#pragma once

#include "platform/linux/AlarmWaker.h"

#include <functional>
#include <string>
#include <utility>
#include <vector>

namespace platform {

/// A waker that notes what it is asked for, such as "arm 5".
struct FakeAlarmWaker final : AlarmWaker {
    bool arm(Date date) override {
        calls.push_back("arm " + std::to_string(date.nanosecondsSince1970));
        return !whileArming || whileArming(date);
    }
    void disarm() override { calls.emplace_back("disarm"); }
    void close() override { calls.emplace_back("close"); }

    std::vector<std::string> takeCalls() { return std::exchange(calls, {}); }

    std::vector<std::string> calls;
    /// Decides, if it is there, whether the date was armed.
    std::function<bool(Date)> whileArming;
};

} // namespace platform
