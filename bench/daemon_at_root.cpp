// The daemon as kstd/main.cpp makes it, with its paths under the directory that its argument names:
// what kstd-dev does without options to read, which would count in its start.

#include "kstd/Analytics/Analytics.h"
#include "kstd/Daemon.h"
#include "platform/linux/EventSocket.h"
#include "platform/linux/LinuxHost.h"
#include "platform/linux/StopRequest.h"

#include <csignal>
#include <utility>

int main(int argc, char** argv) {
    if (argc != 2) {
        return 1;
    }
    const platform::StopRequest stop;
    std::signal(SIGPIPE, SIG_IGN);
    const platform::Paths paths(argv[1]);
    auto activated = platform::takeActivatedEventSocket();
    auto events =
        activated.isOpen() ? std::move(activated) : platform::makeEventSocket(paths.eventSocket());
    platform::LinuxHost host({.paths = paths, .eventSocket = std::move(events), .stop = &stop});
    const platform::Host interfaces = host.interfaces();
    const kstd::DaemonLibrary library(interfaces);
    const kstd::AnalyticsLifetime analytics;
    return kstd::Daemon(interfaces, kstd::makeServices(interfaces)).run();
}
