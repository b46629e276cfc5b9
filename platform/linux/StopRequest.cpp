#include "platform/linux/StopRequest.h"

#include <cerrno>
#include <csignal>
#include <poll.h>
#include <sys/signalfd.h>

namespace platform {

// The signal is never taken, so it stays pending, and the descriptor readable.
StopRequest::StopRequest() {
    sigset_t signals;
    ::sigemptyset(&signals);
    ::sigaddset(&signals, SIGTERM);
    ::pthread_sigmask(SIG_BLOCK, &signals, nullptr);
    signal_ = base::FileDescriptor(::signalfd(-1, &signals, SFD_CLOEXEC | SFD_NONBLOCK));
    if (!signal_.isOpen()) {
        failure_ = errno;
        ::pthread_sigmask(SIG_UNBLOCK, &signals, nullptr);
    }
}

bool StopRequest::isMade() const {
    pollfd watched{descriptor(), POLLIN, 0};
    return ::poll(&watched, 1, 0) > 0;
}

} // namespace platform
