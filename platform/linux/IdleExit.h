#pragma once

#include "platform/ProcessTransaction.h"
#include "platform/linux/LinuxRunLoop.h"

#include <chrono>
#include <functional>
#include <memory>

namespace platform {

/// The count of transactions of this process.
class LinuxProcessTransactions final : public ProcessTransactions {
  public:
    void begin(std::string_view label) override;
    void end(std::string_view label) override;

    [[nodiscard]] bool busy() const { return count_ > 0; }

  private:
    int count_ = 0;
};

/// Ends an idle process: once nothing was in hand for a whole `idleTime`, it calls `closeStreams`,
/// once, and the run loop is left without sources.
class IdleExit {
  public:
    /// Called after each idle time, whatever happened in it.
    using Busy = std::function<bool()>;
    using Close = std::function<void()>;

    IdleExit(LinuxRunLoop& loop, std::chrono::microseconds idleTime, Busy busy, Close closeStreams);

    /// Something happened: the idle time starts anew.
    void touch() { touched_ = true; }

  private:
    void timeIsUp();

    std::chrono::microseconds idleTime_;
    Busy busy_;
    Close closeStreams_;
    bool touched_ = false;
    std::unique_ptr<RunLoopSource> timer_;
};

} // namespace platform
