#pragma once

#include <optional>
#include <string>
#include <sys/socket.h>
#include <sys/un.h>

namespace sim {

/// The address of a socket file.
struct UnixAddress {
    sockaddr_un storage{};
    socklen_t length = 0;

    /// None when the path is empty or longer than such an address can hold.
    [[nodiscard]] static std::optional<UnixAddress> of(const std::string& path);

    [[nodiscard]] const sockaddr* get() const {
        return reinterpret_cast<const sockaddr*>(&storage);
    }
};

/// Whether the process at the other end runs as root or as this process's user.
[[nodiscard]] bool isTrustedPeer(int fd);

} // namespace sim
