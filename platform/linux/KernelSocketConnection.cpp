#include "platform/linux/KernelSocketConnection.h"

#include "platform/MessageClasses.h"
#include "platform/linux/LocalConnection.h"

#include <algorithm>
#include <array>
#include <cerrno>
#include <cstdio>
#include <poll.h>
#include <string.h>
#include <sys/mman.h>
#include <sys/socket.h>
#include <sys/uio.h>
#include <utility>

namespace platform {

namespace {

using std::chrono::duration_cast;
using std::chrono::microseconds;
using std::chrono::nanoseconds;
using Clock = std::chrono::steady_clock;

constexpr std::size_t kMaxParts = 4;

bool isPeerGone(Status status) {
    return status == statusFromErrno(EPIPE) || status == statusFromErrno(ECONNRESET) ||
           status == statusFromErrno(ENOTCONN);
}

iovec asVector(std::span<const std::uint8_t> part) {
    // The system only reads from it.
    return {const_cast<std::uint8_t*>(part.data()), part.size()};
}

/// How long one blocking receive may last. It saves the system call that waiting exactly costs: an
/// answer in that time, which leaves room for the system's late timers, needs none.
microseconds blockingTime(std::chrono::milliseconds timeout) {
    return duration_cast<microseconds>(timeout) / 2;
}

} // namespace

MessagePages::~MessagePages() {
    if (pages_ != nullptr) {
        ::munmap(pages_, sizeof(Pages));
    }
}

bool MessagePages::obtain() {
    if (pages_ != nullptr) {
        return true;
    }
    void* const pages =
        ::mmap(nullptr, sizeof(Pages), PROT_READ | PROT_WRITE, MAP_PRIVATE | MAP_ANONYMOUS, -1, 0);
    if (pages == MAP_FAILED) {
        return false;
    }
    ::madvise(pages, sizeof(Pages), MADV_WIPEONFORK);
    pages_ = static_cast<Pages*>(pages);
    return true;
}

KernelSocketConnection::Reply::~Reply() {
    if (!received_.empty()) {
        ::explicit_bzero(received_.data(), received_.size());
    }
}

void KernelSocketConnection::disconnect() {
    socket_.reset();
    expired_ = false;
}

void KernelSocketConnection::setDeadline(std::optional<Deadline> deadline) {
    deadline_ = deadline;
    if (!deadline_ && expired_) {
        disconnect();
    }
}

void KernelSocketConnection::leaveToParent() {
    disconnect();
    sequence_ = 0;
}

void KernelSocketConnection::begin() {
    if (isInherited()) {
        leaveToParent();
    }
    until_ = deadline_.value_or(Clock::now() + timeout_);
}

bool KernelSocketConnection::isTimeUp() const {
    return Clock::now() >= until_;
}

Status KernelSocketConnection::fail(int error) {
    if (error == ETIMEDOUT && deadline_ && waits_) {
        expired_ = true;
    } else {
        disconnect();
    }
    return statusFromErrno(error);
}

Status KernelSocketConnection::connect() {
    begin();
    if (expired_) {
        disconnect();
    }
    return connectAndGreet();
}

Status KernelSocketConnection::connectAndGreet() {
    if (socket_.isOpen()) {
        return kSuccess;
    }
    const Status opened = openSocket();
    if (opened != kSuccess) {
        return opened;
    }
    const Status greeted = greet();
    if (greeted != kSuccess) {
        disconnect();
    }
    return greeted;
}

Status KernelSocketConnection::openSocket() {
    std::optional<uid_t> stranger;
    const Status status = connectSocket(stranger);
    if (std::exchange(connectStatus_, status) != status && status != kSuccess) {
        tell(status, stranger);
    }
    return status;
}

/// The line is made on the stack: a client may have no memory left.
void KernelSocketConnection::tell(Status status, std::optional<uid_t> stranger) {
    // A program's name, a socket's path, the system's words.
    std::array<char, 512> line;
    const int nameSize = static_cast<int>(program_.size());
    const int size = stranger
                         ? std::snprintf(line.data(), line.size(),
                                         "%.*s: KernelSocket: %s is served by user %u, refused.\n",
                                         nameSize, program_.data(), path().data(), *stranger)
                         : std::snprintf(line.data(), line.size(),
                                         "%.*s: KernelSocket: cannot connect to %s: %s.\n",
                                         nameSize, program_.data(), path().data(),
                                         ::strerrordesc_np(errnoFromStatus(status)));
    const auto written = std::min(static_cast<std::size_t>(std::max(size, 0)), line.size() - 1);
    log_.write(LogLevel::warning, {line.data(), written},
               {.messageId =
                    stranger ? message::kKernelServiceNotTrusted : message::kKernelServiceFailed});
}

Status KernelSocketConnection::connectSocket(std::optional<uid_t>& stranger) {
    if (!address_) {
        return statusFromErrno(ENAMETOOLONG);
    }
    if (!pages_.obtain()) {
        return statusFromErrno(ENOMEM);
    }
    const auto left = duration_cast<microseconds>(until_ - Clock::now());
    if (waits_ && left.count() <= 0) {
        return statusFromErrno(ETIMEDOUT);
    }
    // An eighth is how late the system's timer may be.
    LocalConnection connection =
        connectLocally(*address_, SOCK_SEQPACKET | (waits_ ? 0 : SOCK_NONBLOCK), left - left / 8);
    if (connection.error == 0) {
        socket_ = std::move(connection.socket);
        setTimeLimit(socket_.get(), SO_RCVTIMEO, blockingTime(timeout_));
        pages_.setMark();
        return kSuccess;
    }
    stranger = connection.stranger;
    return statusFromErrno(connection.error);
}

Status KernelSocketConnection::exchange(wire::KernelOperation operation, Parts body, Reply& reply) {
    begin();
    if (expired_) {
        disconnect();
    }
    if (isTimeUp()) {
        return statusFromErrno(ETIMEDOUT);
    }
    const Status status = handOver(operation, body);
    return status == kSuccess ? receive(operation, reply) : status;
}

Status KernelSocketConnection::post(wire::KernelOperation operation, Parts body) {
    begin();
    waits_ = false;
    const Status status = handOver(operation, body);
    waits_ = true;
    dropReplies();
    disconnect();
    return status;
}

void KernelSocketConnection::dropReplies() {
    // A socket that is closed with a reply in it looks to the peer like an error, which it may take
    // for the end before it has read the request.
    ::shutdown(socket_.get(), SHUT_RD);
    std::uint8_t first = 0;
    while (::recv(socket_.get(), &first, sizeof first, MSG_DONTWAIT) > 0) {
    }
    ::explicit_bzero(&first, sizeof first);
}

Status KernelSocketConnection::handOver(wire::KernelOperation operation, Parts body) {
    const bool wasConnected = socket_.isOpen();
    Status status = connectAndGreet();
    if (status == kSuccess) {
        status = send(operation, body);
    }
    if (wasConnected && isPeerGone(status)) {
        // The peer had gone before; nothing of this request reached anybody.
        status = connectAndGreet();
        if (status == kSuccess) {
            status = send(operation, body);
        }
    }
    return status;
}

Status KernelSocketConnection::exchangeOnce(wire::KernelOperation operation, Parts body,
                                            Reply& reply) {
    const Status status = send(operation, body);
    return status == kSuccess && waits_ ? receive(operation, reply) : status;
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
    while (::sendmsg(socket_.get(), &message, MSG_NOSIGNAL | MSG_DONTWAIT) < 0) {
        const int error = errno;
        if (error == EMSGSIZE) {
            // Too large for the system's buffers: nothing was sent, the connection is as it was.
            return statusFromErrno(EMSGSIZE);
        }
        if (error == EAGAIN && (!waits_ || !await(POLLOUT))) {
            return fail(ETIMEDOUT);
        }
        if (error != EAGAIN && error != EINTR) {
            return fail(error);
        }
    }
    return kSuccess;
}

bool KernelSocketConnection::await(short events) const {
    for (;;) {
        pollfd watched{socket_.get(), events, 0};
        const auto left =
            std::max(duration_cast<nanoseconds>(until_ - Clock::now()), nanoseconds(0));
        const auto seconds = duration_cast<std::chrono::seconds>(left);
        const timespec time{static_cast<time_t>(seconds.count()),
                            static_cast<long>((left - seconds).count())};
        const int ready = ::ppoll(&watched, 1, &time, nullptr);
        if (ready > 0) {
            return true;
        }
        if (isTimeUp() || (ready < 0 && errno != EINTR)) {
            return false;
        }
    }
}

ssize_t KernelSocketConnection::receiveMessage() {
    // The quarter leaves room for a timer that is late.
    bool blocks = until_ - Clock::now() >= blockingTime(timeout_) * 5 / 4;
    for (;;) {
        if (!blocks && !await(POLLIN)) {
            errno = ETIMEDOUT;
            return -1;
        }
        const ssize_t length = ::recv(socket_.get(), pages_.message(), wire::kKernelMessageMaxSize,
                                      MSG_TRUNC | (blocks ? 0 : MSG_DONTWAIT));
        if (length >= 0 || (errno != EAGAIN && errno != EINTR)) {
            return length;
        }
        blocks = false;
    }
}

Status KernelSocketConnection::receive(wire::KernelOperation operation, Reply& reply) {
    const ssize_t length = receiveMessage();
    if (length < 0) {
        return fail(errno);
    }
    if (length == 0) {
        return fail(ECONNRESET);
    }
    const auto size = static_cast<std::size_t>(length);
    reply.received_ = {pages_.message(), std::min(size, wire::kKernelMessageMaxSize)};
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
