#pragma once

#include "base/FileDescriptor.h"
#include "platform/SystemLog.h"
#include "platform/linux/LinuxRunLoop.h"
#include "wire/EventDatagram.h"

#include <array>
#include <cstdint>
#include <functional>
#include <memory>
#include <string>
#include <sys/types.h>

namespace platform {

/// Receives events from a datagram socket, one in each turn of the run loop, and hands them on.
///
/// Only root and the owner of the socket may send. What comes from anybody else, is too large or
/// malformed is dropped with a log line. When the system refuses to hand a datagram over it stays
/// in the queue, and is asked for again after a second. Nothing is read ahead: a datagram is either
/// in the socket's queue, which outlives the process, or handed on.
class EventSocket {
  public:
    using Receiver = std::function<void(const wire::EventDatagram&)>;

    EventSocket(base::FileDescriptor socket, LinuxRunLoop& loop, SystemLog& log, Receiver receiver);

  private:
    void receiveOne();
    void pauseAfter(int error);
    void handOn(const std::uint8_t* data, std::size_t length);
    [[nodiscard]] bool mayServe(uid_t sender) const;

    base::FileDescriptor socket_;
    SystemLog& log_;
    Receiver receiver_;
    uid_t owner_;
    std::array<std::uint8_t, wire::kEventMaxSize> buffer_{};
    std::unique_ptr<RunLoopSource> source_;
    /// Ends a pause.
    std::unique_ptr<RunLoopSource> pause_;
    /// Why nothing could be received last; 0 when something was.
    int failure_ = 0;
};

/// The event socket that the init system or a supervisor handed to this process under the name
/// "events", or none.
[[nodiscard]] base::FileDescriptor takeActivatedEventSocket();

/// A new event socket at `path`, mode 0600, in the place of a file that stands there. For a program
/// that runs without an init system; what is queued in it is lost with the process.
[[nodiscard]] base::FileDescriptor makeEventSocket(const std::string& path);

} // namespace platform
