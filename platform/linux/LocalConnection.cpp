#include "platform/linux/LocalConnection.h"

#include <algorithm>
#include <cerrno>
#include <sys/socket.h>
#include <sys/time.h>
#include <unistd.h>
#include <utility>

namespace platform {

namespace {

using Clock = std::chrono::steady_clock;

/// 0, or why not. Signals do not lengthen the time.
int connectWithin(int socket, const base::UnixAddress& address, std::chrono::microseconds timeout) {
    const Clock::time_point until = Clock::now() + timeout;
    while (::connect(socket, address.get(), address.size()) != 0) {
        if (errno != EINTR) {
            // What a timeout shows as.
            return errno == EAGAIN ? ETIMEDOUT : errno;
        }
        const auto left =
            std::chrono::duration_cast<std::chrono::microseconds>(until - Clock::now());
        if (left.count() <= 0) {
            return ETIMEDOUT;
        }
        setTimeLimit(socket, SO_SNDTIMEO, left);
    }
    setTimeLimit(socket, SO_SNDTIMEO, timeout);
    return 0;
}

LocalConnection checked(base::FileDescriptor socket) {
    ucred peer{};
    socklen_t length = sizeof peer;
    if (::getsockopt(socket.get(), SOL_SOCKET, SO_PEERCRED, &peer, &length) != 0) {
        return {.error = errno};
    }
    if (peer.uid != 0 && peer.uid != ::geteuid()) {
        return {.error = EPERM, .stranger = peer.uid};
    }
    return {.socket = std::move(socket)};
}

} // namespace

void setTimeLimit(int socket, int option, std::chrono::microseconds time) {
    // No time at all would mean no limit.
    const auto some = std::max(time, std::chrono::microseconds(1));
    const auto seconds = std::chrono::duration_cast<std::chrono::seconds>(some);
    const timeval value{static_cast<time_t>(seconds.count()),
                        static_cast<suseconds_t>((some - seconds).count())};
    ::setsockopt(socket, SOL_SOCKET, option, &value, sizeof value);
}

LocalConnection connectLocally(const base::UnixAddress& address, int type,
                               std::chrono::microseconds timeout) {
    base::FileDescriptor socket(::socket(AF_UNIX, type | SOCK_CLOEXEC, 0));
    if (!socket.isOpen()) {
        return {.error = errno};
    }
    setTimeLimit(socket.get(), SO_SNDTIMEO, timeout);
    setTimeLimit(socket.get(), SO_RCVTIMEO, timeout);
    if (const int error = connectWithin(socket.get(), address, timeout); error != 0) {
        return {.error = error};
    }
    return checked(std::move(socket));
}

LocalConnection connectLocally(std::string_view path, int type, std::chrono::microseconds timeout) {
    const auto address = base::UnixAddress::of(path);
    return address ? connectLocally(*address, type, timeout)
                   : LocalConnection{.error = ENAMETOOLONG};
}

} // namespace platform
