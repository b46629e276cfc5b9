#include "keystrand/Acceptor.h"

#include <cerrno>
#include <chrono>
#include <ctime>
#include <sys/epoll.h>
#include <sys/socket.h>
#include <unistd.h>
#include <utility>

namespace keystrand {

namespace {

constexpr std::chrono::milliseconds kRetryDelay{200};

bool isOutOfRoom(int error) {
    return error == EMFILE || error == ENFILE || error == ENOBUFS || error == ENOMEM;
}

/// Whether the process at the other end runs as root or as this process's user.
bool isTrustedPeer(int fd) {
    ucred peer{};
    socklen_t length = sizeof peer;
    if (::getsockopt(fd, SOL_SOCKET, SO_PEERCRED, &peer, &length) != 0) {
        return false;
    }
    return peer.uid == 0 || peer.uid == ::geteuid();
}

} // namespace

Acceptor::Acceptor(EventLoop& loop, ListeningSocket socket, Handler handler)
    : socket_(std::move(socket)),
      handler_(std::move(handler)),
      source_(loop.watch(socket_.fd(), EPOLLIN, [this](std::uint32_t /*events*/) { accept(); })),
      retry_(loop.timer(CLOCK_MONOTONIC, [this] { resume(); })) {}

void Acceptor::pause() {
    source_.disable();
    retry_.disable();
}

void Acceptor::resume() {
    source_.listenFor(EPOLLIN);
}

void Acceptor::accept() {
    base::FileDescriptor connection(
        ::accept4(socket_.fd(), nullptr, nullptr, SOCK_CLOEXEC | SOCK_NONBLOCK));
    if (!connection.isOpen()) {
        if (isOutOfRoom(errno)) {
            pause();
            retry_.expireIn(kRetryDelay);
        }
        return;
    }
    if (isTrustedPeer(connection.get())) {
        handler_(std::move(connection));
    }
}

} // namespace keystrand
