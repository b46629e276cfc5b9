#pragma once

#include "base/NotCopied.h"

#include <chrono>
#include <cstdint>
#include <optional>

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
    const bool isOurs = status < kPlatformStatusBase && status >= kPlatformStatusBase - kLastError;
    return isOurs ? kPlatformStatusBase - status : 0;
}

/// What the registry and the channel have in common, whose requests go to the kernel service: how
/// long they may take together, and the process that the connections belong to.
///
/// A double that has neither time nor connections leaves these operations as they are.
class KernelConnections : private base::NotCopied {
  public:
    using Deadline = std::chrono::steady_clock::time_point;

    virtual ~KernelConnections() = default;

    /// Until when everything that is sent from now on must be answered; what is not fails with the
    /// status of ETIMEDOUT. None, as at first: each request has the whole time limit for itself.
    virtual void setDeadline(std::optional<Deadline> /*deadline*/) noexcept {}

    /// Whether a connection was made by another process, of which this one is a child.
    [[nodiscard]] virtual bool isInherited() const noexcept { return false; }

    /// To be called in a child process: gives up the connections of the parent, to which nothing
    /// is sent and nothing happens. Does only what a child of a process with several threads may.
    virtual void leaveToParent() noexcept {}
};

} // namespace platform
