#include "bench/support/BareFile.h"

#include "bench/support/SystemError.h"

#include <fcntl.h>
#include <sys/types.h>
#include <unistd.h>
#include <utility>

namespace bench {

namespace {

constexpr int kFlags = O_RDWR | O_CLOEXEC;
constexpr mode_t kMode = 0600;

base::FileDescriptor openFile(const std::string& path, int flags) {
    base::FileDescriptor file(::open(path.c_str(), flags, kMode));
    if (!file.isOpen()) {
        throw systemError("cannot open " + path);
    }
    return file;
}

} // namespace

BareFile::BareFile(std::string path, std::size_t size, Sync sync)
    : path_(std::move(path)),
      record_(size, 0x5A),
      sync_(sync),
      held_(openFile(path_, kFlags | O_CREAT)) {
    save();
}

void BareFile::save() {
    saveTo(held_.get());
}

void BareFile::openAndSave() {
    base::FileDescriptor file = openFile(path_, kFlags);
    saveTo(file.get());
    if (::close(file.release()) != 0) {
        throw systemError("cannot close " + path_);
    }
}

void BareFile::saveTo(int descriptor) {
    const bool written = ::pwrite(descriptor, record_.data(), record_.size(), 0) ==
                         static_cast<ssize_t>(record_.size());
    if (!written || (sync_ == Sync::data ? ::fdatasync(descriptor) : ::fsync(descriptor)) != 0) {
        throw systemError("cannot save " + path_);
    }
}

} // namespace bench
