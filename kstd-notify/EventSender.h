#pragma once

#include "base/FileDescriptor.h"
#include "kstd-notify/Notice.h"

#include <chrono>
#include <string>

namespace notify {

/// Sends events to the daemon's socket. What was sent is handled by the running daemon, or launches
/// one.
class EventSender {
  public:
    /// `patience` is how long one event waits for room in the socket's queue.
    EventSender(std::string socketPath, std::chrono::milliseconds patience);

    /// Why it was not sent; empty when it was.
    [[nodiscard]] std::string send(const Notice& notice);

  private:
    std::string path_;
    base::FileDescriptor socket_;
};

} // namespace notify
