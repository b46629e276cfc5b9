#pragma once

#include "base/FileDescriptor.h"

#include <netinet/in.h>
#include <stdexcept>
#include <sys/socket.h>

namespace support {

/// A TCP port of 127.0.0.1 that refuses every connection as long as this lasts.
class UnusedPort {
  public:
    UnusedPort() : socket_(::socket(AF_INET, SOCK_STREAM | SOCK_CLOEXEC, 0)) {
        sockaddr_in address{};
        address.sin_family = AF_INET;
        address.sin_addr.s_addr = htonl(INADDR_LOOPBACK);
        socklen_t size = sizeof address;
        auto* const generic = reinterpret_cast<sockaddr*>(&address);
        if (::bind(socket_.get(), generic, size) != 0 ||
            ::getsockname(socket_.get(), generic, &size) != 0) {
            throw std::runtime_error("no port to be had");
        }
        number_ = ntohs(address.sin_port);
    }

    [[nodiscard]] int number() const { return number_; }

  private:
    base::FileDescriptor socket_;
    int number_ = 0;
};

} // namespace support
