#include "keystrand/ListeningSocket.h"

#include "base/Concat.h"
#include "base/UnixAddress.h"

#include <cerrno>
#include <sys/socket.h>
#include <sys/stat.h>
#include <system_error>
#include <utility>

namespace keystrand {

namespace {

constexpr mode_t kSocketMode = 0600;

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
                                                     std::string& error) {
    const auto address = base::UnixAddress::of(path);
    if (!address) {
        error = base::concat(path, ": too long for a socket");
        return std::nullopt;
    }
    if (!clearPath(path, *address, type, error)) {
        return std::nullopt;
    }
    base::FileDescriptor fd(::socket(AF_UNIX, type | SOCK_CLOEXEC | SOCK_NONBLOCK, 0));
    // The file takes over the mode that the descriptor has when it is bound.
    if (!fd.isOpen() || ::fchmod(fd.get(), kSocketMode) != 0 ||
        ::bind(fd.get(), address->get(), address->size()) != 0) {
        error = reason(path, "cannot make the socket");
        return std::nullopt;
    }
    struct stat made {};
    if (::lstat(path.c_str(), &made) != 0 || ::listen(fd.get(), SOMAXCONN) != 0) {
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

} // namespace keystrand
