#pragma once

#include "keystrand-sim/ConnectionTable.h"
#include "keystrand-sim/EventLoop.h"
#include "keystrand-sim/FaultScript.h"
#include "keystrand-sim/KernelConnection.h"
#include "keystrand-sim/RequestHandler.h"

#include <cstddef>
#include <cstdint>
#include <memory>
#include <vector>

namespace sim {

/// Serves the kernel service's socket to a bounded number of clients.
class KernelSocketServer {
  public:
    static constexpr std::size_t kMaxConnections = 64;

    /// Loop, handler and faults outlive the server.
    KernelSocketServer(EventLoop& loop, ListeningSocket socket, RequestHandler& handler,
                       FaultScript& faults);

    [[nodiscard]] std::size_t connectionCount() const { return connections_.size(); }

  private:
    using Table = ConnectionTable<KernelConnection>;

    std::unique_ptr<KernelConnection> serve(base::FileDescriptor fd, Table::Ended ended);

    EventLoop& loop_;
    RequestHandler& handler_;
    FaultScript& faults_;
    std::vector<std::uint8_t> packetBuffer_;
    Table connections_;
};

} // namespace sim
