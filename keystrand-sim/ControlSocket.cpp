#include "keystrand-sim/ControlSocket.h"

#include <utility>

namespace keystrand::sim {

ControlSocket::ControlSocket(EventLoop& loop, ListeningSocket socket, const ControlContext& context)
    : loop_(loop),
      context_(context),
      connections_(loop, std::move(socket), kMaxConnections,
                   [this](base::FileDescriptor fd, Table::Ended ended) {
                       return serve(std::move(fd), std::move(ended));
                   }) {
    context_.requests.setObserver([this] {
        connections_.forEach([](ControlConnection& connection) { connection.checkWait(); });
    });
}

std::unique_ptr<ControlConnection> ControlSocket::serve(base::FileDescriptor fd,
                                                        Table::Ended ended) {
    return std::make_unique<ControlConnection>(
        loop_, std::move(fd),
        ControlConnection::Handlers{
            .run = [this](std::string_view line) { return runControlLine(context_, line); },
            .isMet = [this](const WaitCondition& wait) { return wait.isMet(context_.requests); },
            .quit = [this] { loop_.stop(); },
            .ended = std::move(ended)});
}

} // namespace keystrand::sim
