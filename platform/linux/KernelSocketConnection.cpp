#include "platform/linux/KernelSocketConnection.h"

#include "platform/linux/LocalConnection.h"

#include <algorithm>
#include <array>
#include <cerrno>
#include <cstdint>
#include <cstdio>
#include <cstring>
#include <sys/socket.h>
#include <sys/uio.h>
#include <utility>

namespace platform {

namespace {

constexpr std::size_t kMaxParts = 4;

/// What a timeout of the socket shows as.
int asTimeout(int error) {
    return error == EAGAIN ? ETIMEDOUT : error;
}

bool isPeerGone(Status status) {
    return status == statusFromErrno(EPIPE) || status == statusFromErrno(ECONNRESET) ||
           status == statusFromErrno(ENOTCONN);
}

iovec asVector(std::span<const std::uint8_t> part) {
    // The system only reads from it.
    return {const_cast<std::uint8_t*>(part.data()), part.size()};
}

} // namespace

KernelSocketConnection::Reply::~Reply() {
    if (!received_.empty()) {
        ::explicit_bzero(received_.data(), received_.size());
    }
}

KernelSocketConnection::KernelSocketConnection(std::string path, SystemLog& log,
                                               std::chrono::milliseconds timeout, Greeting greeting)
    : path_(std::move(path)),
      log_(log),
      timeout_(timeout),
      greeting_(std::move(greeting)),
      buffer_(new std::uint8_t[wire::kKernelMessageMaxSize]) {}

Status KernelSocketConnection::fail(int error) {
    disconnect();
    return statusFromErrno(error);
}

Status KernelSocketConnection::connect() {
    if (socket_.isOpen()) {
        return kSuccess;
    }
    const Status opened = openSocket();
    if (opened != kSuccess || !greeting_) {
        return opened;
    }
    const Status greeted = greeting_(*this);
    if (greeted != kSuccess) {
        disconnect();
    }
    return greeted;
}

Status KernelSocketConnection::openSocket() {
    LocalConnection connection = connectLocally(path_, SOCK_SEQPACKET, timeout_);
    if (connection.error == 0) {
        socket_ = std::move(connection.socket);
        return kSuccess;
    }
    if (connection.stranger) {
        // On the stack: a client may have no memory left.
        std::array<char, 256> line;
        const int length = std::snprintf(line.data(), line.size(),
                                         "kstd: KernelSocket: %s is served by user %ju, refused.\n",
                                         path_.c_str(), std::uintmax_t{*connection.stranger});
        log_.write(LogLevel::warning, {line.data(), static_cast<std::size_t>(length)}, {});
    }
    return statusFromErrno(connection.error);
}

Status KernelSocketConnection::exchange(wire::KernelOperation operation, Parts body, Reply& reply) {
    const bool wasConnected = socket_.isOpen();
    Status status = connect();
    if (status == kSuccess) {
        status = send(operation, body);
    }
    if (wasConnected && isPeerGone(status)) {
        // The peer had gone before; nothing of this request reached anybody.
        status = connect();
        if (status == kSuccess) {
            status = send(operation, body);
        }
    }
    return status == kSuccess ? receive(operation, reply) : status;
}

Status KernelSocketConnection::exchangeOnce(wire::KernelOperation operation, Parts body,
                                            Reply& reply) {
    const Status status = send(operation, body);
    return status == kSuccess ? receive(operation, reply) : status;
}

Status KernelSocketConnection::send(wire::KernelOperation operation, Parts body) {
    const auto header = wire::encodeKernelRequestHeader({operation, ++sequence_});
    std::array<iovec, 1 + kMaxParts> vectors{asVector(header)};
    std::size_t count = 1;
    std::size_t size = header.size();
    for (const auto part : body) {
        if (part.size() > wire::kKernelMessageMaxSize - size) {
            return statusFromErrno(EMSGSIZE);
        }
        vectors[count++] = asVector(part);
        size += part.size();
    }
    msghdr message{};
    message.msg_iov = vectors.data();
    message.msg_iovlen = count;
    ssize_t sent = -1;
    do {
        sent = ::sendmsg(socket_.get(), &message, MSG_NOSIGNAL);
    } while (sent < 0 && errno == EINTR);
    if (sent >= 0) {
        return kSuccess;
    }
    // Too large for the system's buffers: nothing was sent and the connection is as it was.
    return errno == EMSGSIZE ? statusFromErrno(EMSGSIZE) : fail(asTimeout(errno));
}

Status KernelSocketConnection::receive(wire::KernelOperation operation, Reply& reply) {
    ssize_t length = -1;
    do {
        length = ::recv(socket_.get(), buffer_.get(), wire::kKernelMessageMaxSize, MSG_TRUNC);
    } while (length < 0 && errno == EINTR);
    if (length < 0) {
        return fail(asTimeout(errno));
    }
    if (length == 0) {
        return fail(ECONNRESET);
    }
    const auto size = static_cast<std::size_t>(length);
    reply.received_ = {buffer_.get(), std::min(size, wire::kKernelMessageMaxSize)};
    if (size > wire::kKernelMessageMaxSize) {
        return fail(EMSGSIZE);
    }
    const auto header = wire::decodeKernelReplyHeader(reply.received_);
    if (!header || header->operation != operation || header->sequence != sequence_) {
        return fail(EPROTO);
    }
    reply.status = header->status;
    reply.reported = header->reported;
    reply.body = reply.received_.subspan(wire::kKernelReplyHeaderSize);
    return kSuccess;
}

} // namespace platform
