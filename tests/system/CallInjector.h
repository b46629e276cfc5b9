#pragma once

#include "base/FileDescriptor.h"
#include "tests/support/SystemCallGate.h"

#include <chrono>
#include <functional>
#include <map>
#include <mutex>
#include <optional>
#include <set>
#include <string>
#include <vector>

namespace system_tests {

/// One system call of a scenario, found again in another run of it.
struct CallPoint {
    std::string program;
    std::string call;
    std::string object;
    /// Among those of the same program, name and object; the first is 1.
    int ordinal = 0;
    /// What it may fail with.
    std::vector<int> errors = {};

    [[nodiscard]] std::string name() const {
        return program + ' ' + call + (object.empty() ? "" : ' ' + object) + " #" +
               std::to_string(ordinal);
    }
};

struct Fault {
    CallPoint point;
    int error = 0;
    /// From there on, until the injector is disarmed, every call of the point's name and object
    /// fails.
    bool lasts = false;
};

/// Watches the system calls of a daemon and of what it starts, and has one of them fail.
///
/// Nothing is counted and nothing fails until it is armed, and again after it was disarmed.
class CallInjector {
  public:
    /// `root` is left out of the objects' names. `eventSocket` is where the daemon's events wait.
    CallInjector(std::string root, int eventSocket, std::optional<Fault> fault = std::nullopt);

    [[nodiscard]] int judge(const support::SystemCall& call);

    /// Whether the daemon has made the first call of its own.
    [[nodiscard]] bool hasBegun() const;

    void arm();
    /// Armed at the daemon's first call of its own, behind those that start any program.
    void armAtMain();
    void disarm();

    enum class Daemon { idle, ended, busy };

    /// Waits until the daemon has handled what was there and waits for more, or has ended, or
    /// patience has.
    [[nodiscard]] Daemon awaitIdle(pid_t daemon, std::chrono::milliseconds patience);

    /// What was called while it was armed, in that order.
    [[nodiscard]] std::vector<CallPoint> points() const;
    /// How often the fault was met.
    [[nodiscard]] int hits() const;

  private:
    [[nodiscard]] std::string shortened(std::string object) const;
    void noteIdle(const support::SystemCall& call);
    [[nodiscard]] int failAt(const CallPoint& point);

    const std::string root_;
    const int eventSocket_;
    const std::optional<Fault> fault_;
    const base::FileDescriptor idleEvent_;
    mutable std::mutex mutex_;
    bool isArmed_ = false;
    bool armsAtMain_ = false;
    bool isIdle_ = false;
    pid_t mainThread_ = -1;
    bool isMet_ = false;
    int hits_ = 0;
    /// Programs whose own calls have begun.
    std::set<std::string> began_;
    std::map<std::string, int> ordinals_;
    std::vector<CallPoint> points_;
};

} // namespace system_tests
