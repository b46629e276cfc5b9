#include "tests/platform/linux/SystemCalls.h"

#include <algorithm>
#include <cerrno>
#include <filesystem>
#include <sys/types.h>
#include <system_error>
#include <unistd.h>

namespace support {

namespace {

SystemCalls* theCurrent = nullptr;

/// Takes the error that is ordered for this call; 0 when there is none.
int takeError(std::deque<int>& errors) {
    if (errors.empty()) {
        return 0;
    }
    const int error = errors.front();
    errors.pop_front();
    return error;
}

int fail(int error) {
    errno = error;
    return -1;
}

} // namespace

SystemCalls::SystemCalls() {
    theCurrent = this;
}

SystemCalls::~SystemCalls() {
    theCurrent = nullptr;
}

SystemCalls* SystemCalls::current() {
    return theCurrent;
}

std::string SystemCalls::pathOf(int descriptor) const {
    std::error_code error;
    const std::string path =
        std::filesystem::read_symlink("/proc/self/fd/" + std::to_string(descriptor), error);
    return !error && path.starts_with(root) ? path.substr(root.size()) : std::string();
}

} // namespace support

using support::fail;
using support::SystemCalls;
using support::takeError;

// The names are the linker's: it resolves a call of x to __wrap_x, and __real_x to x.
// NOLINTBEGIN(bugprone-reserved-identifier)
extern "C" {

ssize_t __real_pwrite(int descriptor, const void* data, std::size_t size, off_t offset);
int __real_fsync(int descriptor);
int __real_fchmod(int descriptor, mode_t mode);
int __real_close(int descriptor);

ssize_t __wrap_pwrite(int descriptor, const void* data, std::size_t size, off_t offset) {
    SystemCalls* const calls = SystemCalls::current();
    const std::string path = calls == nullptr ? std::string() : calls->pathOf(descriptor);
    if (path.empty()) {
        return __real_pwrite(descriptor, data, size, offset);
    }
    calls->calls.push_back("pwrite " + path + " " + std::to_string(size));
    if (const int error = takeError(calls->pwriteErrors); error != 0) {
        return fail(error);
    }
    return __real_pwrite(descriptor, data, std::min(size, calls->pwriteAtMost), offset);
}

int __wrap_fsync(int descriptor) {
    SystemCalls* const calls = SystemCalls::current();
    const std::string path = calls == nullptr ? std::string() : calls->pathOf(descriptor);
    if (path.empty()) {
        return __real_fsync(descriptor);
    }
    calls->calls.push_back("fsync " + path);
    const int error = takeError(calls->fsyncErrors);
    return error == 0 ? __real_fsync(descriptor) : fail(error);
}

int __wrap_fchmod(int descriptor, mode_t mode) {
    SystemCalls* const calls = SystemCalls::current();
    const std::string path = calls == nullptr ? std::string() : calls->pathOf(descriptor);
    if (path.empty()) {
        return __real_fchmod(descriptor, mode);
    }
    calls->calls.push_back("fchmod " + path);
    const int error = takeError(calls->fchmodErrors);
    return error == 0 ? __real_fchmod(descriptor, mode) : fail(error);
}

int __wrap_close(int descriptor) {
    SystemCalls* const calls = SystemCalls::current();
    const std::string path = calls == nullptr ? std::string() : calls->pathOf(descriptor);
    if (path.empty()) {
        return __real_close(descriptor);
    }
    calls->calls.push_back("close " + path);
    const int error = takeError(calls->closeErrors);
    const int result = __real_close(descriptor);
    return error == 0 ? result : fail(error);
}

} // extern "C"
// NOLINTEND(bugprone-reserved-identifier)
