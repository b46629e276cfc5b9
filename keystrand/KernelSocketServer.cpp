#include "keystrand/KernelSocketServer.h"

#include "wire/KernelSocket.h"

#include <utility>

namespace keystrand {

KernelSocketServer::KernelSocketServer(EventLoop& loop, ListeningSocket socket,
                                       RequestHandler& handler, Admits admits)
    : loop_(loop),
      handler_(handler),
      admits_(std::move(admits)),
      packetBuffer_(wire::kKernelMessageMaxSize + 1),
      connections_(loop, std::move(socket), kMaxConnections,
                   [this](base::FileDescriptor fd, Table::Ended ended) {
                       return serve(std::move(fd), std::move(ended));
                   }) {}

std::unique_ptr<KernelConnection> KernelSocketServer::serve(base::FileDescriptor fd,
                                                            Table::Ended ended) {
    if (!admits_()) {
        return nullptr;
    }
    return std::make_unique<KernelConnection>(loop_, std::move(fd), handler_, packetBuffer_,
                                              std::move(ended));
}

} // namespace keystrand
