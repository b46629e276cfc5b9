#pragma once

#include "base/Concat.h"
#include "tests/keystrand-sessions/LogindMachine.h"

#include <deque>
#include <map>
#include <utility>
#include <vector>

namespace keystrand::sessions {

/// A logind in memory. What it tells waits until the test lets it happen.
class FakeLogind : public Logind, public LogindMachine {
  public:
    void start(LogindListener& listener) override {
        listener_ = &listener;
        tellAll();
    }
    void delaySleep() override { wantsDelay_ = true; }
    void letSleep() override { wantsDelay_ = false; }

    [[nodiscard]] Logind& logind() override { return *this; }

    void startLogind(std::optional<MonotonicTime> started) override {
        stopLogind();
        process_ = LogindProcess{base::concat(":1.", ++lastNumber_), started};
        isPreparing_ = false;
        for (auto& [id, session] : sessions_) {
            session.isHintSet = false;
        }
        tellAll();
    }
    void stopLogind() override {
        if (std::exchange(process_, std::nullopt)) {
            tell([](LogindListener& listener) { listener.isAway(); });
        }
    }
    void stopBus() override { stopLogind(); }
    void startBus() override {}

    void put(const Session& session) override {
        if (std::exchange(sessions_[session.id], session) != session && process_) {
            tell([session](LogindListener& listener) { listener.sessionIs(session); });
        }
    }
    void remove(const std::string& id) override {
        sessions_.erase(id);
        tell([id](LogindListener& listener) { listener.sessionIsGone(id); });
    }
    void prepareForSleep(bool isAboutTo) override {
        isPreparing_ = isAboutTo;
        tell([isAboutTo](LogindListener& listener) { listener.prepareForSleep(isAboutTo); });
    }

    [[nodiscard]] bool isSleepDelayed() override { return wantsDelay_ && process_; }

    void happen() {
        while (!waiting_.empty()) {
            const auto next = std::move(waiting_.front());
            waiting_.pop_front();
            next(*listener_);
        }
    }
    [[nodiscard]] bool happenUntil(const std::function<bool()>& isSo) override {
        happen();
        return isSo();
    }

  private:
    using Told = std::function<void(LogindListener& listener)>;

    void tell(Told told) {
        if (listener_ != nullptr) {
            waiting_.push_back(std::move(told));
        }
    }
    void tellAll() {
        if (!process_) {
            return;
        }
        std::vector<Session> sessions;
        for (const auto& [id, session] : sessions_) {
            sessions.push_back(session);
        }
        tell([process = *process_, sessions, isPreparing = isPreparing_](LogindListener& listener) {
            listener.isThere(process, sessions, isPreparing);
        });
    }

    LogindListener* listener_ = nullptr;
    std::deque<Told> waiting_;
    std::optional<LogindProcess> process_;
    unsigned lastNumber_ = 0;
    std::map<std::string, Session> sessions_;
    bool isPreparing_ = false;
    bool wantsDelay_ = false;
};

} // namespace keystrand::sessions
