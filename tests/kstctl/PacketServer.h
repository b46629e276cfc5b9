#pragma once

#include "base/FileDescriptor.h"
#include "base/UnixAddress.h"

#include <functional>
#include <optional>
#include <stdexcept>
#include <string>
#include <sys/socket.h>
#include <thread>
#include <unistd.h>
#include <utility>
#include <vector>

namespace kstctl {

/// A socket whose other end is served by a thread of its own: one client after the other, each as
/// long as it asks. Its file stays when it goes, as that of a killed program does.
class PacketServer {
  public:
    /// None hangs up.
    using Answer = std::function<std::optional<std::string>(const std::string& request)>;
    using Serve = std::function<void(int connection)>;

    /// Answers each packet.
    PacketServer(const std::string& path, Answer answer, int type = SOCK_SEQPACKET)
        : PacketServer(path, type, [this, answer = std::move(answer)](int connection) {
              answerPackets(connection, answer);
          }) {}
    /// Leaves a connection to `serve`.
    PacketServer(const std::string& path, int type, Serve serve)
        : listening_(::socket(AF_UNIX, type | SOCK_CLOEXEC, 0)) {
        const auto address = base::UnixAddress::of(path);
        ::unlink(path.c_str());
        if (::bind(listening_.get(), address->get(), address->size()) != 0 ||
            ::listen(listening_.get(), 8) != 0) {
            throw std::runtime_error("no socket at " + path);
        }
        thread_ = std::thread([this, serve = std::move(serve)] { run(serve); });
    }
    PacketServer(const PacketServer&) = delete;
    PacketServer& operator=(const PacketServer&) = delete;
    ~PacketServer() { static_cast<void>(stop()); }

    /// Ends it, and tells what it was asked.
    std::vector<std::string> stop() {
        if (thread_.joinable()) {
            ::shutdown(listening_.get(), SHUT_RDWR);
            thread_.join();
        }
        listening_.reset();
        return requests_;
    }

  private:
    void run(const Serve& serve) {
        for (;;) {
            const base::FileDescriptor connection(
                ::accept4(listening_.get(), nullptr, nullptr, SOCK_CLOEXEC));
            if (!connection.isOpen()) {
                return;
            }
            serve(connection.get());
        }
    }

    void answerPackets(int connection, const Answer& answer) {
        std::string packet(4096, '\0');
        ssize_t size = 0;
        while ((size = ::recv(connection, packet.data(), packet.size(), 0)) > 0) {
            requests_.push_back(packet.substr(0, static_cast<std::size_t>(size)));
            const auto text = answer(requests_.back());
            if (!text || ::send(connection, text->data(), text->size(), MSG_NOSIGNAL) < 0) {
                return;
            }
        }
    }

    base::FileDescriptor listening_;
    std::vector<std::string> requests_;
    std::thread thread_;
};

} // namespace kstctl
