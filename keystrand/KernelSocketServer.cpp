#include "keystrand/KernelSocketServer.h"

#include "wire/KernelSocket.h"

#include <cerrno>
#include <ctime>
#include <string.h>
#include <sys/epoll.h>
#include <sys/socket.h>
#include <utility>

namespace keystrand {

KernelConnection::KernelConnection(EventLoop& loop, base::FileDescriptor fd,
                                   RequestHandler& handler, std::span<std::uint8_t> packetBuffer,
                                   Ended ended)
    : fd_(std::move(fd)),
      handler_(handler),
      packetBuffer_(packetBuffer),
      ended_(std::move(ended)),
      source_(loop.watch(fd_.get(), EPOLLIN, [this](std::uint32_t events) { onReady(events); })),
      delay_(loop.timer(CLOCK_MONOTONIC, [this] { endUnless(sendReply()); })) {}

void KernelConnection::onReady(std::uint32_t events) {
    if ((events & EPOLLIN) != 0) {
        endUnless(receive());
    } else if ((events & EPOLLOUT) != 0) {
        endUnless(sendReply());
    } else if (!reply_.empty()) {
        dropReply();
    } else {
        endUnless(Alive::no);
    }
}

KernelConnection::Alive KernelConnection::receive() {
    const ssize_t size =
        ::recv(fd_.get(), packetBuffer_.data(), packetBuffer_.size(), MSG_DONTWAIT);
    if (size < 0) {
        // The client left a reply unread. What it had sent before can be read all the same.
        return errno == EAGAIN || errno == EINTR || errno == ECONNRESET ? Alive::yes : Alive::no;
    }
    if (size == 0) {
        return Alive::no;
    }
    const auto packet = packetBuffer_.first(static_cast<std::size_t>(size));
    RequestOutcome outcome = handler_.handle(packet, state_);
    // There may be a credential in it.
    ::explicit_bzero(packet.data(), packet.size());
    return carryOut(std::move(outcome));
}

KernelConnection::Alive KernelConnection::carryOut(RequestOutcome outcome) {
    afterwards_ = std::move(outcome.afterwards);
    switch (outcome.kind) {
    case RequestOutcome::Kind::hangUp:
        return Alive::no;
    case RequestOutcome::Kind::silence:
        doAfterwards();
        return Alive::yes;
    case RequestOutcome::Kind::reply:
        break;
    }
    reply_ = std::move(outcome.packet);
    if (outcome.delay.count() == 0) {
        return sendReply();
    }
    source_.listenFor(0);
    delay_.expireIn(outcome.delay);
    return Alive::yes;
}

KernelConnection::Alive KernelConnection::sendReply() {
    const ssize_t size =
        ::send(fd_.get(), reply_.data(), reply_.size(), MSG_DONTWAIT | MSG_NOSIGNAL);
    if (size >= 0) {
        reply_.clear();
        source_.listenFor(EPOLLIN);
        doAfterwards();
        return Alive::yes;
    }
    if (errno == EPIPE || errno == ECONNRESET) {
        dropReply();
        return Alive::yes;
    }
    if (errno != EAGAIN && errno != EINTR && errno != ENOBUFS) {
        return Alive::no;
    }
    source_.listenFor(EPOLLOUT);
    return Alive::yes;
}

/// The client is gone, and what it had sent before is still carried out.
void KernelConnection::dropReply() {
    delay_.disable();
    reply_.clear();
    source_.listenFor(EPOLLIN);
    doAfterwards();
}

void KernelConnection::doAfterwards() {
    if (const auto afterwards = std::exchange(afterwards_, nullptr)) {
        afterwards();
    }
}

void KernelConnection::endUnless(Alive alive) {
    if (alive == Alive::no) {
        doAfterwards();
        const Ended ended = ended_;
        ended();
    }
}

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
