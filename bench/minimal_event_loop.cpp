// The least that a daemon on the same foundation can be: an event loop that waits on an event
// socket.

#include <systemd/sd-event.h>

#include <cstdint>
#include <cstdio>
#include <cstring>
#include <sys/socket.h>
#include <sys/un.h>
#include <unistd.h>

namespace {

int eventSocket(const char* path) {
    sockaddr_un address{};
    address.sun_family = AF_UNIX;
    std::strncpy(address.sun_path, path, sizeof address.sun_path - 1);
    const int socket = ::socket(AF_UNIX, SOCK_DGRAM | SOCK_NONBLOCK | SOCK_CLOEXEC, 0);
    ::unlink(path);
    return ::bind(socket, reinterpret_cast<const sockaddr*>(&address), sizeof address) == 0 ? socket
                                                                                            : -1;
}

int receive(sd_event_source* /*source*/, int socket, std::uint32_t /*events*/, void* /*data*/) {
    char datagram[4096];
    return ::recv(socket, datagram, sizeof datagram, 0) < 0 ? -1 : 0;
}

} // namespace

int main(int argc, char** argv) {
    sd_event* loop = nullptr;
    if (argc != 2 || ::sd_event_new(&loop) < 0 ||
        ::sd_event_add_io(loop, nullptr, eventSocket(argv[1]), EPOLLIN, receive, nullptr) < 0) {
        return 1;
    }
    std::fputs("Entering the main runloop.\n", stderr);
    return ::sd_event_loop(loop);
}
