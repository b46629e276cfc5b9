#pragma once

#include "base/FileDescriptor.h"
#include "base/NotCopied.h"
#include "base/UnixAddress.h"
#include "platform/KernelConnections.h"
#include "platform/SystemLog.h"
#include "wire/KernelSocket.h"

#include <chrono>
#include <cstddef>
#include <cstdint>
#include <initializer_list>
#include <optional>
#include <span>
#include <string_view>
#include <sys/types.h>

namespace platform {

/// How long a kernel side may take to accept a request or to answer it.
inline constexpr std::chrono::milliseconds kKernelTimeout{5000};

/// Whose lines they are that tell of the kernel service, where a program gives no other name.
inline constexpr std::string_view kDaemonName = "kstd";

/// Pages for one message at a time, and a mark in them. In a child of the process both are zero.
class MessagePages : private base::NotCopied {
  public:
    ~MessagePages();

    /// False when there is no memory. What is there already stays.
    [[nodiscard]] bool obtain();

    /// Room for a message of kKernelMessageMaxSize bytes.
    [[nodiscard]] std::uint8_t* message() { return pages_->message; }

    /// Not before `obtain`.
    void setMark() { pages_->mark = 1; }
    [[nodiscard]] bool isMarked() const { return pages_ != nullptr && pages_->mark != 0; }

  private:
    struct Pages {
        std::uint64_t mark;
        std::uint8_t message[wire::kKernelMessageMaxSize];
    };

    Pages* pages_ = nullptr;
};

/// One connection to the kernel service's socket: a request out, its reply in, strictly in turn.
/// Allocates nothing but its pages.
///
/// It connects when a request needs it, also anew after the peer was restarted, as long as the
/// request was not handed over; a request that was is never sent again. Whatever leaves it in doubt
/// which reply would come next (no answer in time, a hang-up, a reply that is malformed, too long
/// or of another request) ends the connection. The peer must run as root or as this process's user.
///
/// A child of the process never uses the connection: its first request closes what was inherited
/// and connects anew.
///
/// A connection that cannot be made leaves a warning with the socket's path and the reason, under
/// the program's name. A reason is told once, until a connection was made.
class KernelSocketConnection : private base::NotCopied {
  public:
    using Deadline = KernelConnections::Deadline;

    /// What a request's bytes are put together from; sent without a copy.
    using Parts = std::initializer_list<std::span<const std::uint8_t>>;

    /// A reply, which points into the connection's pages until the next exchange. Its bytes are
    /// wiped when it goes, since they may be secret.
    class Reply : private base::NotCopied {
      public:
        ~Reply();

        /// The kernel side's word on the request.
        Status status = kSuccess;
        std::uint32_t reported = 0;
        std::span<const std::uint8_t> body;

      private:
        friend class KernelSocketConnection;
        std::span<std::uint8_t> received_;
    };

    /// `timeout` bounds each request, as long as no deadline is set. Without an address, or with a
    /// path that cannot be one, connecting gives the status of ENAMETOOLONG.
    /// `program` outlives the connection.
    KernelSocketConnection(const std::optional<base::UnixAddress>& address, SystemLog& log,
                           std::chrono::milliseconds timeout,
                           std::string_view program = kDaemonName)
        : address_(address), log_(log), timeout_(timeout), program_(program) {}
    KernelSocketConnection(std::string_view path, SystemLog& log, std::chrono::milliseconds timeout,
                           std::string_view program = kDaemonName)
        : KernelSocketConnection(base::UnixAddress::of(path), log, timeout, program) {}
    virtual ~KernelSocketConnection() = default;

    /// Connects if that is not done. A status other than 0 is the platform's or the greeting's.
    [[nodiscard]] Status connect();

    /// Sends the request and waits for its reply. 0 when a well-formed reply to this very request
    /// is there, whatever status it carries; else a platform status and no reply.
    [[nodiscard]] Status exchange(wire::KernelOperation operation, Parts body, Reply& reply);

    /// Sends the request, on a connection whose deadline has passed too, and ends the connection.
    /// Waits for nothing.
    [[nodiscard]] Status post(wire::KernelOperation operation, Parts body);

    /// Ends the connection; the next exchange makes a new one.
    void disconnect();

    /// Whether the next exchange goes over the connection as it is.
    [[nodiscard]] bool isConnected() const { return socket_.isOpen() && !expired_; }

    /// Why the last attempt to connect failed, 0 when it did not.
    [[nodiscard]] Status connectStatus() const { return connectStatus_; }

    /// Of the socket, for a line of the log.
    [[nodiscard]] std::string_view path() const {
        return address_ ? address_->path() : "its socket";
    }
    [[nodiscard]] std::string_view program() const { return program_; }

    /// As KernelConnections. A connection whose answer did not come by the deadline ends when the
    /// deadline is taken away or when it is used again.
    void setDeadline(std::optional<Deadline> deadline);
    [[nodiscard]] bool isInherited() const { return socket_.isOpen() && !pages_.isMarked(); }
    void leaveToParent();

  protected:
    /// Sends what a fresh connection needs before its first request, through `exchangeOnce`.
    [[nodiscard]] virtual Status greet() { return kSuccess; }

    /// `exchange` on the connection as it is. In the course of a `post` it does not wait, and the
    /// reply stays empty.
    [[nodiscard]] Status exchangeOnce(wire::KernelOperation operation, Parts body, Reply& reply);

  private:
    void begin();
    [[nodiscard]] bool isTimeUp() const;
    [[nodiscard]] Status connectAndGreet();
    [[nodiscard]] Status openSocket();
    /// `stranger` becomes the user who serves and may not.
    [[nodiscard]] Status connectSocket(std::optional<uid_t>& stranger);
    void tell(Status status, std::optional<uid_t> stranger);
    /// Connects, and sends; once more when the peer had gone before.
    [[nodiscard]] Status handOver(wire::KernelOperation operation, Parts body);
    [[nodiscard]] Status send(wire::KernelOperation operation, Parts body);
    [[nodiscard]] Status receive(wire::KernelOperation operation, Reply& reply);
    /// None can come any more.
    void dropReplies();
    /// The message's length, or -1 with errno set.
    [[nodiscard]] ssize_t receiveMessage();
    /// Whether the socket is ready before the time is up.
    [[nodiscard]] bool await(short events) const;
    [[nodiscard]] Status fail(int error);

    std::optional<base::UnixAddress> address_;
    SystemLog& log_;
    std::chrono::milliseconds timeout_;
    std::string_view program_;
    Status connectStatus_ = kSuccess;
    std::optional<Deadline> deadline_;
    /// When the time of the request under way is up.
    Deadline until_{};
    bool waits_ = true;
    /// An answer did not come in time, so that the connection is good for a `post` only.
    bool expired_ = false;
    base::FileDescriptor socket_;
    std::uint64_t sequence_ = 0;
    MessagePages pages_;
};

} // namespace platform
