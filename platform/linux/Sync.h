#pragma once

#include <cerrno>
#include <unistd.h>

namespace platform {

/// Forces a file's or directory's contents to permanent storage. 0 or the error's number.
[[nodiscard]] inline int syncDescriptor(int descriptor) {
    int result = 0;
    do {
        result = ::fsync(descriptor);
    } while (result != 0 && errno == EINTR);
    return result == 0 ? 0 : errno;
}

} // namespace platform
