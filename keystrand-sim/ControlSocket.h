#pragma once

#include "keystrand-sim/Acceptor.h"
#include "keystrand-sim/ControlCommand.h"
#include "keystrand-sim/ControlConnection.h"
#include "keystrand-sim/EventLoop.h"

#include <cstddef>
#include <cstdint>
#include <map>
#include <memory>

namespace sim {

/// Serves the control socket to a bounded number of clients; more wait until one has gone.
class ControlSocket {
  public:
    static constexpr std::size_t kMaxConnections = 16;

    /// The loop and all that the context refers to outlive it. Observes the request log.
    ControlSocket(EventLoop& loop, ListeningSocket socket, const ControlContext& context);

  private:
    void take(base::FileDescriptor fd);
    void drop(std::uint64_t id);
    void checkWaits();

    EventLoop& loop_;
    ControlContext context_;
    std::uint64_t lastId_ = 0;
    std::map<std::uint64_t, std::unique_ptr<ControlConnection>> connections_;
    Acceptor acceptor_;
};

} // namespace sim
