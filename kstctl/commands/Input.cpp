#include "kstctl/commands/Input.h"

#include "kstctl/FileError.h"
#include "platform/linux/RegularFile.h"

#include <array>
#include <cerrno>
#include <unistd.h>
#include <utility>

namespace kstctl {

namespace {

platform::Error tooLong(const std::string& path) {
    return failure(ExitStatus::malformed,
                   base::concat(path, ": longer than ", kMaxInputSize, " bytes"));
}

platform::Result<platform::Bytes> readStandardInput() {
    constexpr char kName[] = "standard input";
    platform::Bytes bytes;
    std::array<std::uint8_t, 4096> buffer{};
    for (;;) {
        const ssize_t count = ::read(STDIN_FILENO, buffer.data(), buffer.size());
        if (count == 0) {
            return bytes;
        }
        if (count < 0 && errno != EINTR) {
            return fileError(kName, errno);
        }
        bytes.insert(bytes.end(), buffer.begin(), buffer.begin() + (count > 0 ? count : 0));
        if (bytes.size() > kMaxInputSize) {
            return tooLong(kName);
        }
    }
}

} // namespace

platform::Result<platform::Bytes> readInput(const std::string& path) {
    if (path == "-") {
        return readStandardInput();
    }
    platform::RegularFile file = platform::readRegularFile(path, kMaxInputSize);
    switch (file.failure) {
    case platform::ReadFailure::none:
        return std::move(file.bytes);
    case platform::ReadFailure::notRegular:
        return failure(ExitStatus::malformed, base::concat(path, " is not a regular file"));
    case platform::ReadFailure::tooLarge:
        return tooLong(path);
    case platform::ReadFailure::missing:
    case platform::ReadFailure::unreadable:
        break;
    }
    return fileError(path, file.error);
}

} // namespace kstctl
