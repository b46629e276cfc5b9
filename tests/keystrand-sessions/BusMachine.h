#pragma once

#include "base/FileDescriptor.h"
#include "keystrand-sessions/BusLogind.h"
#include "tests/keystrand-sessions/LogindMachine.h"
#include "tests/keystrand/FakeTimers.h"
#include "tests/support/Program.h"
#include "tests/support/TemporaryDirectory.h"

#include <systemd/sd-bus.h>

#include <map>
#include <memory>
#include <string>
#include <vector>

namespace keystrand::sessions {

/// A bus of its own, with something on it that behaves like logind, and the real listener. Where a
/// test waits for the bus, it passes a second of the listener's time again and again.
class BusMachine : public LogindMachine {
  public:
    enum class At { once, later };

    explicit BusMachine(At bus = At::once);
    ~BusMachine() override;

    [[nodiscard]] Logind& logind() override { return *logind_; }
    void startLogind(std::optional<MonotonicTime> started) override;
    void stopLogind() override;
    void stopBus() override;
    void startBus() override;
    void put(const Session& session) override;
    void remove(const std::string& id) override;
    void prepareForSleep(bool isAboutTo) override;
    [[nodiscard]] bool isSleepDelayed() override;
    [[nodiscard]] bool happenUntil(const std::function<bool()>& isSo) override;

    /// A session is otherwise, and only its file is written.
    void putIntoFile(const Session& session);
    /// A file in that place is replaced, as logind does.
    void touchFile();
    void makeDirectoryOfFiles();
    void refuseDelays(bool isRefused) { isRefused_ = isRefused; }
    /// From now on sessions cannot be listed, or can again.
    void failToList(bool isFailing) { isFailing_ = isFailing; }
    /// Somebody else tells of a change to a session.
    void pretend(const Session& session);

    [[nodiscard]] const std::vector<std::string>& lines() const { return lines_; }
    /// How often a session was asked for, and a delay of sleep: each is answered before anything
    /// that happens from then on is told.
    [[nodiscard]] unsigned questions() const { return questions_; }
    [[nodiscard]] unsigned delaysAsked() const { return delaysAsked_; }
    FakeTimers timers;

  private:
    struct Calls;
    [[nodiscard]] sd_bus* connect();
    void emitChanges(const Session& before, const Session& after);

    const support::TemporaryDirectory directory_;
    std::unique_ptr<EventLoop> loop_ = EventLoop::create();
    std::unique_ptr<support::Program> daemon_;
    std::vector<std::string> lines_;
    std::unique_ptr<BusLogind> logind_;

    sd_bus* bus_ = nullptr;
    std::map<std::string, Session> sessions_;
    std::optional<MonotonicTime> started_;
    bool isPreparing_ = false;
    bool isRefused_ = false;
    bool isFailing_ = false;
    unsigned questions_ = 0;
    unsigned delaysAsked_ = 0;
    base::FileDescriptor delay_;
};

} // namespace keystrand::sessions
