#pragma once

#include <cstring>
#include <optional>
#include <string_view>
#include <sys/socket.h>
#include <sys/un.h>

namespace platform {

/// The address of a Unix socket, or none when the path is too long for one.
[[nodiscard]] inline std::optional<sockaddr_un> unixAddress(std::string_view path) {
    sockaddr_un address{};
    address.sun_family = AF_UNIX;
    if (path.empty() || path.size() >= sizeof address.sun_path) {
        return std::nullopt;
    }
    std::memcpy(address.sun_path, path.data(), path.size());
    return address;
}

} // namespace platform
