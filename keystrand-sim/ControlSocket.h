#pragma once

#include "keystrand-sim/ControlCommand.h"
#include "keystrand-sim/ControlConnection.h"
#include "keystrand/EventLoop.h"
#include "keystrand/ListeningSocket.h"

#include <cstddef>
#include <memory>

namespace keystrand::sim {

/// Serves the control socket to a bounded number of clients.
class ControlSocket {
  public:
    static constexpr std::size_t kMaxConnections = 16;

    /// The loop and all that the context refers to outlive it. Observes the request log.
    ControlSocket(EventLoop& loop, ListeningSocket socket, const ControlContext& context);

  private:
    using Table = ConnectionTable<ControlConnection>;

    std::unique_ptr<ControlConnection> serve(base::FileDescriptor fd, Table::Ended ended);

    EventLoop& loop_;
    ControlContext context_;
    Table connections_;
};

} // namespace keystrand::sim
