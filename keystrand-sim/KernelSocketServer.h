#pragma once

#include "keystrand-sim/Acceptor.h"
#include "keystrand-sim/EventLoop.h"
#include "keystrand-sim/FaultScript.h"
#include "keystrand-sim/KernelConnection.h"
#include "keystrand-sim/RequestHandler.h"

#include <cstddef>
#include <cstdint>
#include <map>
#include <memory>
#include <vector>

namespace sim {

/// Serves the kernel service's socket to a bounded number of clients; more wait until one has gone.
class KernelSocketServer {
  public:
    static constexpr std::size_t kMaxConnections = 64;

    /// Loop, handler and faults outlive the server.
    KernelSocketServer(EventLoop& loop, ListeningSocket socket, RequestHandler& handler,
                       FaultScript& faults);

    [[nodiscard]] std::size_t connectionCount() const { return connections_.size(); }

  private:
    void take(base::FileDescriptor fd);
    void drop(std::uint64_t id);

    EventLoop& loop_;
    RequestHandler& handler_;
    FaultScript& faults_;
    std::vector<std::uint8_t> packetBuffer_;
    std::uint64_t lastId_ = 0;
    std::map<std::uint64_t, std::unique_ptr<KernelConnection>> connections_;
    Acceptor acceptor_;
};

} // namespace sim
