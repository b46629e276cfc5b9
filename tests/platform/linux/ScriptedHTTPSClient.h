#pragma once

#include "base/FileDescriptor.h"
#include "base/NotCopied.h"
#include "base/UnixAddress.h"
#include "wire/HTTPConnection.h"

#include <functional>
#include <poll.h>
#include <stdexcept>
#include <string>
#include <sys/eventfd.h>
#include <sys/socket.h>
#include <thread>
#include <unistd.h>
#include <utility>

namespace support {

/// A socket on which a thread takes one connection after the other and does with each what the test
/// says. What the test's function writes is read after the server's end, or is atomic.
class ConnectionServer : private base::NotCopied {
  public:
    using Serve = std::function<void(base::FileDescriptor)>;

    ConnectionServer(const std::string& path, Serve serve)
        : listener_(::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0)),
          stop_(::eventfd(0, EFD_CLOEXEC)),
          serve_(std::move(serve)) {
        const auto address = base::UnixAddress::of(path);
        ::unlink(path.c_str());
        if (!address || ::bind(listener_.get(), address->get(), address->size()) != 0 ||
            ::listen(listener_.get(), 16) != 0) {
            throw std::runtime_error("cannot listen on " + path);
        }
        thread_ = std::thread([this] { run(); });
    }
    ~ConnectionServer() {
        const std::uint64_t one = 1;
        static_cast<void>(::write(stop_.get(), &one, sizeof one));
        thread_.join();
    }

  private:
    void run() {
        for (;;) {
            pollfd watched[2] = {{listener_.get(), POLLIN, 0}, {stop_.get(), POLLIN, 0}};
            ::poll(watched, 2, -1);
            if ((watched[1].revents & POLLIN) != 0) {
                return;
            }
            serve_(
                base::FileDescriptor(::accept4(listener_.get(), nullptr, nullptr, SOCK_CLOEXEC)));
        }
    }

    base::FileDescriptor listener_;
    base::FileDescriptor stop_;
    Serve serve_;
    std::thread thread_;
};

/// An HTTPS client whose every move a test writes.
class ScriptedHTTPSClient {
  public:
    using Script = std::function<void(wire::HTTPConnection&, int socket)>;

    ScriptedHTTPSClient(const std::string& path, Script script)
        : server_(path, [script = std::move(script)](base::FileDescriptor socket) {
              const int number = socket.get();
              wire::HTTPConnection connection(std::move(socket), std::nullopt);
              script(connection, number);
          }) {}

  private:
    ConnectionServer server_;
};

} // namespace support
