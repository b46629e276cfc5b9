#pragma once

#include "keystrand/ConnectionTable.h"
#include "keystrand/EventLoop.h"
#include "keystrand/KernelConnection.h"
#include "keystrand/RequestHandler.h"

#include <cstddef>
#include <cstdint>
#include <functional>
#include <memory>
#include <vector>

namespace keystrand {

/// Serves the kernel service's socket to a bounded number of clients.
class KernelSocketServer {
  public:
    static constexpr std::size_t kMaxConnections = 64;

    /// Whether a client that has just connected is served; any other is hung up on.
    using Admits = std::function<bool()>;

    /// Loop and handler outlive the server.
    KernelSocketServer(
        EventLoop& loop, ListeningSocket socket, RequestHandler& handler,
        Admits admits = [] { return true; });

    [[nodiscard]] std::size_t connectionCount() const { return connections_.size(); }

  private:
    using Table = ConnectionTable<KernelConnection>;

    std::unique_ptr<KernelConnection> serve(base::FileDescriptor fd, Table::Ended ended);

    EventLoop& loop_;
    RequestHandler& handler_;
    Admits admits_;
    std::vector<std::uint8_t> packetBuffer_;
    Table connections_;
};

} // namespace keystrand
