#include "keystrand-sessions/KeystrandLink.h"

#include "base/UnixAddress.h"

#include <array>
#include <cerrno>
#include <cstdint>
#include <string_view>
#include <sys/epoll.h>
#include <sys/socket.h>
#include <utility>

namespace keystrand::sessions {

namespace {

std::string_view textOf(Word word) {
    switch (word) {
    case Word::locked:
        return "locked";
    case Word::unlocked:
        return "unlocked";
    case Word::goingToSleep:
        return "going to sleep";
    case Word::awake:
        return "awake";
    }
    return "locked";
}

constexpr std::string_view kClosed = "closed";

} // namespace

SocketLink::SocketLink(EventLoop& loop, Timers& timers, std::string path)
    : loop_(loop), path_(std::move(path)), backoff_(timers.timer([this] { connect(); })) {}

void SocketLink::start(Handlers handlers) {
    handlers_ = std::move(handlers);
    backoff_->startFor(std::chrono::milliseconds(0));
}

void SocketLink::connect() {
    const auto address = base::UnixAddress::of(path_);
    socket_ =
        base::FileDescriptor(::socket(AF_UNIX, SOCK_SEQPACKET | SOCK_CLOEXEC | SOCK_NONBLOCK, 0));
    if (address && socket_.isOpen() &&
        ::connect(socket_.get(), address->get(), address->size()) == 0) {
        source_ = loop_.watch(socket_.get(), EPOLLIN, [this](std::uint32_t) { receive(); });
    }
    if (!source_) {
        socket_.reset();
        backoff_->startFor(kBackoff);
        return;
    }
    handlers_.connected();
}

void SocketLink::receive() {
    std::array<char, 16> packet{};
    const ssize_t size = ::recv(socket_.get(), packet.data(), packet.size(), MSG_TRUNC);
    if (size < 0 && (errno == EAGAIN || errno == EINTR)) {
        return;
    }
    if (size <= 0) {
        source_ = EventSource();
        socket_.reset();
        backoff_->startFor(kBackoff);
        handlers_.lost();
        return;
    }
    if (std::string_view(packet.data(), std::min(static_cast<std::size_t>(size), packet.size())) ==
        kClosed) {
        handlers_.closed();
    }
}

void SocketLink::say(Word word) {
    const std::string_view text = textOf(word);
    if (isConnected() && ::send(socket_.get(), text.data(), text.size(), MSG_NOSIGNAL) < 0) {
        // The end is then read, and all is said anew on the next connection.
        ::shutdown(socket_.get(), SHUT_RDWR);
    }
}

} // namespace keystrand::sessions
