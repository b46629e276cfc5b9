#include "keystrand-linux/UsbEvents.h"

#include "base/Concat.h"
#include "base/UnixAddress.h"
#include "keystrand-linux/SmallFile.h"

#include <array>
#include <cerrno>
#include <cstring>
#include <linux/netlink.h>
#include <sys/epoll.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <unistd.h>
#include <utility>

namespace keystrand::usb {

namespace {

constexpr unsigned kKernelsGroup = 1;
/// Room for some hundred events, of hubs that come with everything behind them.
constexpr int kReceiveBuffer = 1 << 20;
/// Then the loop has its turn, and the rest comes with the next one.
constexpr int kMostAtOnce = 1024;

constexpr int kSocketFlags = SOCK_CLOEXEC | SOCK_NONBLOCK;

bool setOption(int fd, int option, int value) {
    return ::setsockopt(fd, SOL_SOCKET, option, &value, sizeof value) == 0;
}

/// What one message came with.
struct Sender {
    sockaddr_storage address{};
    ucred credentials{.pid = -1, .uid = static_cast<uid_t>(-1), .gid = static_cast<gid_t>(-1)};

    /// A socket with a file has its mode to say who may send.
    [[nodiscard]] bool isHeard() const {
        if (address.ss_family != AF_NETLINK) {
            return true;
        }
        sockaddr_nl netlink{};
        std::memcpy(&netlink, &address, sizeof netlink);
        return netlink.nl_pid == 0 && credentials.pid == 0 && credentials.uid == 0;
    }
};

void readCredentials(msghdr& header, ucred& credentials) {
    for (cmsghdr* each = CMSG_FIRSTHDR(&header); each != nullptr;
         each = CMSG_NXTHDR(&header, each)) {
        if (each->cmsg_level == SOL_SOCKET && each->cmsg_type == SCM_CREDENTIALS &&
            each->cmsg_len == CMSG_LEN(sizeof credentials)) {
            std::memcpy(&credentials, CMSG_DATA(each), sizeof credentials);
        }
    }
}

} // namespace

base::FileDescriptor openKernelEvents(std::string& problem) {
    base::FileDescriptor fd(::socket(AF_NETLINK, SOCK_RAW | kSocketFlags, NETLINK_KOBJECT_UEVENT));
    sockaddr_nl address{};
    address.nl_family = AF_NETLINK;
    address.nl_groups = kKernelsGroup;
    if (!fd.isOpen() || !setOption(fd.get(), SO_PASSCRED, 1) ||
        ::bind(fd.get(), reinterpret_cast<const sockaddr*>(&address), sizeof address) != 0) {
        problem = base::concat("the kernel's events cannot be had: ", errorText(errno));
        return {};
    }
    // A smaller one loses events sooner, which is made good by a look.
    if (!setOption(fd.get(), SO_RCVBUFFORCE, kReceiveBuffer)) {
        static_cast<void>(setOption(fd.get(), SO_RCVBUF, kReceiveBuffer));
    }
    return fd;
}

base::FileDescriptor openEventsAt(const std::string& path, std::string& problem) {
    const auto address = base::UnixAddress::of(path);
    if (!address) {
        problem = base::concat(path, ": no path for a socket");
        return {};
    }
    base::FileDescriptor fd(::socket(AF_UNIX, SOCK_DGRAM | kSocketFlags, 0));
    // What a service that was killed has left.
    static_cast<void>(::unlink(path.c_str()));
    if (!fd.isOpen() || ::fchmod(fd.get(), S_IRUSR | S_IWUSR) != 0 ||
        ::bind(fd.get(), address->get(), address->size()) != 0) {
        problem = base::concat(path, ": ", errorText(errno));
        return {};
    }
    return fd;
}

bool tellsOfUsb(std::string_view message) {
    bool isUsb = false;
    bool isChange = false;
    while (!message.empty()) {
        const std::size_t end = std::min(message.find('\0'), message.size());
        const std::string_view field = message.substr(0, end);
        isUsb = isUsb || field == "SUBSYSTEM=usb" || field == "DEVPATH=/module/usbcore";
        isChange =
            isChange || field == "ACTION=add" || field == "ACTION=remove" || field == "ACTION=bind";
        message.remove_prefix(std::min(end + 1, message.size()));
    }
    return isUsb && isChange;
}

UsbEvents::UsbEvents(EventLoop& loop, base::FileDescriptor socket, Handlers handlers)
    : socket_(std::move(socket)), handlers_(std::move(handlers)) {
    source_ = loop.watch(socket_.get(), EPOLLIN, [this](std::uint32_t) { receive(); });
}

void UsbEvents::receive() {
    bool isChanged = false;
    for (int count = 0; count < kMostAtOnce; ++count) {
        const Heard heard = hear();
        isChanged = isChanged || heard == Heard::change || heard == Heard::end;
        if (heard == Heard::nothing || heard == Heard::end) {
            break;
        }
    }
    if (isChanged) {
        // Whoever is called may destroy the object, and the handler with it.
        const auto changed = handlers_.changed;
        changed();
    }
}

UsbEvents::Heard UsbEvents::hear() {
    // The kernel's own messages have 2048 bytes at the most.
    std::array<char, 8192> message;
    alignas(cmsghdr) std::array<char, CMSG_SPACE(sizeof(ucred))> control{};
    Sender sender;
    iovec whole{.iov_base = message.data(), .iov_len = message.size()};
    msghdr header{};
    header.msg_name = &sender.address;
    header.msg_namelen = sizeof sender.address;
    header.msg_iov = &whole;
    header.msg_iovlen = 1;
    header.msg_control = control.data();
    header.msg_controllen = control.size();
    const ssize_t size = ::recvmsg(socket_.get(), &header, MSG_CMSG_CLOEXEC);
    if (size < 0) {
        switch (errno) {
        case EAGAIN:
            return Heard::nothing;
        case EINTR:
            return Heard::other;
        case ENOBUFS:
            return Heard::change;
        default:
            end(errorText(errno));
            return Heard::end;
        }
    }
    readCredentials(header, sender.credentials);
    if (!sender.isHeard()) {
        return Heard::other;
    }
    const bool isWhole = (header.msg_flags & MSG_TRUNC) == 0;
    const std::string_view text(message.data(), static_cast<std::size_t>(size));
    return !isWhole || tellsOfUsb(text) ? Heard::change : Heard::other;
}

void UsbEvents::end(const std::string& reason) {
    source_ = EventSource();
    handlers_.ended(reason);
}

} // namespace keystrand::usb
