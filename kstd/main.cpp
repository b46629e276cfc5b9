#include "KSTLib/Platform.h"
#include "kstd/Analytics/AnalyticsLifetime.h"
#include "kstd/Daemon.h"
#include "kstd/MessageIds.h"
#include "platform/linux/EventSocket.h"
#include "platform/linux/LinuxHost.h"
#include "platform/linux/StopRequest.h"

#include <chrono>
#include <csignal>

namespace {

/// How long the daemon stays when nothing happens. The next event launches it again.
constexpr std::chrono::seconds kIdleTime{30};

} // namespace

int main() {
    const platform::StopRequest stop;
    // A peer that hangs up shows as a status, not as a signal.
    std::signal(SIGPIPE, SIG_IGN);

    platform::LinuxHost host({.paths = platform::Paths("/"),
                              .eventSocket = platform::takeActivatedEventSocket(),
                              .idleTime = kIdleTime,
                              .messageClasses = kstd::messageClasses(),
                              .stop = &stop});
    const platform::Host interfaces = host.interfaces();
    kst::installPlatform({interfaces.log, interfaces.registry, interfaces.channel});
    const kstd::AnalyticsLifetime analytics;
    return kstd::Daemon(interfaces, kstd::makeServices(interfaces)).run();
}
