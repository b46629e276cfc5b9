#include "keystrand-sim/UnixAddress.h"

#include <cstddef>
#include <cstring>
#include <unistd.h>

namespace sim {

std::optional<UnixAddress> UnixAddress::of(const std::string& path) {
    UnixAddress address;
    if (path.empty() || path.size() >= sizeof address.storage.sun_path) {
        return std::nullopt;
    }
    address.storage.sun_family = AF_UNIX;
    std::memcpy(address.storage.sun_path, path.c_str(), path.size() + 1);
    address.length = static_cast<socklen_t>(offsetof(sockaddr_un, sun_path) + path.size() + 1);
    return address;
}

bool isTrustedPeer(int fd) {
    ucred peer{};
    socklen_t length = sizeof peer;
    if (::getsockopt(fd, SOL_SOCKET, SO_PEERCRED, &peer, &length) != 0) {
        return false;
    }
    return peer.uid == 0 || peer.uid == ::geteuid();
}

} // namespace sim
