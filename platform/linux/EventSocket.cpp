#include "platform/linux/EventSocket.h"

#include "base/Concat.h"
#include "base/UnixAddress.h"
#include "platform/MessageClasses.h"

#include <systemd/sd-daemon.h>

#include <cerrno>
#include <chrono>
#include <cstring>
#include <fcntl.h>
#include <memory>
#include <optional>
#include <string_view>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/un.h>
#include <system_error>
#include <utility>

namespace platform {

namespace {

constexpr char kActivationName[] = "events";
constexpr mode_t kSocketMode = 0600;
constexpr std::chrono::seconds kPause{1};

/// The owner of the socket's file, or of the socket itself when it has no file that can be seen.
uid_t ownerOf(int socket) {
    sockaddr_un address{};
    socklen_t length = sizeof address;
    struct stat status {};
    if (::getsockname(socket, reinterpret_cast<sockaddr*>(&address), &length) == 0 &&
        address.sun_path[0] == '/' && ::lstat(address.sun_path, &status) == 0) {
        return status.st_uid;
    }
    return ::fstat(socket, &status) == 0 ? status.st_uid : 0;
}

void acceptCredentials(int socket) {
    const int on = 1;
    ::setsockopt(socket, SOL_SOCKET, SO_PASSCRED, &on, sizeof on);
}

std::optional<uid_t> senderOf(const msghdr& message) {
    const cmsghdr* const control = CMSG_FIRSTHDR(&message);
    if (control == nullptr || control->cmsg_level != SOL_SOCKET ||
        control->cmsg_type != SCM_CREDENTIALS || control->cmsg_len < CMSG_LEN(sizeof(ucred))) {
        return std::nullopt;
    }
    ucred credentials{};
    std::memcpy(&credentials, CMSG_DATA(control), sizeof credentials);
    return credentials.uid;
}

} // namespace

EventSocket::EventSocket(base::FileDescriptor socket, LinuxRunLoop& loop, SystemLog& log,
                         Receiver receiver)
    : socket_(std::move(socket)),
      log_(log),
      receiver_(std::move(receiver)),
      owner_(ownerOf(socket_.get())) {
    // A socket from the init system has it set by its unit; one that was handed over may not.
    acceptCredentials(socket_.get());
    source_ = loop.addReadable(socket_.get(), [this] { receiveOne(); });
    pause_ =
        loop.addTimer([this] { source_->setEnabled(true); }, RunLoopSource::Keeps::loopRunning);
}

bool EventSocket::mayServe(uid_t sender) const {
    return sender == 0 || sender == owner_;
}

void EventSocket::receiveOne() {
    // One datagram a turn of the loop: what is left in the socket outlives this process, what was
    // received does not.
    iovec data{buffer_.data(), buffer_.size()};
    // Room for the credentials and nothing else: descriptors that come along are closed by the
    // system.
    alignas(cmsghdr) std::array<std::uint8_t, CMSG_SPACE(sizeof(ucred))> control{};
    msghdr message{};
    message.msg_iov = &data;
    message.msg_iovlen = 1;
    message.msg_control = control.data();
    message.msg_controllen = control.size();
    // With MSG_TRUNC the length is the datagram's own, also of one that did not fit.
    const ssize_t length =
        ::recvmsg(socket_.get(), &message, MSG_DONTWAIT | MSG_TRUNC | MSG_CMSG_CLOEXEC);
    if (length < 0) {
        if (errno != EAGAIN && errno != EINTR) {
            pauseAfter(errno);
        }
        return;
    }
    failure_ = 0;
    const std::optional<uid_t> sender = senderOf(message);
    if (!sender || !mayServe(*sender)) {
        log_.write(
            LogLevel::warning,
            sender ? base::concat("kstd: EventSocket: dropped datagram of user ", *sender, ".\n")
                   : "kstd: EventSocket: dropped datagram of unknown sender.\n",
            {.messageId = message::kForeignEvent});
        return;
    }
    handOn(buffer_.data(), static_cast<std::size_t>(length));
}

/// Without a pause the loop would turn for as long as the cause is there.
void EventSocket::pauseAfter(int error) {
    if (std::exchange(failure_, error) != error) {
        log_.write(LogLevel::warning,
                   base::concat("kstd: EventSocket: cannot receive: ",
                                std::generic_category().message(error), ".\n"),
                   {.messageId = message::kNoEventSocket});
    }
    source_->setEnabled(false);
    pause_->fireAfter(kPause);
}

void EventSocket::handOn(const std::uint8_t* data, std::size_t length) {
    if (length > buffer_.size()) {
        log_.write(
            LogLevel::warning,
            base::concat("kstd: EventSocket: dropped oversized datagram, ", length, " bytes.\n"),
            {.messageId = message::kMalformedEvent});
        return;
    }
    const auto event = wire::decodeEvent({data, length});
    if (!event) {
        log_.write(
            LogLevel::warning,
            base::concat("kstd: EventSocket: dropped malformed datagram, ", length, " bytes.\n"),
            {.messageId = message::kMalformedEvent});
        return;
    }
    receiver_(*event);
}

base::FileDescriptor takeActivatedEventSocket() {
    char** names = nullptr;
    const int count = sd_listen_fds_with_names(1, &names);
    base::FileDescriptor found;
    // By name, because their order is not always the same. What has another name is closed.
    for (int i = 0; i < count; ++i) {
        base::FileDescriptor candidate(SD_LISTEN_FDS_START + i);
        const bool isEvents = std::string_view(names[i]) == kActivationName &&
                              sd_is_socket(candidate.get(), AF_UNIX, SOCK_DGRAM, -1) > 0;
        if (isEvents && !found.isOpen()) {
            found = std::move(candidate);
        }
        std::free(names[i]);
    }
    std::free(names);
    return found;
}

base::FileDescriptor makeEventSocket(const std::string& path) {
    const auto address = base::UnixAddress::of(path);
    base::FileDescriptor socket(::socket(AF_UNIX, SOCK_DGRAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0));
    if (!address || !socket.isOpen()) {
        return base::FileDescriptor();
    }
    acceptCredentials(socket.get());
    // The file that an earlier process has left would refuse the address.
    ::unlink(path.c_str());
    // The mode of the socket's file is that of the descriptor less the umask; the change afterwards
    // makes it exact.
    ::fchmod(socket.get(), kSocketMode);
    if (::bind(socket.get(), address->get(), address->size()) != 0 ||
        ::chmod(path.c_str(), kSocketMode) != 0) {
        return base::FileDescriptor();
    }
    return socket;
}

} // namespace platform
