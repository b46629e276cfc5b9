#include "kstctl/status/DaemonSockets.h"

#include "base/UnixAddress.h"
#include "kstctl/ExitStatus.h"

#include <cerrno>
#include <charconv>
#include <fstream>
#include <sstream>
#include <sys/socket.h>
#include <sys/stat.h>

namespace kstctl {

namespace {

constexpr unsigned kPermissionBits = 07777;

platform::Error missingSocket(const std::string& path) {
    return failure(ExitStatus::missing,
                   base::concat("there is no event socket at ", path,
                                "; the daemon is not installed, or its socket was not started"));
}

platform::Error connectionError(const std::string& path, int error) {
    if (error == ECONNREFUSED) {
        return failure(ExitStatus::missing,
                       base::concat("nobody keeps the event socket ", path, " open"));
    }
    if (error == EPROTOTYPE || error == ENOTSOCK) {
        return failure(ExitStatus::malformed, base::concat(path, " is no event socket"));
    }
    return fileError(path, error);
}

} // namespace

EventSocketFile EventSocketFile::look(const platform::Paths& paths) {
    EventSocketFile socket{.path = paths.eventSocket()};
    struct stat status {};
    if (::stat(socket.path.c_str(), &status) != 0) {
        socket.problem = errno == ENOENT || errno == ENOTDIR ? missingSocket(socket.path)
                                                             : fileError(socket.path, errno);
        return socket;
    }
    socket.isPresent = true;
    socket.owner = status.st_uid;
    socket.mode = status.st_mode & kPermissionBits;
    const auto address = base::UnixAddress::of(socket.path);
    if (!address) {
        socket.problem =
            failure(ExitStatus::failed, base::concat(socket.path, ": too long for a socket"));
        return socket;
    }
    if (!S_ISSOCK(status.st_mode)) {
        socket.problem = connectionError(socket.path, ENOTSOCK);
        return socket;
    }
    // Connecting sends nothing: a daemon that waits to be launched by an event is not.
    base::FileDescriptor connection(
        ::socket(AF_UNIX, SOCK_DGRAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0));
    if (!connection.isOpen() || ::connect(connection.get(), address->get(), address->size()) != 0) {
        socket.problem = connectionError(socket.path, errno);
    } else {
        socket.connection = std::move(connection);
    }
    return socket;
}

namespace {

/// Whether two paths lead to the same file.
bool isSameFile(const std::string& one, const struct stat& other) {
    struct stat status {};
    return ::stat(one.c_str(), &status) == 0 && status.st_dev == other.st_dev &&
           status.st_ino == other.st_ino;
}

/// Among a socket's flags, in hexadecimal digits. The connections that a socket has taken bear its
/// path as well, and this alone tells it from them.
bool hasListeningFlag(const std::string& flags) {
    constexpr unsigned kAcceptsConnections = 0x10000;
    constexpr int kHexadecimal = 16;
    unsigned value = 0;
    std::from_chars(flags.data(), flags.data() + flags.size(), value, kHexadecimal);
    return (value & kAcceptsConnections) != 0;
}

} // namespace

std::vector<BoundSocket> socketsBoundTo(const std::string& path) {
    std::vector<BoundSocket> sockets;
    struct stat status {};
    if (::stat(path.c_str(), &status) != 0) {
        return sockets;
    }
    std::ifstream table("/proc/net/unix");
    std::string line;
    std::getline(table, line);
    while (std::getline(table, line)) {
        std::istringstream words(line);
        std::string address;
        std::string users;
        std::string protocol;
        std::string flags;
        std::string type;
        std::string state;
        BoundSocket socket;
        words >> address >> users >> protocol >> flags >> type >> state >> socket.number >> std::ws;
        std::string bound;
        std::getline(words, bound);
        if (bound.starts_with('/') && isSameFile(bound, status)) {
            socket.isListening = hasListeningFlag(flags);
            sockets.push_back(socket);
        }
    }
    return sockets;
}

} // namespace kstctl
