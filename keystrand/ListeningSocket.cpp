#include "keystrand/ListeningSocket.h"

#include "base/Concat.h"
#include "base/UnixAddress.h"
#include "wire/SystemPaths.h"

#include <systemd/sd-daemon.h>

#include <cerrno>
#include <chrono>
#include <cstdlib>
#include <ctime>
#include <fcntl.h>
#include <string_view>
#include <sys/epoll.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <system_error>
#include <unistd.h>
#include <utility>

namespace keystrand {

namespace {

std::string reason(const std::string& path, const char* what) {
    return base::concat(path, ": ", what, ": ", std::generic_category().message(errno));
}

/// Nobody listens when a connection is refused; anything else counts as somebody.
bool isAbandoned(const base::UnixAddress& address, int type) {
    const base::FileDescriptor probe(::socket(AF_UNIX, type | SOCK_CLOEXEC | SOCK_NONBLOCK, 0));
    return probe.isOpen() && ::connect(probe.get(), address.get(), address.size()) != 0 &&
           errno == ECONNREFUSED;
}

/// Makes the path free for a socket. False with a reason when it is not to be had.
bool clearPath(const std::string& path, const base::UnixAddress& address, int type,
               std::string& error) {
    struct stat present {};
    if (::lstat(path.c_str(), &present) != 0) {
        const bool isFree = errno == ENOENT;
        error = reason(path, "cannot look at it");
        return isFree;
    }
    if (!S_ISSOCK(present.st_mode)) {
        error = base::concat(path, ": is there and is not a socket");
        return false;
    }
    if (!isAbandoned(address, type)) {
        error = base::concat(path, ": another instance listens there");
        return false;
    }
    if (::unlink(path.c_str()) != 0) {
        error = reason(path, "cannot remove the stale socket");
        return false;
    }
    return true;
}

} // namespace

std::optional<ListeningSocket> ListeningSocket::open(const std::string& path, int type,
                                                     std::string& error, mode_t mode) {
    const auto address = base::UnixAddress::of(path);
    if (!address) {
        error = base::concat(path, ": too long for a socket");
        return std::nullopt;
    }
    if (!clearPath(path, *address, type, error)) {
        return std::nullopt;
    }
    base::FileDescriptor fd(::socket(AF_UNIX, type | SOCK_CLOEXEC | SOCK_NONBLOCK, 0));
    // The file takes over the mode that the descriptor has when it is bound, without what the umask
    // takes away.
    if (!fd.isOpen() || ::fchmod(fd.get(), mode) != 0 ||
        ::bind(fd.get(), address->get(), address->size()) != 0) {
        error = reason(path, "cannot make the socket");
        return std::nullopt;
    }
    struct stat made {};
    if (::lstat(path.c_str(), &made) != 0 || ::listen(fd.get(), SOMAXCONN) != 0 ||
        ::chmod(path.c_str(), mode) != 0) {
        error = reason(path, "cannot listen");
        return std::nullopt;
    }
    return ListeningSocket(std::move(fd), File{path, made.st_dev, made.st_ino});
}

ListeningSocket ListeningSocket::adopt(base::FileDescriptor fd) {
    return ListeningSocket(std::move(fd), std::nullopt);
}

ListeningSocket::ListeningSocket(base::FileDescriptor fd, std::optional<File> file)
    : fd_(std::move(fd)), file_(std::move(file)) {}

ListeningSocket::~ListeningSocket() {
    struct stat present {};
    if (fd_.isOpen() && file_ && ::lstat(file_->path.c_str(), &present) == 0 &&
        present.st_dev == file_->device && present.st_ino == file_->inode) {
        ::unlink(file_->path.c_str());
    }
}

namespace {

constexpr std::string_view kActivationName = "service";

/// What was handed over under that name.
base::FileDescriptor takeNamed(std::string_view name) {
    char** names = nullptr;
    const int count = sd_listen_fds_with_names(1, &names);
    base::FileDescriptor found;
    for (int i = 0; i < count; ++i) {
        base::FileDescriptor candidate(SD_LISTEN_FDS_START + i);
        if (names[i] == name && !found.isOpen()) {
            found = std::move(candidate);
        }
        std::free(names[i]);
    }
    std::free(names);
    return found;
}

} // namespace

std::optional<base::FileDescriptor> takeActivatedServiceSocket(std::string& error) {
    base::FileDescriptor socket = takeNamed(kActivationName);
    if (!socket.isOpen()) {
        return socket;
    }
    if (sd_is_socket(socket.get(), AF_UNIX, SOCK_SEQPACKET, 1) <= 0) {
        error = "the activated socket is not a listening packet socket";
        return std::nullopt;
    }
    // The loop that watches it never waits for a client.
    if (::fcntl(socket.get(), F_SETFL, O_NONBLOCK) != 0) {
        error = "the activated socket cannot be used";
        return std::nullopt;
    }
    return socket;
}

namespace {

/// Makes the directory with exactly that mode; one that is there is left as it is.
bool makeDirectory(const std::string& path, std::string& error) {
    constexpr mode_t kMode = 0755;
    const bool made = ::mkdir(path.c_str(), kMode) == 0;
    if (made ? ::chmod(path.c_str(), kMode) == 0 : errno == EEXIST) {
        return true;
    }
    error = reason(path, "cannot make the directory");
    return false;
}

} // namespace

std::optional<ListeningSocket>
openServiceSocket(const std::string& root, base::FileDescriptor activated, std::string& error) {
    for (const char* directory : {wire::kRunDirectory, wire::kKernelDirectory}) {
        if (!makeDirectory(wire::underRoot(root, directory), error)) {
            return std::nullopt;
        }
    }
    if (activated.isOpen()) {
        return ListeningSocket::adopt(std::move(activated));
    }
    return ListeningSocket::open(wire::underRoot(root, wire::kKernelSocket), SOCK_SEQPACKET, error);
}

namespace {

constexpr std::chrono::milliseconds kRetryDelay{200};

bool isOutOfRoom(int error) {
    return error == EMFILE || error == ENFILE || error == ENOBUFS || error == ENOMEM;
}

} // namespace

Acceptor::Acceptor(EventLoop& loop, ListeningSocket socket, Handler handler)
    : Acceptor(loop, std::move(socket), std::nullopt, std::move(handler)) {}

Acceptor::Acceptor(EventLoop& loop, ListeningSocket socket, uid_t user, Handler handler)
    : Acceptor(loop, std::move(socket), std::optional(user), std::move(handler)) {}

Acceptor::Acceptor(EventLoop& loop, ListeningSocket socket, std::optional<uid_t> user,
                   Handler handler)
    : socket_(std::move(socket)),
      user_(user),
      handler_(std::move(handler)),
      source_(loop.watch(socket_.fd(), EPOLLIN, [this](std::uint32_t /*events*/) { accept(); })),
      retry_(loop.timer(CLOCK_MONOTONIC, [this] { resume(); })) {}

void Acceptor::pause() {
    source_.disable();
    retry_.disable();
}

void Acceptor::resume() {
    source_.listenFor(EPOLLIN);
}

void Acceptor::accept() {
    base::FileDescriptor connection(
        ::accept4(socket_.fd(), nullptr, nullptr, SOCK_CLOEXEC | SOCK_NONBLOCK));
    if (!connection.isOpen()) {
        if (isOutOfRoom(errno)) {
            pause();
            retry_.expireIn(kRetryDelay);
        }
        return;
    }
    if (isTrusted(connection.get())) {
        handler_(std::move(connection));
    }
}

bool Acceptor::isTrusted(int connection) const {
    ucred peer{};
    socklen_t length = sizeof peer;
    if (::getsockopt(connection, SOL_SOCKET, SO_PEERCRED, &peer, &length) != 0) {
        return false;
    }
    return user_ ? peer.uid == *user_ : peer.uid == 0 || peer.uid == ::geteuid();
}

} // namespace keystrand
