#include "kstctl/commands/NewFile.h"

#include "base/FileDescriptor.h"
#include "kstctl/FileError.h"
#include "kstctl/WholeWrite.h"

#include <fcntl.h>
#include <unistd.h>

namespace kstctl {

namespace {

constexpr mode_t kOwnerOnly = 0600;

/// Of a file that is written all faults are plain failures.
platform::Error writeError(const std::string& path, int error) {
    return failure(ExitStatus::failed, fileError(path, error).description);
}

} // namespace

std::optional<platform::Error> writeNewFile(const std::string& path, std::string_view content) {
    const base::FileDescriptor file(
        ::open(path.c_str(), O_WRONLY | O_CREAT | O_EXCL | O_CLOEXEC, kOwnerOnly));
    if (!file.isOpen()) {
        return writeError(path, errno);
    }
    if (!writeWhole(file.get(), content)) {
        const int error = errno;
        ::unlink(path.c_str());
        return writeError(path, error);
    }
    return std::nullopt;
}

} // namespace kstctl
