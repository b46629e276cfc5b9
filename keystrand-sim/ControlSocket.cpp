#include "keystrand-sim/ControlSocket.h"

#include <utility>

namespace sim {

ControlSocket::ControlSocket(EventLoop& loop, ListeningSocket socket, const ControlContext& context)
    : loop_(loop),
      context_(context),
      acceptor_(loop, std::move(socket), [this](base::FileDescriptor fd) { take(std::move(fd)); }) {
    context_.requests.setObserver([this] { checkWaits(); });
}

void ControlSocket::take(base::FileDescriptor fd) {
    const std::uint64_t id = ++lastId_;
    auto connection = std::make_unique<ControlConnection>(
        loop_, std::move(fd),
        ControlConnection::Handlers{
            .run = [this](std::string_view line) { return runControlLine(context_, line); },
            .isMet = [this](const WaitCondition& wait) { return wait.isMet(context_.requests); },
            .quit = [this] { loop_.stop(); },
            .ended =
                [this, id] {
                    drop(id);
                }});
    if (!connection->isWatched()) {
        return;
    }
    connections_.emplace(id, std::move(connection));
    if (connections_.size() == kMaxConnections) {
        acceptor_.pause();
    }
}

void ControlSocket::drop(std::uint64_t id) {
    connections_.erase(id);
    acceptor_.resume();
}

void ControlSocket::checkWaits() {
    for (auto it = connections_.begin(); it != connections_.end();) {
        // The check may end the connection and so take it out of the map.
        ControlConnection& connection = *it->second;
        ++it;
        connection.checkWait();
    }
}

} // namespace sim
