#include "kstctl/database/DatabaseFiles.h"

#include "base/Concat.h"
#include "base/FileDescriptor.h"
#include "kstctl/ExitStatus.h"
#include "kstctl/FileError.h"

#include <array>
#include <cerrno>
#include <fcntl.h>
#include <unistd.h>

namespace kstctl {

namespace {

/// Where a database's file says how it is written and read; 2 in both is WAL mode.
constexpr off_t kVersionOffset = 18;
constexpr unsigned char kLogVersion = 2;

bool isInLogMode(int descriptor) {
    std::array<unsigned char, 2> versions{};
    return ::pread(descriptor, versions.data(), versions.size(), kVersionOffset) ==
               static_cast<ssize_t>(versions.size()) &&
           versions[0] == kLogVersion && versions[1] == kLogVersion;
}

bool isSame(const timespec& one, const timespec& other) {
    return one.tv_sec == other.tv_sec && one.tv_nsec == other.tv_nsec;
}

} // namespace

platform::Result<DatabaseFiles> DatabaseFiles::look(const std::string& path) {
    // Closing this descriptor drops the locks that this process has on the file: there must be no
    // connection open. Not blocking, because opening a pipe would wait for its writer.
    const base::FileDescriptor file(
        ::open(path.c_str(), O_RDONLY | O_NONBLOCK | O_CLOEXEC | O_NOCTTY));
    DatabaseFiles files;
    if (!file.isOpen() || ::fstat(file.get(), &files.state) != 0) {
        return fileError(path, errno);
    }
    if (!S_ISREG(files.state.st_mode)) {
        return failure(ExitStatus::malformed, base::concat(path, " is not a regular file"));
    }
    files.usesLog = isInLogMode(file.get());
    struct stat beside {};
    files.hasLog = ::stat(base::concat(path, "-wal").c_str(), &beside) == 0;
    files.isLogFilled = files.hasLog && beside.st_size > 0;
    files.hasIndex = ::stat(base::concat(path, "-shm").c_str(), &beside) == 0;
    return files;
}

bool DatabaseFiles::isSameAs(const DatabaseFiles& earlier) const {
    if (usesLog != earlier.usesLog || hasLog != earlier.hasLog || hasIndex != earlier.hasIndex ||
        state.st_dev != earlier.state.st_dev || state.st_ino != earlier.state.st_ino) {
        return false;
    }
    return !earlier.isAtRest() || (isAtRest() && state.st_size == earlier.state.st_size &&
                                   isSame(state.st_mtim, earlier.state.st_mtim) &&
                                   isSame(state.st_ctim, earlier.state.st_ctim));
}

} // namespace kstctl
