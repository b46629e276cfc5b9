#include "keystrand-linux/StateFile.h"

#include "base/Concat.h"
#include "base/FileDescriptor.h"

#include <cerrno>
#include <fcntl.h>
#include <filesystem>
#include <sys/stat.h>
#include <system_error>
#include <unistd.h>

namespace keystrand::usb {

namespace {

constexpr mode_t kMode = 0600;

std::string because(std::string_view path, std::string_view what) {
    const int reason = errno;
    return base::concat(path, ": ", what, ": ", std::generic_category().message(reason));
}

bool writeWhole(int fd, std::string_view text) {
    while (!text.empty()) {
        const ssize_t written = ::write(fd, text.data(), text.size());
        if (written < 0 && errno != EINTR) {
            return false;
        }
        text.remove_prefix(written > 0 ? static_cast<std::size_t>(written) : 0);
    }
    return true;
}

bool syncDirectoryOf(const std::string& path) {
    const std::string directory = std::filesystem::path(path).parent_path().string();
    const base::FileDescriptor fd(::open(directory.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
    return fd.isOpen() && ::fsync(fd.get()) == 0;
}

} // namespace

std::optional<std::string> StateFile::read(std::string& problem) const {
    const base::FileDescriptor fd(
        ::open(path_.c_str(), O_RDONLY | O_CLOEXEC | O_NOFOLLOW | O_NONBLOCK));
    if (!fd.isOpen()) {
        if (errno != ENOENT) {
            problem = because(path_, "cannot be opened");
        }
        return std::nullopt;
    }
    struct stat status {};
    if (::fstat(fd.get(), &status) != 0 || !S_ISREG(status.st_mode)) {
        problem = base::concat(path_, ": not a regular file");
        return std::nullopt;
    }
    std::string text;
    constexpr std::size_t kPiece = 65536;
    for (;;) {
        const std::size_t before = text.size();
        text.resize(before + kPiece);
        const ssize_t count = ::read(fd.get(), text.data() + before, kPiece);
        if (count < 0 && errno == EINTR) {
            text.resize(before);
            continue;
        }
        if (count < 0) {
            problem = because(path_, "cannot be read");
            return std::nullopt;
        }
        text.resize(before + static_cast<std::size_t>(count));
        if (text.size() > kMaxSize) {
            problem = base::concat(path_, ": too large");
            return std::nullopt;
        }
        if (count == 0) {
            return text;
        }
    }
}

bool StateFile::replace(std::string_view text, std::string& problem) const {
    const std::string next = path_ + ".new";
    // What a service that was killed has left.
    static_cast<void>(::unlink(next.c_str()));
    const base::FileDescriptor fd(
        ::open(next.c_str(), O_WRONLY | O_CREAT | O_EXCL | O_CLOEXEC | O_NOFOLLOW, kMode));
    const bool isDurable = durability_ == Durability::synced;
    if (!fd.isOpen() || ::fchmod(fd.get(), kMode) != 0 || !writeWhole(fd.get(), text) ||
        (isDurable && ::fsync(fd.get()) != 0) || ::rename(next.c_str(), path_.c_str()) != 0) {
        problem = because(path_, "cannot be written");
        static_cast<void>(::unlink(next.c_str()));
        return false;
    }
    if (isDurable && !syncDirectoryOf(path_)) {
        problem = because(path_, "its directory cannot be synced");
        return false;
    }
    return true;
}

bool StateFile::remove(std::string& problem) const {
    if (::unlink(path_.c_str()) == 0 || errno == ENOENT) {
        return true;
    }
    problem = because(path_, "cannot be removed");
    return false;
}

} // namespace keystrand::usb
