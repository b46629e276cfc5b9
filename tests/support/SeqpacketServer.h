#pragma once

#include "base/NotCopied.h"

#include <cstdint>
#include <functional>
#include <poll.h>
#include <stdexcept>
#include <string>
#include <sys/eventfd.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <thread>
#include <unistd.h>
#include <utility>
#include <vector>

namespace support {

using Packet = std::vector<std::uint8_t>;

/// A peer on a SOCK_SEQPACKET socket whose every move a test writes: it hands each connection to
/// the test's function, on a thread for each. What the function writes is read after the server's
/// end, or is atomic.
class SeqpacketServer : private base::NotCopied {
  public:
    /// One connection, seen from the server.
    class Peer {
      public:
        explicit Peer(int socket, int stop) : socket_(socket), stop_(stop) {}

        /// The next packet; empty when the client hung up or the test ended.
        [[nodiscard]] Packet receive() const {
            pollfd watched[2] = {{socket_, POLLIN, 0}, {stop_, POLLIN, 0}};
            ::poll(watched, 2, -1);
            if ((watched[0].revents & (POLLIN | POLLHUP)) == 0) {
                return {};
            }
            Packet packet(1 << 18);
            const ssize_t length = ::recv(socket_, packet.data(), packet.size(), 0);
            packet.resize(length > 0 ? static_cast<std::size_t>(length) : 0);
            return packet;
        }

        void send(const Packet& packet) const {
            ::send(socket_, packet.data(), packet.size(), MSG_NOSIGNAL);
        }

        /// Does nothing until the client hangs up or the test ends.
        void stayingSilent() const {
            while (!receive().empty()) {
            }
        }

      private:
        int socket_;
        int stop_;
    };

    using Serve = std::function<void(const Peer&)>;

    SeqpacketServer(const std::string& path, Serve serve)
        : listener_(::socket(AF_UNIX, SOCK_SEQPACKET | SOCK_CLOEXEC, 0)),
          stop_(::eventfd(0, EFD_CLOEXEC)),
          serve_(std::move(serve)) {
        sockaddr_un address{};
        address.sun_family = AF_UNIX;
        path.copy(address.sun_path, sizeof address.sun_path - 1);
        ::unlink(path.c_str());
        if (::bind(listener_, reinterpret_cast<const sockaddr*>(&address), sizeof address) != 0 ||
            ::listen(listener_, 16) != 0) {
            throw std::runtime_error("cannot listen on " + path);
        }
        thread_ = std::thread([this] { run(); });
    }
    ~SeqpacketServer() {
        const std::uint64_t one = 1;
        static_cast<void>(::write(stop_, &one, sizeof one));
        thread_.join();
        ::close(listener_);
        ::close(stop_);
    }

  private:
    void run() {
        for (;;) {
            pollfd watched[2] = {{listener_, POLLIN, 0}, {stop_, POLLIN, 0}};
            ::poll(watched, 2, -1);
            if ((watched[1].revents & POLLIN) != 0) {
                break;
            }
            const int socket = ::accept4(listener_, nullptr, nullptr, SOCK_CLOEXEC);
            connections_.emplace_back([this, socket] {
                serve_(Peer(socket, stop_));
                ::close(socket);
            });
        }
        for (std::thread& connection : connections_) {
            connection.join();
        }
    }

    int listener_;
    int stop_;
    Serve serve_;
    std::vector<std::thread> connections_;
    std::thread thread_;
};

} // namespace support
