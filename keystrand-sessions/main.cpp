// The ear of keystrand: tells it four words over a socket, and can do nothing else.

#include "base/Concat.h"
#include "keystrand-sessions/BusLogind.h"
#include "keystrand-sessions/KeystrandLink.h"
#include "keystrand-sessions/SessionsWatch.h"
#include "keystrand/EventLoop.h"
#include "keystrand/JournalLines.h"
#include "keystrand/Timers.h"

#include <csignal>
#include <cstdio>
#include <exception>
#include <string>
#include <string_view>

namespace {

constexpr char kHelp[] =
    "usage: keystrand-sessions [--root DIR]\n"
    "\n"
    "Tells keystrand whether the machine is locked, and when it sleeps.\n"
    "\n"
    "  --root DIR  the directory under which the sockets and logind's files are\n"
    "  --help      print this and exit\n";

int listen(const std::string& root) {
    using namespace keystrand;
    const auto loop = EventLoop::create();
    if (!loop) {
        std::fputs("keystrand-sessions: there is no room to run.\n", stderr);
        return 1;
    }
    const LineTarget target = lineTargetFor(root.empty() ? "/" : root);
    const auto writeTo = [target](sessions::SessionsLine about, const std::string& text) {
        const sessions::SessionsLineClass& is = sessions::classOf(about);
        writeLine(target, {.program = "keystrand-sessions",
                           .messageId = is.messageId,
                           .level = is.level,
                           .text = base::concat("keystrand-sessions: ", text)});
    };
    LoopTimers timers(*loop);
    sessions::BusLogind logind(*loop, timers,
                               {base::concat(root, "/run/dbus/system_bus_socket"),
                                base::concat(root, "/run/systemd/sessions")},
                               writeTo);
    sessions::SocketLink keystrand(*loop, timers,
                                   base::concat(root, "/run/keystrand/sessions.sock"));
    sessions::SessionsWatch watch(logind, keystrand, timers, writeTo);
    const EventSource termination = loop->signal(SIGTERM, [&loop] { loop->stop(); });
    const EventSource interruption = loop->signal(SIGINT, [&loop] { loop->stop(); });
    watch.start();
    return loop->run() ? 0 : 1;
}

} // namespace

int main(int argc, char** argv) try {
    constexpr int kWrongUsage = 2;
    const std::string_view option = argc > 1 ? argv[1] : "";
    if (argc == 2 && (option == "--help" || option == "-h")) {
        static_cast<void>(std::fputs(kHelp, stdout));
        return 0;
    }
    if (argc == 1) {
        return listen("");
    }
    if (argc == 3 && option == "--root") {
        return listen(argv[2]);
    }
    static_cast<void>(std::fputs(kHelp, stderr));
    return kWrongUsage;
} catch (const std::exception& problem) {
    std::fprintf(stderr, "keystrand-sessions: %s\n", problem.what());
    return 1;
}
