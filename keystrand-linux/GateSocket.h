#pragma once

#include "keystrand-linux/Keystrand.h"
#include "keystrand/EventLoop.h"
#include "keystrand/ListeningSocket.h"
#include "wire/GateMessages.h"

#include <memory>
#include <string>
#include <string_view>

namespace keystrand::usb {

/// What an administrator asks for.
[[nodiscard]] wire::GateAnswer answer(Keystrand& keystrand, MachineClock& clock,
                                      const wire::GateRequest& request);

/// One tool that asks. It may ask again and again, for each answer it takes.
class GateConnection {
  public:
    using Answer = std::function<std::string(std::string_view packet)>;
    /// Called last of all when the connection has ended; may destroy it.
    using Ended = std::function<void()>;

    /// The loop outlives it.
    GateConnection(EventLoop& loop, base::FileDescriptor fd, const Answer& answer, Ended ended);

    [[nodiscard]] bool isWatched() const { return static_cast<bool>(source_); }

  private:
    void receive();

    base::FileDescriptor fd_;
    const Answer& answer_;
    Ended ended_;
    EventSource source_;
};

/// Serves wire::kGateSocket to root, a few tools at a time. What is no request is answered with a
/// refusal.
class GateSocket {
  public:
    static constexpr std::size_t kMostConnections = 8;

    /// Loop, service and clock outlive it.
    GateSocket(EventLoop& loop, ListeningSocket socket, Keystrand& keystrand, MachineClock& clock);

  private:
    GateConnection::Answer answer_;
    ConnectionTable<GateConnection> connections_;
};

} // namespace keystrand::usb
