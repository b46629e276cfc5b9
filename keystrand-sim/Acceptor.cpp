#include "keystrand-sim/Acceptor.h"

#include "keystrand-sim/UnixAddress.h"

#include <cerrno>
#include <chrono>
#include <ctime>
#include <sys/epoll.h>
#include <sys/socket.h>
#include <utility>

namespace sim {

namespace {

constexpr std::chrono::milliseconds kRetryDelay{200};

bool isOutOfRoom(int error) {
    return error == EMFILE || error == ENFILE || error == ENOBUFS || error == ENOMEM;
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
    UniqueFd connection(::accept4(socket_.fd(), nullptr, nullptr, SOCK_CLOEXEC | SOCK_NONBLOCK));
    if (!connection) {
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

} // namespace sim
