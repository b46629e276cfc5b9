#pragma once

#include <cstring>
#include <optional>
#include <string_view>
#include <sys/socket.h>
#include <sys/un.h>

namespace base {

/// The address of a Unix socket's file.
class UnixAddress {
  public:
    /// None when the path is empty or longer than such an address can hold.
    [[nodiscard]] static std::optional<UnixAddress> of(std::string_view path) {
        UnixAddress address;
        if (path.empty() || path.size() >= sizeof address.storage_.sun_path) {
            return std::nullopt;
        }
        std::memcpy(address.storage_.sun_path, path.data(), path.size());
        return address;
    }

    [[nodiscard]] const sockaddr* get() const {
        return reinterpret_cast<const sockaddr*>(&storage_);
    }
    [[nodiscard]] static constexpr socklen_t size() { return sizeof(sockaddr_un); }

  private:
    UnixAddress() { storage_.sun_family = AF_UNIX; }

    sockaddr_un storage_{};
};

} // namespace base
