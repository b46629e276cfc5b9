#pragma once

#include "base/FileDescriptor.h"
#include "base/UnixAddress.h"

#include <chrono>
#include <optional>
#include <string_view>
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

/// Connects to the socket at that address, which is of that type. Whoever listens must run as root
/// or as the user of this process. `timeout` bounds the connection itself, ETIMEDOUT then, and each
/// blocking operation on the socket afterwards, which fails with EAGAIN. The system's timers for
/// both are late by up to an eighth.
[[nodiscard]] LocalConnection connectLocally(const base::UnixAddress& address, int type,
                                             std::chrono::microseconds timeout);

/// The same by the socket's path; ENAMETOOLONG when it cannot be the path of one.
[[nodiscard]] LocalConnection connectLocally(std::string_view path, int type,
                                             std::chrono::microseconds timeout);

/// Sets SO_SNDTIMEO or SO_RCVTIMEO of a socket; less than a microsecond is one.
void setTimeLimit(int socket, int option, std::chrono::microseconds time);

} // namespace platform
