#pragma once

#include "base/FileDescriptor.h"
#include "base/NotCopied.h"
#include "bench/support/SystemError.h"
#include "platform/SystemLog.h"

#include <fcntl.h>
#include <unistd.h>

namespace bench {

/// Drops every line.
class NullLog final : public platform::SystemLog {
  public:
    void write(platform::LogLevel /*level*/, std::string_view /*text*/,
               const platform::LogFields& /*fields*/) override {}
};

/// Sends standard error to /dev/null until the end of the scope, so that the daemon's own log does
/// all its work and nobody has to read it.
class QuietStandardError : private base::NotCopied {
  public:
    QuietStandardError() : saved_(::fcntl(STDERR_FILENO, F_DUPFD_CLOEXEC, 0)) {
        const base::FileDescriptor nowhere(::open("/dev/null", O_WRONLY | O_CLOEXEC));
        if (!saved_.isOpen() || !nowhere.isOpen() || ::dup2(nowhere.get(), STDERR_FILENO) < 0) {
            throw systemError("cannot send standard error to /dev/null");
        }
    }
    ~QuietStandardError() { ::dup2(saved_.get(), STDERR_FILENO); }

  private:
    base::FileDescriptor saved_;
};

} // namespace bench
