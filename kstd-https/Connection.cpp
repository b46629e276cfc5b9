#include "kstd-https/Connection.h"

#include "base/Concat.h"
#include "wire/HTTPMessages.h"

#include <fcntl.h>
#include <sys/socket.h>
#include <unistd.h>

namespace https {

namespace {

bool hasOption(int socket, int option, int wanted) {
    int value = -1;
    socklen_t size = sizeof value;
    return ::getsockopt(socket, SOL_SOCKET, option, &value, &size) == 0 && value == wanted;
}

bool isLocalConnection(int socket) {
    sockaddr_storage peer{};
    socklen_t size = sizeof peer;
    return hasOption(socket, SO_DOMAIN, AF_UNIX) && hasOption(socket, SO_TYPE, SOCK_STREAM) &&
           ::getpeername(socket, reinterpret_cast<sockaddr*>(&peer), &size) == 0;
}

} // namespace

base::FileDescriptor takeConnection(std::string& reason) {
    constexpr int kSocket = wire::kHTTPConnectionDescriptor;
    if (!isLocalConnection(kSocket)) {
        reason = base::concat("descriptor ", kSocket, " is no connection of a local stream socket");
        return base::FileDescriptor();
    }
    base::FileDescriptor connection(kSocket);
    ::fcntl(kSocket, F_SETFD, FD_CLOEXEC);
    ucred peer{};
    socklen_t size = sizeof peer;
    if (::getsockopt(kSocket, SOL_SOCKET, SO_PEERCRED, &peer, &size) != 0 ||
        (peer.uid != 0 && peer.uid != ::geteuid())) {
        reason = base::concat("refused a connection of user ", peer.uid);
        return base::FileDescriptor();
    }
    return connection;
}

} // namespace https
