#include "kstd-notify/EventSender.h"

#include "base/UnixAddress.h"
#include "wire/EventDatagram.h"

#include <cerrno>
#include <sys/socket.h>
#include <sys/time.h>
#include <system_error>
#include <utility>

namespace notify {

namespace {

/// A socket that waits for room, but not for ever.
base::FileDescriptor patientSocket(std::chrono::milliseconds patience) {
    base::FileDescriptor socket(::socket(AF_UNIX, SOCK_DGRAM | SOCK_CLOEXEC, 0));
    const auto seconds = std::chrono::duration_cast<std::chrono::seconds>(patience);
    const timeval time{seconds.count(), std::chrono::microseconds(patience - seconds).count()};
    if (socket.isOpen() &&
        ::setsockopt(socket.get(), SOL_SOCKET, SO_SNDTIMEO, &time, sizeof time) != 0) {
        socket.reset();
    }
    return socket;
}

std::string reasonFor(int error) {
    return error == EAGAIN ? "the daemon takes no events, its queue is full"
                           : std::generic_category().message(error);
}

} // namespace

EventSender::EventSender(std::string socketPath, std::chrono::milliseconds patience)
    : path_(std::move(socketPath)), socket_(patientSocket(patience)) {}

std::string EventSender::send(const Notice& notice) {
    const auto datagram = wire::encodeEvent(notice.stream, notice.name, notice.payload);
    const auto address = base::UnixAddress::of(path_);
    if (!datagram || !address) {
        return datagram ? "the socket's path is too long" : "the event's name does not fit";
    }
    if (!socket_.isOpen()) {
        return "there is no socket to send from";
    }
    ssize_t sent = -1;
    do {
        sent = ::sendto(socket_.get(), datagram->data(), datagram->size(), MSG_NOSIGNAL,
                        address->get(), address->size());
    } while (sent < 0 && errno == EINTR);
    return sent < 0 ? reasonFor(errno) : std::string();
}

} // namespace notify
