#pragma once

#include <string>

namespace keystrand::sim {

/// Where the program's sockets are, under its root directory.
struct Paths {
    explicit Paths(const std::string& root);

    std::string runDirectory;
    std::string serviceDirectory;
    std::string serviceSocket;
    std::string controlSocket;
    std::string eventSocket;
};

} // namespace keystrand::sim
