#include "keystrand-sim/KernelSocketServer.h"

#include "wire/KernelSocket.h"

#include <utility>

namespace sim {

KernelSocketServer::KernelSocketServer(EventLoop& loop, ListeningSocket socket,
                                       RequestHandler& handler, FaultScript& faults)
    : loop_(loop),
      handler_(handler),
      faults_(faults),
      packetBuffer_(wire::kKernelMessageMaxSize + 1),
      acceptor_(loop, std::move(socket), [this](base::FileDescriptor fd) { take(std::move(fd)); }) {
}

void KernelSocketServer::take(base::FileDescriptor fd) {
    if (faults_.takeRefusal()) {
        return;
    }
    const std::uint64_t id = ++lastId_;
    auto connection = std::make_unique<KernelConnection>(loop_, std::move(fd), handler_,
                                                         packetBuffer_, [this, id] { drop(id); });
    if (!connection->isWatched()) {
        return;
    }
    connections_.emplace(id, std::move(connection));
    if (connections_.size() == kMaxConnections) {
        acceptor_.pause();
    }
}

void KernelSocketServer::drop(std::uint64_t id) {
    connections_.erase(id);
    acceptor_.resume();
}

} // namespace sim
