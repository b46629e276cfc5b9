#pragma once

#include "base/FileDescriptor.h"

#include <chrono>
#include <optional>
#include <string>
#include <sys/types.h>

namespace platform {

/// What became of an attempt to connect to a service of this machine.
struct LocalConnection {
    base::FileDescriptor socket = {};
    /// An errno value; 0 when the socket is connected.
    int error = 0;
    /// Who serves, when that is a user who may not; the error is then EPERM.
    std::optional<uid_t> stranger = std::nullopt;
};

/// Connects to the socket at `path`, which is of that type. Whoever listens must run as root or as
/// the user of this process. `timeout` bounds the connection itself, ETIMEDOUT then, and each
/// blocking operation on the socket afterwards, which fails with EAGAIN.
[[nodiscard]] LocalConnection connectLocally(const std::string& path, int type,
                                             std::chrono::milliseconds timeout);

} // namespace platform
