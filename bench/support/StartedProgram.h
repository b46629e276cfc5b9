#pragma once

#include "base/FileDescriptor.h"
#include "base/NotCopied.h"

#include <string>
#include <string_view>
#include <sys/types.h>
#include <vector>

namespace bench {

/// A program that runs as long as this lives, and is killed then. What it writes to its standard
/// output and standard error is read by awaitText alone.
class StartedProgram : private base::NotCopied {
  public:
    /// Throws when it cannot be started.
    explicit StartedProgram(const std::vector<std::string>& arguments);
    ~StartedProgram();

    [[nodiscard]] pid_t pid() const { return pid_; }

    /// Returns when the text stands in what the program has written. Throws when it ends before.
    void awaitText(std::string_view text);

  private:
    base::FileDescriptor output_;
    std::string written_;
    pid_t pid_ = -1;
};

} // namespace bench
