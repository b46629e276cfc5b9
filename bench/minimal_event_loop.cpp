// The least that a daemon on the same foundation can be: an event loop that waits on an event
// socket, which it makes, or finds as descriptor 3 when it is told whom to answer there.

#include <systemd/sd-event.h>

#include <cstdint>
#include <cstdio>
#include <cstring>
#include <sys/socket.h>
#include <sys/un.h>
#include <unistd.h>

namespace {

sockaddr_un addressOf(const char* path) {
    sockaddr_un address{};
    address.sun_family = AF_UNIX;
    std::strncpy(address.sun_path, path, sizeof address.sun_path - 1);
    return address;
}

int eventSocket(const char* path) {
    const sockaddr_un address = addressOf(path);
    const int socket = ::socket(AF_UNIX, SOCK_DGRAM | SOCK_NONBLOCK | SOCK_CLOEXEC, 0);
    ::unlink(path);
    return ::bind(socket, reinterpret_cast<const sockaddr*>(&address), sizeof address) == 0 ? socket
                                                                                            : -1;
}

/// Answers at the address `data`, if there is one.
int receive(sd_event_source* /*source*/, int socket, std::uint32_t /*events*/, void* data) {
    char datagram[4096];
    if (::recv(socket, datagram, sizeof datagram, 0) < 0) {
        return -1;
    }
    if (data == nullptr) {
        return 0;
    }
    const sockaddr_un address = addressOf(static_cast<const char*>(data));
    return ::sendto(socket, "done", 4, 0, reinterpret_cast<const sockaddr*>(&address),
                    sizeof address) < 0
               ? -1
               : 0;
}

} // namespace

int main(int argc, char** argv) {
    constexpr int kActivated = 3;
    sd_event* loop = nullptr;
    if (argc < 2 || ::sd_event_new(&loop) < 0 ||
        ::sd_event_add_io(loop, nullptr, argc == 2 ? eventSocket(argv[1]) : kActivated, EPOLLIN,
                          receive, argc == 2 ? nullptr : argv[2]) < 0) {
        return 1;
    }
    std::fputs("Entering the main runloop.\n", stderr);
    return ::sd_event_loop(loop);
}
