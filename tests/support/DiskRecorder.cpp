#include "tests/support/DiskRecorder.h"

#include <algorithm>
#include <fcntl.h>
#include <filesystem>
#include <fstream>
#include <string_view>
#include <sys/socket.h>
#include <sys/syscall.h>
#include <sys/uio.h>
#include <utility>

namespace support {

namespace {

namespace fs = std::filesystem;
using What = DiskStep::What;

bool isThere(const std::string& path) {
    std::error_code error;
    return fs::exists(fs::symlink_status(path, error));
}

/// Where the next write through a descriptor goes to.
std::uint64_t positionOf(const SystemCall& call) {
    std::ifstream info("/proc/" + std::to_string(call.thread) + "/fdinfo/" +
                       std::to_string(static_cast<int>(call.arguments[0])));
    std::string word;
    std::uint64_t position = 0;
    info >> word >> position;
    return position;
}

std::vector<std::uint8_t> bytesOfVectors(const SystemCall& call, std::uint64_t address,
                                         std::uint64_t count) {
    const auto raw = call.bytesAt(address, count * sizeof(iovec));
    std::vector<std::uint8_t> bytes;
    for (std::size_t at = 0; at + sizeof(iovec) <= raw.size(); at += sizeof(iovec)) {
        iovec vector{};
        std::copy_n(raw.data() + at, sizeof vector, reinterpret_cast<std::uint8_t*>(&vector));
        const auto part =
            call.bytesAt(reinterpret_cast<std::uint64_t>(vector.iov_base), vector.iov_len);
        bytes.insert(bytes.end(), part.begin(), part.end());
    }
    return bytes;
}

std::vector<std::uint8_t> bytesOfMessage(const SystemCall& call, std::uint64_t address) {
    const auto raw = call.bytesAt(address, sizeof(msghdr));
    msghdr message{};
    if (raw.size() != sizeof message) {
        return {};
    }
    std::copy_n(raw.data(), sizeof message, reinterpret_cast<std::uint8_t*>(&message));
    return bytesOfVectors(call, reinterpret_cast<std::uint64_t>(message.msg_iov),
                          message.msg_iovlen);
}

} // namespace

void DiskRecorder::note(const SystemCall& call) {
    const auto& arguments = call.arguments;
    const int descriptor = static_cast<int>(arguments[0]);
    const auto path = [&call, &arguments](std::size_t index) {
        return call.pathAt(AT_FDCWD, arguments[index]);
    };
    const auto pathAt = [&call, &arguments](std::size_t index) {
        return call.pathAt(static_cast<int>(arguments[index - 1]), arguments[index]);
    };
    switch (call.number) {
    case SYS_openat:
        return noteOpening(pathAt(1), arguments[2]);
    case SYS_write:
        return noteWrite(call, call.bytesAt(arguments[1], arguments[2]), positionOf(call));
    case SYS_writev:
        return noteWrite(call, bytesOfVectors(call, arguments[1], arguments[2]), positionOf(call));
    case SYS_pwrite64:
        return noteWrite(call, call.bytesAt(arguments[1], arguments[2]), arguments[3]);
    case SYS_ftruncate:
        return add({What::resize, call.fileBehind(descriptor), {}, arguments[1], {}});
    case SYS_fsync:
    case SYS_fdatasync:
        return noteSync(call.fileBehind(descriptor));
    case SYS_unlinkat:
        return noteRemoval(pathAt(1));
    case SYS_renameat:
    case SYS_renameat2:
        return add({What::rename, pathAt(1), pathAt(3), 0, {}});
    case SYS_mkdirat:
        return isThere(pathAt(1)) ? void() : add({What::makeDirectory, pathAt(1), {}, 0, {}});
    case SYS_sendmsg:
        return noteSaid(bytesOfMessage(call, arguments[1]));
#ifdef SYS_open
    case SYS_open:
        return noteOpening(path(0), arguments[1]);
    case SYS_unlink:
        return noteRemoval(path(0));
    case SYS_rename:
        return add({What::rename, path(0), path(1), 0, {}});
    case SYS_mkdir:
        return isThere(path(0)) ? void() : add({What::makeDirectory, path(0), {}, 0, {}});
#endif
    default:
        break;
    }
}

void DiskRecorder::noteOpening(const std::string& path, std::uint64_t flags) {
    if ((flags & O_CREAT) != 0 && !isThere(path)) {
        add({What::makeFile, path, {}, 0, {}});
    } else if ((flags & O_TRUNC) != 0 && isThere(path)) {
        add({What::resize, path, {}, 0, {}});
    }
}

void DiskRecorder::noteRemoval(const std::string& path) {
    if (isThere(path)) {
        add({What::removeFile, path, {}, 0, {}});
    }
}

void DiskRecorder::noteWrite(const SystemCall& call, std::vector<std::uint8_t> bytes,
                             std::uint64_t offset) {
    const std::string path = call.fileBehind(static_cast<int>(call.arguments[0]));
    if (isInside(path)) {
        add({What::write, path, {}, offset, std::move(bytes)});
    } else {
        noteSaid(bytes);
    }
}

void DiskRecorder::noteSync(const std::string& path) {
    add({fs::is_directory(path) ? What::syncDirectory : What::sync, path, {}, 0, {}});
}

void DiskRecorder::noteSaid(const std::vector<std::uint8_t>& bytes) {
    steps_.push_back({What::mark, {}, std::string(bytes.begin(), bytes.end()), 0, {}});
}

void DiskRecorder::add(DiskStep step) {
    if (!isInside(step.path)) {
        return;
    }
    step.path = step.path == root_ ? "/" : step.path.substr(root_.size());
    if (step.what == What::rename) {
        step.other.erase(0, root_.size());
    }
    steps_.push_back(std::move(step));
}

bool DiskRecorder::isInside(const std::string& path) const {
    return path == root_ || path.starts_with(root_ + '/');
}

} // namespace support
