#pragma once

#include "keystrand-linux/GateLog.h"
#include "keystrand-linux/LockState.h"
#include "keystrand-linux/MachineClock.h"
#include "keystrand/EventSender.h"

#include <algorithm>
#include <cstdint>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

namespace keystrand::usb {

class Log : public GateLog {
  public:
    void write(GateLine, const std::string& text) override { lines.push_back(text); }
    [[nodiscard]] bool has(const std::string& line) const {
        return std::find(lines.begin(), lines.end(), line) != lines.end();
    }
    std::vector<std::string> lines;
};

class Clocks : public MachineClock {
  public:
    static constexpr std::int64_t kDate = 1'700'000'000;

    [[nodiscard]] BootTime sinceStart() const override { return boot; }
    [[nodiscard]] std::chrono::microseconds wall() const override {
        return std::chrono::seconds(date) + sinceTheSecond;
    }

    void pass(std::chrono::seconds time) {
        boot += time;
        date += time.count();
    }

    BootTime boot = std::chrono::seconds(100);
    std::int64_t date = kDate;
    /// Of the date: the seconds of the two clocks need not begin together.
    std::chrono::microseconds sinceTheSecond{0};
};

class Sessions : public LockState {
  public:
    void listen(Listener listener) override { say = std::move(listener); }
    void closed() override { ++answers; }

    Listener say;
    int answers = 0;
};

class Poster : public EventPoster {
  public:
    bool post(std::string_view, std::string_view name) override {
        names.emplace_back(name.substr(name.rfind('.') + 1));
        return true;
    }
    std::vector<std::string> names;
};

} // namespace keystrand::usb
