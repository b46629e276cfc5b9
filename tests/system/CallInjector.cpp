#include "tests/system/CallInjector.h"

#include "tests/support/SystemCallErrors.h"

#include <cctype>
#include <cstdint>
#include <poll.h>
#include <sys/epoll.h>
#include <sys/eventfd.h>
#include <sys/syscall.h>
#include <unistd.h>
#include <utility>

namespace system_tests {

namespace {

using support::SystemCall;

/// How often a signal interrupts, or a socket is not ready after all, in the worst of cases.
constexpr int kPassingHits = 8;

constexpr char kDaemon[] = "kstd-dev";

bool isReadable(int descriptor) {
    pollfd watched{descriptor, POLLIN, 0};
    return ::poll(&watched, 1, 0) > 0;
}

/// A call that waits for events without an end; 0 is a look.
bool waitsForEvents(const SystemCall& call) {
#ifdef SYS_epoll_wait
    if (call.number == SYS_epoll_wait) {
        return static_cast<int>(call.arguments[3]) != 0;
    }
#endif
    return call.number == SYS_epoll_pwait && static_cast<int>(call.arguments[3]) != 0;
}

/// The first call that is the program's own: before it are the loader's and a sanitizer's.
bool isFirstOfMain(const SystemCall& call) {
    if (call.program == kDaemon) {
        return call.number == SYS_signalfd4;
    }
    return call.number == (call.program == "kstd-https" ? SYS_getsockopt : SYS_getppid);
}

} // namespace

CallInjector::CallInjector(std::string root, int eventSocket, std::optional<Fault> fault)
    : root_(std::move(root)),
      eventSocket_(eventSocket),
      fault_(std::move(fault)),
      idleEvent_(::eventfd(0, EFD_CLOEXEC | EFD_NONBLOCK)) {}

std::string CallInjector::shortened(std::string object) const {
    if (object.starts_with(root_)) {
        object.erase(0, root_.size());
    }
    // The numbers of processes and descriptors are others in each run.
    for (char& character : object) {
        if (object.starts_with("/proc/") && std::isdigit(static_cast<unsigned char>(character))) {
            character = '#';
        }
    }
    return object;
}

void CallInjector::noteIdle(const SystemCall& call) {
    // Only the main thread waits for events; a sanitizer may have one of its own.
    if (call.thread != mainThread_) {
        return;
    }
    isIdle_ = waitsForEvents(call);
    if (isIdle_ && !isReadable(eventSocket_)) {
        const std::uint64_t one = 1;
        static_cast<void>(::write(idleEvent_.get(), &one, sizeof one));
    }
}

int CallInjector::judge(const SystemCall& call) {
    const std::lock_guard lock(mutex_);
    noteIdle(call);
    if (isFirstOfMain(call)) {
        mainThread_ = call.program == kDaemon ? call.thread : mainThread_;
        began_.insert(call.program);
        isArmed_ = isArmed_ || armsAtMain_;
    }
    if (!isArmed_ || !began_.contains(call.program)) {
        return 0;
    }
    CallPoint point{call.program, support::nameOf(call), shortened(support::objectOf(call)), 0,
                    support::errorsOf(call)};
    if (point.errors.empty()) {
        return 0;
    }
    point.ordinal = ++ordinals_[point.program + '\n' + point.call + '\n' + point.object];
    points_.push_back(point);
    return failAt(point);
}

int CallInjector::failAt(const CallPoint& point) {
    if (!fault_ || point.program != fault_->point.program || point.call != fault_->point.call ||
        point.object != fault_->point.object) {
        return 0;
    }
    const bool isIt = point.ordinal == fault_->point.ordinal;
    isMet_ = isMet_ || isIt;
    const bool isOver = support::passes(point.call, fault_->error) && hits_ >= kPassingHits;
    if (isIt || (isMet_ && fault_->lasts && !isOver)) {
        ++hits_;
        return fault_->error;
    }
    return 0;
}

bool CallInjector::hasBegun() const {
    const std::lock_guard lock(mutex_);
    return began_.contains(kDaemon);
}

void CallInjector::arm() {
    const std::lock_guard lock(mutex_);
    isArmed_ = true;
}

void CallInjector::armAtMain() {
    const std::lock_guard lock(mutex_);
    armsAtMain_ = true;
}

void CallInjector::disarm() {
    const std::lock_guard lock(mutex_);
    isArmed_ = false;
    armsAtMain_ = false;
}

CallInjector::Daemon CallInjector::awaitIdle(pid_t daemon, std::chrono::milliseconds patience) {
    const base::FileDescriptor ended(static_cast<int>(::syscall(SYS_pidfd_open, daemon, 0)));
    const auto deadline = std::chrono::steady_clock::now() + patience;
    for (;;) {
        // In this order: what has left the socket was taken by a daemon that is not idle.
        if (!isReadable(eventSocket_)) {
            const std::lock_guard lock(mutex_);
            if (isIdle_) {
                return Daemon::idle;
            }
        }
        const auto left = std::chrono::ceil<std::chrono::milliseconds>(
            deadline - std::chrono::steady_clock::now());
        pollfd watched[2] = {{idleEvent_.get(), POLLIN, 0}, {ended.get(), POLLIN, 0}};
        if (left.count() <= 0 || ::poll(watched, 2, static_cast<int>(left.count())) <= 0) {
            return Daemon::busy;
        }
        if (watched[1].revents != 0) {
            return Daemon::ended;
        }
        std::uint64_t count = 0;
        static_cast<void>(::read(idleEvent_.get(), &count, sizeof count));
    }
}

std::vector<CallPoint> CallInjector::points() const {
    const std::lock_guard lock(mutex_);
    return points_;
}

int CallInjector::hits() const {
    const std::lock_guard lock(mutex_);
    return hits_;
}

} // namespace system_tests
