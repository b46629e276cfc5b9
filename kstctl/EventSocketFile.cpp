#include "kstctl/EventSocketFile.h"

#include "base/UnixAddress.h"
#include "kstctl/FileError.h"

#include <cerrno>
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
    base::FileDescriptor connection(
        ::socket(AF_UNIX, SOCK_DGRAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0));
    if (!connection.isOpen() || ::connect(connection.get(), address->get(), address->size()) != 0) {
        socket.problem = connectionError(socket.path, errno);
    } else {
        socket.connection = std::move(connection);
    }
    return socket;
}

} // namespace kstctl
