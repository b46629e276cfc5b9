#include "keystrand-linux/SmallFile.h"

#include <algorithm>
#include <cerrno>
#include <csignal>
#include <system_error>
#include <unistd.h>

namespace keystrand::usb {

namespace {

constexpr std::chrono::nanoseconds kInterruptEach = std::chrono::milliseconds(5);

timespec timespecOf(std::chrono::nanoseconds time) {
    const auto seconds = std::chrono::floor<std::chrono::seconds>(time);
    return {.tv_sec = seconds.count(), .tv_nsec = (time - seconds).count()};
}

/// The error's number, or 0.
int readToTheEnd(int fd, std::size_t limit, std::string& bytes,
                 std::optional<ReadDeadline> until = std::nullopt) {
    constexpr std::size_t kPiece = 4096;
    for (;;) {
        const std::size_t before = bytes.size();
        bytes.resize(before + std::min(kPiece, limit + 1 - before));
        const ssize_t count = ::read(fd, bytes.data() + before, bytes.size() - before);
        const int error = count < 0 ? errno : 0;
        bytes.resize(before + static_cast<std::size_t>(std::max<ssize_t>(count, 0)));
        if (error == EINTR && until && std::chrono::steady_clock::now() >= *until) {
            return ETIMEDOUT;
        }
        if (error != 0 && error != EINTR) {
            return error;
        }
        if (count == 0) {
            return 0;
        }
        if (bytes.size() > limit) {
            return EFBIG;
        }
    }
}

SmallFile readFile(int directory, const char* path, std::size_t limit,
                   std::optional<ReadDeadline> until = std::nullopt) {
    SmallFile file;
    const base::FileDescriptor fd(
        ::openat(directory, path, O_RDONLY | O_CLOEXEC | O_NONBLOCK | O_NOCTTY));
    if (!fd.isOpen() || ::fstat(fd.get(), &file.status) != 0) {
        file.error = errno;
        return file;
    }
    if (!S_ISREG(file.status.st_mode)) {
        file.error = S_ISDIR(file.status.st_mode) ? EISDIR : EINVAL;
        return file;
    }
    file.error = readToTheEnd(fd.get(), limit, file.bytes, until);
    if (file.error != 0) {
        file.bytes.clear();
    }
    return file;
}

} // namespace

SmallFile readSmallFile(int directory, const std::string& path, std::size_t limit) {
    return readFile(directory, path.c_str(), limit);
}

SmallFile readSmallFileUntil(int directory, const char* name, std::size_t limit,
                             ReadDeadline until) {
    const Interruptions interruptions(until);
    return readFile(directory, name, limit, until);
}

Interruptions::Interruptions(ReadDeadline from) {
    // It stays: one that is late does no harm.
    struct sigaction action {};
    action.sa_handler = [](int) {
    };
    static_cast<void>(::sigaction(SIGALRM, &action, nullptr));
    sigevent event{};
    event.sigev_notify = SIGEV_SIGNAL;
    event.sigev_signo = SIGALRM;
    timer_t timer{};
    if (::timer_create(CLOCK_MONOTONIC, &event, &timer) != 0) {
        return;
    }
    timer_ = timer;
    // The first one may come before the call that it is meant for.
    const itimerspec times{.it_interval = timespecOf(kInterruptEach),
                           .it_value = timespecOf(from.time_since_epoch())};
    static_cast<void>(::timer_settime(timer, TIMER_ABSTIME, &times, nullptr));
}

Interruptions::~Interruptions() {
    if (timer_) {
        static_cast<void>(::timer_delete(*timer_));
    }
}

int writeAttribute(int directory, const char* name, std::string_view text) {
    // Sysfs ignores the truncation; a directory that only looks like it needs it.
    const base::FileDescriptor fd(
        ::openat(directory, name, O_WRONLY | O_TRUNC | O_CLOEXEC | O_NOCTTY));
    if (!fd.isOpen()) {
        return errno;
    }
    ssize_t written = 0;
    do {
        written = ::write(fd.get(), text.data(), text.size());
    } while (written < 0 && errno == EINTR);
    if (written < 0) {
        return errno;
    }
    return static_cast<std::size_t>(written) == text.size() ? 0 : EIO;
}

base::FileDescriptor openDirectory(const std::string& path) {
    return base::FileDescriptor(::open(path.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
}

std::string errorText(int error) {
    return std::generic_category().message(error);
}

std::string_view trimmed(std::string_view text) {
    constexpr std::string_view kBlanks = " \t\r\n";
    const std::size_t first = text.find_first_not_of(kBlanks);
    if (first == std::string_view::npos) {
        return {};
    }
    return text.substr(first, text.find_last_not_of(kBlanks) - first + 1);
}

} // namespace keystrand::usb
