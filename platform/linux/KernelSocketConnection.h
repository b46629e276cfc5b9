#pragma once

#include "base/FileDescriptor.h"
#include "platform/Status.h"
#include "platform/SystemLog.h"
#include "wire/KernelSocket.h"

#include <chrono>
#include <cstddef>
#include <cstdint>
#include <functional>
#include <initializer_list>
#include <memory>
#include <span>
#include <string>

namespace platform {

/// How long a kernel side may take to accept a request or to answer it.
inline constexpr std::chrono::milliseconds kKernelTimeout{5000};

/// One connection to the kernel service's socket: a request out, its reply in, strictly in turn.
///
/// It connects when a request needs it, also anew after the peer was restarted, as long as the
/// request was not handed over; a request that was is never sent again. Whatever leaves it in doubt
/// which reply would come next (no answer in time, a hang-up, a reply that is malformed, too long
/// or of another request) ends the connection. The peer must run as root or as this process's user.
class KernelSocketConnection {
  public:
    /// What a request's bytes are put together from; sent without a copy.
    using Parts = std::initializer_list<std::span<const std::uint8_t>>;

    /// A reply, which points into the connection's buffer until the next exchange. Its bytes are
    /// wiped when it goes, since they may be secret.
    class Reply {
      public:
        Reply() = default;
        Reply(const Reply&) = delete;
        Reply& operator=(const Reply&) = delete;
        ~Reply();

        /// The kernel side's word on the request.
        Status status = kSuccess;
        std::uint32_t reported = 0;
        std::span<const std::uint8_t> body;

      private:
        friend class KernelSocketConnection;
        std::span<std::uint8_t> received_;
    };

    /// Sends what a fresh connection needs before its first request, through `exchangeOnce`.
    using Greeting = std::function<Status(KernelSocketConnection&)>;

    KernelSocketConnection(std::string path, SystemLog& log, std::chrono::milliseconds timeout,
                           Greeting greeting = nullptr);

    /// Connects if that is not done. A status other than 0 is the platform's or the greeting's.
    [[nodiscard]] Status connect();

    /// Sends the request and waits for its reply. 0 when a well-formed reply to this very request
    /// is there, whatever status it carries; else a platform status and no reply.
    [[nodiscard]] Status exchange(wire::KernelOperation operation, Parts body, Reply& reply);

    /// The same on the connection as it is: for the greeting.
    [[nodiscard]] Status exchangeOnce(wire::KernelOperation operation, Parts body, Reply& reply);

    /// Ends the connection; the next exchange makes a new one.
    void disconnect() { socket_.reset(); }

  private:
    [[nodiscard]] Status openSocket();
    [[nodiscard]] Status send(wire::KernelOperation operation, Parts body);
    [[nodiscard]] Status receive(wire::KernelOperation operation, Reply& reply);
    [[nodiscard]] Status fail(int error);

    std::string path_;
    SystemLog& log_;
    std::chrono::milliseconds timeout_;
    Greeting greeting_;
    base::FileDescriptor socket_;
    std::uint64_t sequence_ = 0;
    std::unique_ptr<std::uint8_t[]> buffer_;
};

} // namespace platform
