#include "tests/support/FailingCalls.h"

#include <cerrno>
#include <cstddef>
#include <poll.h>
#include <sys/stat.h>
#include <unistd.h>
#include <utility>

namespace {

/// Takes the first entry, and fails with it; false when there is none.
bool failsWith(std::deque<int>& errors) {
    if (errors.empty()) {
        return false;
    }
    errno = errors.front();
    errors.pop_front();
    return true;
}

} // namespace

using support::FailingCalls;

// The names are the linker's: it resolves a call of x to __wrap_x, and __real_x to x.
// NOLINTBEGIN(bugprone-reserved-identifier)
extern "C" {

ssize_t __real_read(int descriptor, void* data, std::size_t size);
int __real_fstat(int descriptor, struct stat* status);
ssize_t __real_recv(int socket, void* data, std::size_t size, int flags);
ssize_t __real_recvmsg(int socket, msghdr* message, int flags);
ssize_t __real_send(int socket, const void* data, std::size_t size, int flags);
int __real_poll(pollfd* watched, nfds_t count, int milliseconds);

ssize_t __wrap_read(int descriptor, void* data, std::size_t size) {
    return failsWith(FailingCalls::read) ? -1 : __real_read(descriptor, data, size);
}

int __wrap_fstat(int descriptor, struct stat* status) {
    return failsWith(FailingCalls::fstat) ? -1 : __real_fstat(descriptor, status);
}

ssize_t __wrap_recv(int socket, void* data, std::size_t size, int flags) {
    return failsWith(FailingCalls::recv) ? -1 : __real_recv(socket, data, size, flags);
}

ssize_t __wrap_send(int socket, const void* data, std::size_t size, int flags) {
    return failsWith(FailingCalls::send) ? -1 : __real_send(socket, data, size, flags);
}

int __wrap_poll(pollfd* watched, nfds_t count, int milliseconds) {
    return failsWith(FailingCalls::poll) ? -1 : __real_poll(watched, count, milliseconds);
}

ssize_t __wrap_recvmsg(int socket, msghdr* message, int flags) {
    if (FailingCalls::recvmsg.empty()) {
        return __real_recvmsg(socket, message, flags);
    }
    const auto instead = std::move(FailingCalls::recvmsg.front());
    FailingCalls::recvmsg.pop_front();
    return instead(*message);
}

} // extern "C"
// NOLINTEND(bugprone-reserved-identifier)
