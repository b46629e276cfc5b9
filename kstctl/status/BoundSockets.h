#pragma once

#include <string>
#include <vector>

namespace kstctl {

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
