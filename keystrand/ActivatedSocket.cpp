#include "keystrand/ActivatedSocket.h"

#include <systemd/sd-daemon.h>

#include <cstdlib>
#include <fcntl.h>
#include <string_view>
#include <sys/socket.h>
#include <utility>

namespace keystrand {

namespace {

constexpr std::string_view kActivationName = "service";

/// What was handed over under that name.
base::FileDescriptor takeNamed(std::string_view name) {
    char** names = nullptr;
    const int count = sd_listen_fds_with_names(1, &names);
    base::FileDescriptor found;
    for (int i = 0; i < count; ++i) {
        base::FileDescriptor candidate(SD_LISTEN_FDS_START + i);
        if (names[i] == name && !found.isOpen()) {
            found = std::move(candidate);
        }
        std::free(names[i]);
    }
    std::free(names);
    return found;
}

} // namespace

std::optional<base::FileDescriptor> takeActivatedServiceSocket(std::string& error) {
    base::FileDescriptor socket = takeNamed(kActivationName);
    if (!socket.isOpen()) {
        return socket;
    }
    if (sd_is_socket(socket.get(), AF_UNIX, SOCK_SEQPACKET, 1) <= 0) {
        error = "the activated socket is not a listening packet socket";
        return std::nullopt;
    }
    // The loop that watches it never waits for a client.
    if (::fcntl(socket.get(), F_SETFL, O_NONBLOCK) != 0) {
        error = "the activated socket cannot be used";
        return std::nullopt;
    }
    return socket;
}

} // namespace keystrand
