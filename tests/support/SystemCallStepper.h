#pragma once

#include "base/NotCopied.h"

#include <cstdint>
#include <optional>
#include <sys/types.h>

namespace support {

/// Holds a running program at its system calls, one stop before and one after each.
class SystemCallStepper : private base::NotCopied {
  public:
    /// Stops the program where it is. It must be a child of this process.
    explicit SystemCallStepper(pid_t program);
    /// Lets the program go if it still runs.
    ~SystemCallStepper();

    struct Stop {
        /// Before the system call; otherwise after it.
        bool isEntry = false;
        /// Only before it.
        std::uint64_t number = 0;
    };

    /// Lets the program run to its next stop; none when it has ended.
    std::optional<Stop> next();

    /// Ends the program with SIGKILL where it stands.
    void kill();

  private:
    [[nodiscard]] bool waitForStop();

    pid_t program_;
    bool stopped_ = false;
};

} // namespace support
