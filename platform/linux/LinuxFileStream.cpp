#include "platform/linux/LinuxFileStream.h"

#include "platform/linux/LinuxFiles.h"
#include "platform/linux/Sync.h"

#include <cerrno>
#include <unistd.h>
#include <utility>

namespace platform {

namespace {

constexpr std::string_view kWrite = "write";
constexpr std::string_view kSync = "sync";
constexpr std::string_view kClose = "close";

} // namespace

LinuxFileStream::LinuxFileStream(LinuxFiles& files, base::FileDescriptor descriptor,
                                 std::string path)
    : files_(files), descriptor_(std::move(descriptor)), path_(std::move(path)) {}

std::size_t LinuxFileStream::write(const void* data, std::size_t elementSize, std::size_t count) {
    std::size_t size = 0;
    if (!descriptor_.isOpen() || elementSize == 0 ||
        __builtin_mul_overflow(elementSize, count, &size)) {
        return 0;
    }
    const char* const bytes = static_cast<const char*>(data);
    std::size_t done = 0;
    while (done < size) {
        const ssize_t written = ::pwrite(descriptor_.get(), bytes + done, size - done, position_);
        if (written < 0 && errno == EINTR) {
            continue;
        }
        if (written <= 0) {
            // Taking nothing without a reason is an error of the device.
            files_.tell(kWrite, path_, written < 0 ? errno : EIO);
            return done / elementSize;
        }
        done += static_cast<std::size_t>(written);
        position_ += written;
    }
    files_.worked(kWrite, path_);
    return done / elementSize;
}

int LinuxFileStream::fullSync() {
    if (!descriptor_.isOpen()) {
        return EBADF;
    }
    int error = syncDescriptor(descriptor_.get());
    if (error == 0) {
        error = files_.syncNameOnce(path_);
    }
    if (error == 0) {
        files_.worked(kSync, path_);
    } else {
        files_.tell(kSync, path_, error);
    }
    return error;
}

int LinuxFileStream::close() {
    if (!descriptor_.isOpen()) {
        return EBADF;
    }
    // Linux gives the number free whatever close answers, so it is never closed again. Interrupted
    // is no failure: the number is free all the same.
    const int result = ::close(descriptor_.release());
    const int error = result == 0 || errno == EINTR ? 0 : errno;
    if (error == 0) {
        files_.worked(kClose, path_);
    } else {
        files_.tell(kClose, path_, error);
    }
    return error;
}

} // namespace platform
