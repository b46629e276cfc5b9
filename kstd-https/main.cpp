#include "kstd-https/Connection.h"
#include "kstd-https/Options.h"
#include "kstd-https/Service.h"

#include <csignal>
#include <cstdio>
#include <cstdlib>
#include <string>
#include <utility>

int main(int argc, char** argv) {
    // Nothing that the environment says about proxies, certificates, names of hosts or the settings
    // of libraries is obeyed.
    ::clearenv();
    // A peer that hangs up shows as a status, not as a signal.
    std::signal(SIGPIPE, SIG_IGN);

    int exitStatus = 0;
    const auto options = https::parseOptions(argc, argv, exitStatus);
    if (!options) {
        return exitStatus;
    }
    std::string reason;
    base::FileDescriptor socket = https::takeConnection(reason);
    if (!socket.isOpen()) {
        std::fprintf(stderr, "kstd-https: %s\n", reason.c_str());
        return EXIT_FAILURE;
    }
    wire::HTTPConnection connection(std::move(socket), std::nullopt);
    if (!https::serve(connection, *options)) {
        std::fputs("kstd-https: what came is no request\n", stderr);
        return EXIT_FAILURE;
    }
    return EXIT_SUCCESS;
}
