#pragma once

#include <cstdint>

namespace platform {

/// The result of a platform operation: 0 is success. A failure that the platform itself found is
/// kPlatformStatusBase - errno, so it lies between -1001 and -5095 and never meets the library's
/// own codes (-1 to -7). Any other value came from the kernel side and is passed on unchanged.
using Status = std::int32_t;

inline constexpr Status kSuccess = 0;
inline constexpr Status kPlatformStatusBase = -1000;

[[nodiscard]] constexpr Status statusFromErrno(int error) {
    return kPlatformStatusBase - error;
}

/// The error of a failure that the platform itself found; 0 for any other status.
[[nodiscard]] constexpr int errnoFromStatus(Status status) {
    constexpr int kLastError = 4095;
    const int error = kPlatformStatusBase - status;
    return status < kPlatformStatusBase && error <= kLastError ? error : 0;
}

} // namespace platform
