#pragma once

#include <cstddef>
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
        address.size_ = static_cast<socklen_t>(offsetof(sockaddr_un, sun_path) + path.size() + 1);
        return address;
    }

    [[nodiscard]] const sockaddr* get() const {
        return reinterpret_cast<const sockaddr*>(&storage_);
    }
    [[nodiscard]] socklen_t size() const { return size_; }
    [[nodiscard]] const char* path() const { return storage_.sun_path; }

  private:
    UnixAddress() { storage_.sun_family = AF_UNIX; }

    sockaddr_un storage_{};
    socklen_t size_ = 0;
};

} // namespace base
