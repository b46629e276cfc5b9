#include "kstctl/commands/NewFile.h"

#include "kstctl/FileError.h"

#include <fcntl.h>
#include <unistd.h>
#include <utility>

namespace kstctl {

namespace {

constexpr mode_t kOwnerOnly = 0600;

/// Of a file that is written all faults are plain failures.
platform::Error writeError(const std::string& path, int error) {
    return failure(ExitStatus::failed, fileError(path, error).description);
}

} // namespace

platform::Result<NewFile> NewFile::make(const std::string& path) {
    base::FileDescriptor file(
        ::open(path.c_str(), O_WRONLY | O_CREAT | O_EXCL | O_CLOEXEC, kOwnerOnly));
    if (!file.isOpen()) {
        return writeError(path, errno);
    }
    return NewFile(path, std::move(file));
}

NewFile::NewFile(std::string path, base::FileDescriptor file)
    : path_(std::move(path)), file_(std::move(file)), content_(file_.get()) {}

NewFile::~NewFile() {
    if (file_.isOpen()) {
        ::unlink(path_.c_str());
    }
}

std::optional<platform::Error> NewFile::finish() {
    if (const int error = content_.finish(); error != 0) {
        return writeError(path_, error);
    }
    file_.reset();
    return std::nullopt;
}

} // namespace kstctl
