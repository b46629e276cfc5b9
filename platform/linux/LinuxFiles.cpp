#include "platform/linux/LinuxFiles.h"

#include "base/Concat.h"
#include "base/FileDescriptor.h"
#include "base/FileNames.h"
#include "platform/MessageClasses.h"
#include "platform/linux/RegularFile.h"

#include <cerrno>
#include <fcntl.h>
#include <sys/stat.h>
#include <system_error>
#include <unistd.h>
#include <utility>

namespace platform {

namespace {

// What is done with a file, as its failure is called.
constexpr std::string_view kOpen = "open";
constexpr std::string_view kAttach = "write to";
constexpr std::string_view kLoad = "load";
constexpr std::string_view kWrite = "write";
constexpr std::string_view kSync = "sync";
constexpr std::string_view kClose = "close";

constexpr int kOpenFlags = O_RDWR | O_CLOEXEC | O_NOCTTY | O_NOFOLLOW;

/// How often the file may vanish or appear between two looks before opening it is given up.
constexpr int kOpenAttempts = 8;

/// Makes the file, with exactly the permission bits `mode` whatever the umask is. None when it is
/// there already (errno EEXIST) or cannot be made.
base::FileDescriptor makeFile(const std::string& path, mode_t mode) {
    base::FileDescriptor descriptor(::open(path.c_str(), kOpenFlags | O_CREAT | O_EXCL, mode));
    if (descriptor.isOpen() && ::fchmod(descriptor.get(), mode) != 0) {
        const int error = errno;
        descriptor.reset();
        ::unlink(path.c_str());
        errno = error;
    }
    return descriptor;
}

struct Opened {
    base::FileDescriptor descriptor;
    bool isNew = false;
};

Opened openOrMake(const std::string& path, mode_t mode) {
    for (int attempt = 0; attempt < kOpenAttempts; ++attempt) {
        base::FileDescriptor existing(::open(path.c_str(), kOpenFlags));
        if (existing.isOpen() || errno != ENOENT) {
            return {std::move(existing), false};
        }
        base::FileDescriptor made = makeFile(path, mode);
        if (made.isOpen() || errno != EEXIST) {
            return {std::move(made), true};
        }
    }
    errno = EAGAIN;
    return {};
}

bool isWritable(int descriptor) {
    const int flags = ::fcntl(descriptor, F_GETFL);
    if (flags < 0 || (flags & O_PATH) != 0) {
        return false;
    }
    const int access = flags & O_ACCMODE;
    return access == O_WRONLY || access == O_RDWR;
}

/// Forces a file's or directory's contents to permanent storage. 0 or the error's number.
int syncDescriptor(int descriptor) {
    int result = 0;
    do {
        result = ::fsync(descriptor);
    } while (result != 0 && errno == EINTR);
    return result == 0 ? 0 : errno;
}

} // namespace

LinuxFiles::LinuxFiles(Paths paths, SystemLog& log) : paths_(std::move(paths)), log_(log) {}

void LinuxFiles::tell(std::string_view what, const std::string& path, std::string reason) {
    std::string& told = told_[{what, path}];
    if (told != reason) {
        told = std::move(reason);
        log_.write(LogLevel::warning,
                   base::concat("kstd: Files: cannot ", what, ' ', path, ": ", told, ".\n"),
                   {.messageId = message::kStateFileFailed});
    }
}

void LinuxFiles::tell(std::string_view what, const std::string& path, int error) {
    tell(what, path, std::generic_category().message(error));
}

void LinuxFiles::worked(std::string_view what, const std::string& path) {
    told_.erase({what, path});
}

OpenFile LinuxFiles::openForWriting(const std::string& path, ProtectionClass /*protection*/,
                                    int /*classOptions*/, unsigned mode) {
    Opened opened = openOrMake(paths_.under(path), static_cast<mode_t>(mode));
    if (opened.descriptor.isOpen()) {
        worked(kOpen, path);
    } else {
        tell(kOpen, path, errno);
    }
    if (opened.descriptor.isOpen() && opened.isNew) {
        syncedNames_.erase(path);
    }
    return {opened.descriptor.release(), path};
}

std::unique_ptr<FileStream> LinuxFiles::attachStream(const OpenFile& file) {
    if (!isWritable(file.descriptor)) {
        tell(kAttach, file.path, EBADF);
        return nullptr;
    }
    worked(kAttach, file.path);
    return std::make_unique<LinuxFileStream>(*this, base::FileDescriptor(file.descriptor),
                                             file.path);
}

std::optional<std::vector<std::uint8_t>> LinuxFiles::load(const std::string& path) {
    RegularFile file = readRegularFile(paths_.under(path), kMaxLoadSize,
                                       {.takesBeginning = true, .followsLink = false});
    switch (file.failure) {
    case ReadFailure::none:
        worked(kLoad, path);
        return std::move(file.bytes);
    case ReadFailure::missing:
        worked(kLoad, path);
        break;
    case ReadFailure::notRegular:
        tell(kLoad, path, "not a regular file");
        break;
    default:
        tell(kLoad, path, file.error);
    }
    return std::nullopt;
}

int LinuxFiles::syncNameOnce(const std::string& path) {
    if (syncedNames_.contains(path)) {
        return 0;
    }
    const std::string directory = base::directoryOf(paths_.under(path));
    const base::FileDescriptor descriptor(
        ::open(directory.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC | O_NOCTTY));
    if (!descriptor.isOpen()) {
        return errno;
    }
    if (const int error = syncDescriptor(descriptor.get()); error != 0) {
        return error;
    }
    syncedNames_.insert(path);
    return 0;
}

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
