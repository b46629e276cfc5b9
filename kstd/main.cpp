#include "kstd/Analytics/Analytics.h"
#include "kstd/Daemon.h"
#include "platform/linux/EventSocket.h"
#include "platform/linux/LinuxHost.h"
#include "platform/linux/StopRequest.h"

#include <chrono>
#include <csignal>
#include <cstdlib>
#include <exception>
#include <optional>

namespace {

/// How long the daemon stays when nothing happens. The next event launches it again.
constexpr std::chrono::seconds kIdleTime{30};

} // namespace

int main() {
    const platform::StopRequest stop;
    // A peer that hangs up shows as a status, not as a signal.
    std::signal(SIGPIPE, SIG_IGN);

    std::optional<platform::LinuxHost> host;
    try {
        host.emplace(platform::LinuxHostOptions{.paths = platform::Paths("/"),
                                                .eventSocket = platform::takeActivatedEventSocket(),
                                                .idleTime = kIdleTime,
                                                .stop = &stop});
    } catch (const std::exception&) {
        // The host has said why.
        return EXIT_FAILURE;
    }
    return host->run([](const platform::Host& interfaces) {
        const kstd::DaemonLibrary library(interfaces);
        const kstd::AnalyticsLifetime analytics;
        return kstd::Daemon(interfaces, kstd::makeServices(interfaces)).run();
    });
}
