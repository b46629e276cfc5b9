#pragma once

#include "base/FileDescriptor.h"
#include "platform/Result.h"
#include "platform/linux/Paths.h"

#include <optional>
#include <string>
#include <sys/types.h>
#include <vector>

namespace kstctl {

/// The event socket, and a connection to it over which nothing was sent.
struct EventSocketFile {
    std::string path;
    bool isPresent = false;
    uid_t owner = 0;
    /// Permission bits.
    unsigned mode = 0;
    base::FileDescriptor connection{};
    /// Why there is no connection. ExitStatus::missing: there is no such file, or nobody keeps the
    /// socket open.
    std::optional<platform::Error> problem{};

    [[nodiscard]] static EventSocketFile look(const platform::Paths& paths);
};

/// A local socket of this machine, whoever holds it.
struct BoundSocket {
    /// As links of /proc say it.
    std::string number;
    /// It takes connections.
    bool isListening = false;
};

/// The sockets that are bound to the path. Nobody notices the look.
[[nodiscard]] std::vector<BoundSocket> socketsBoundTo(const std::string& path);

} // namespace kstctl
