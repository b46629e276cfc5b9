#include "kstctl/status/BoundSockets.h"

#include <charconv>
#include <fstream>
#include <sstream>
#include <sys/stat.h>

namespace kstctl {

namespace {

/// Whether two paths lead to the same file.
bool isSameFile(const std::string& one, const struct stat& other) {
    struct stat status {};
    return ::stat(one.c_str(), &status) == 0 && status.st_dev == other.st_dev &&
           status.st_ino == other.st_ino;
}

/// Among a socket's flags, in hexadecimal digits.
bool hasListeningFlag(const std::string& flags) {
    constexpr unsigned kAcceptsConnections = 0x10000;
    constexpr int kHexadecimal = 16;
    unsigned value = 0;
    std::from_chars(flags.data(), flags.data() + flags.size(), value, kHexadecimal);
    return (value & kAcceptsConnections) != 0;
}

} // namespace

std::vector<BoundSocket> socketsBoundTo(const std::string& path) {
    std::vector<BoundSocket> sockets;
    struct stat status {};
    if (::stat(path.c_str(), &status) != 0) {
        return sockets;
    }
    std::ifstream table("/proc/net/unix");
    std::string line;
    std::getline(table, line);
    while (std::getline(table, line)) {
        std::istringstream words(line);
        std::string address;
        std::string users;
        std::string protocol;
        std::string flags;
        std::string type;
        std::string state;
        BoundSocket socket;
        words >> address >> users >> protocol >> flags >> type >> state >> socket.number >> std::ws;
        std::string bound;
        std::getline(words, bound);
        if (bound.starts_with('/') && isSameFile(bound, status)) {
            socket.isListening = hasListeningFlag(flags);
            sockets.push_back(socket);
        }
    }
    return sockets;
}

} // namespace kstctl
