#include "platform/linux/LocalConnection.h"

#include "base/UnixAddress.h"

#include <cerrno>
#include <sys/socket.h>
#include <sys/time.h>
#include <unistd.h>
#include <utility>

namespace platform {

namespace {

timeval toTimeval(std::chrono::milliseconds time) {
    const auto seconds = std::chrono::duration_cast<std::chrono::seconds>(time);
    const auto rest = std::chrono::duration_cast<std::chrono::microseconds>(time - seconds);
    return {static_cast<time_t>(seconds.count()), static_cast<suseconds_t>(rest.count())};
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

LocalConnection connectLocally(const std::string& path, int type,
                               std::chrono::milliseconds timeout) {
    const auto address = base::UnixAddress::of(path);
    if (!address) {
        return {.error = ENAMETOOLONG};
    }
    base::FileDescriptor socket(::socket(AF_UNIX, type | SOCK_CLOEXEC, 0));
    if (!socket.isOpen()) {
        return {.error = errno};
    }
    const timeval limit = toTimeval(timeout);
    ::setsockopt(socket.get(), SOL_SOCKET, SO_SNDTIMEO, &limit, sizeof limit);
    ::setsockopt(socket.get(), SOL_SOCKET, SO_RCVTIMEO, &limit, sizeof limit);
    int result = -1;
    do {
        result = ::connect(socket.get(), address->get(), address->size());
    } while (result != 0 && errno == EINTR);
    if (result != 0) {
        // What a timeout shows as.
        return {.error = errno == EAGAIN ? ETIMEDOUT : errno};
    }
    return checked(std::move(socket));
}

} // namespace platform
