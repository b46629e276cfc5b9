#include "platform/linux/RegularFile.h"

#include "base/Concat.h"
#include "base/FileDescriptor.h"

#include <algorithm>
#include <cerrno>
#include <fcntl.h>
#include <system_error>
#include <unistd.h>

namespace platform {

namespace {

RegularFile failed(ReadFailure failure, int error = 0) {
    RegularFile file;
    file.failure = failure;
    file.error = error;
    return file;
}

ssize_t readSome(int descriptor, std::uint8_t* buffer, std::size_t size) {
    ssize_t count = 0;
    do {
        count = ::read(descriptor, buffer, size);
    } while (count < 0 && errno == EINTR);
    return count;
}

/// Reads until the end or until `file.bytes` holds more than `limit` bytes. False with errno set
/// when reading failed.
bool readAll(int descriptor, std::size_t limit, RegularFile& file) {
    // The size that was looked up is a hint only: the file may change under the reader. One byte
    // more than expected lets the usual read see the end without growing the buffer.
    const auto expected = static_cast<std::size_t>(file.status.st_size);
    std::size_t used = 0;
    file.bytes.resize(std::min(expected, limit) + 1);
    while (used <= limit) {
        if (used == file.bytes.size()) {
            file.bytes.resize(std::min(used * 2, limit + 1));
        }
        const ssize_t count =
            readSome(descriptor, file.bytes.data() + used, file.bytes.size() - used);
        if (count < 0) {
            return false;
        }
        if (count == 0) {
            break;
        }
        used += static_cast<std::size_t>(count);
    }
    file.bytes.resize(used);
    return true;
}

} // namespace

RegularFile readRegularFile(const std::string& path, std::size_t limit, const ReadingRules& rules) {
    // Not blocking, because opening a pipe would wait for its writer.
    const int flags = O_RDONLY | O_NONBLOCK | O_CLOEXEC | O_NOCTTY;
    const base::FileDescriptor descriptor(
        ::open(path.c_str(), rules.followsLink ? flags : flags | O_NOFOLLOW));
    if (!descriptor.isOpen()) {
        return failed(errno == ENOENT ? ReadFailure::missing : ReadFailure::unreadable, errno);
    }
    RegularFile file;
    if (::fstat(descriptor.get(), &file.status) != 0) {
        return failed(ReadFailure::unreadable, errno);
    }
    if (!S_ISREG(file.status.st_mode)) {
        return failed(ReadFailure::notRegular);
    }
    if (!readAll(descriptor.get(), limit, file)) {
        return failed(ReadFailure::unreadable, errno);
    }
    if (file.bytes.size() > limit) {
        if (!rules.takesBeginning) {
            return failed(ReadFailure::tooLarge);
        }
        file.bytes.resize(limit);
    }
    return file;
}

std::string distrust(const RegularFile& file, std::size_t limit) {
    switch (file.failure) {
    case ReadFailure::none:
        break;
    case ReadFailure::notRegular:
        return "not a regular file";
    case ReadFailure::tooLarge:
        return base::concat("larger than ", limit, " bytes");
    case ReadFailure::missing:
    case ReadFailure::unreadable:
        return base::concat("cannot be read: ", std::generic_category().message(file.error));
    }
    if (file.status.st_uid != 0 && file.status.st_uid != ::geteuid()) {
        return base::concat("owned by user ", file.status.st_uid,
                            ", neither root nor the daemon's own");
    }
    if ((file.status.st_mode & (S_IWGRP | S_IWOTH)) != 0) {
        return "writable by group or others";
    }
    return {};
}

} // namespace platform
