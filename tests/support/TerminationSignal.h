#pragma once

#include "base/NotCopied.h"

#include <csignal>
#include <ctime>
#include <unistd.h>

namespace support {

/// SIGTERM for this process, which something in the test keeps from ending it. Afterwards it is as
/// if there had been none: neither blocked nor pending.
class TerminationSignal : private base::NotCopied {
  public:
    TerminationSignal() {
        ::sigemptyset(&signals_);
        ::sigaddset(&signals_, SIGTERM);
    }
    ~TerminationSignal() {
        const timespec noTime{};
        ::sigtimedwait(&signals_, nullptr, &noTime);
        ::pthread_sigmask(SIG_UNBLOCK, &signals_, nullptr);
    }

    /// To the process as a whole, as from another process.
    static void send() { ::kill(::getpid(), SIGTERM); }

    [[nodiscard]] static bool isBlocked() {
        sigset_t blocked;
        ::pthread_sigmask(SIG_SETMASK, nullptr, &blocked);
        return ::sigismember(&blocked, SIGTERM) == 1;
    }

  private:
    sigset_t signals_{};
};

} // namespace support
