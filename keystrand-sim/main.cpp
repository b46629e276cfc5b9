#include "base/Concat.h"
#include "keystrand-sim/ControlClient.h"
#include "keystrand-sim/Options.h"
#include "keystrand-sim/Paths.h"
#include "keystrand-sim/Simulator.h"
#include "keystrand/ListeningSocket.h"

#include <systemd/sd-daemon.h>

#include <csignal>
#include <cstdio>
#include <string>
#include <utility>

namespace {

constexpr int kUnreachable = 2;

std::string joined(const std::vector<std::string>& words) {
    std::string line;
    for (const std::string& word : words) {
        line += line.empty() ? word : base::concat(' ', word);
    }
    return line;
}

int sendControlCommand(const keystrand::sim::Paths& paths, const std::vector<std::string>& words) {
    auto client = keystrand::sim::ControlClient::connect(paths.controlSocket);
    if (!client) {
        std::fprintf(stderr, "keystrand-sim: nobody listens at %s\n", paths.controlSocket.c_str());
        return kUnreachable;
    }
    const auto answer = client->command(joined(words));
    for (const std::string& line : answer.lines) {
        std::puts(line.c_str());
    }
    if (!answer.ok) {
        std::fprintf(stderr, "keystrand-sim: %s\n", answer.reason.c_str());
        return 1;
    }
    return 0;
}

int simulate(const keystrand::sim::Simulator::Settings& settings) {
    std::string error;
    auto activated = keystrand::takeActivatedServiceSocket(error);
    const auto simulator =
        activated ? keystrand::sim::Simulator::create(settings, std::move(*activated), error)
                  : nullptr;
    if (!simulator) {
        std::fprintf(stderr, "keystrand-sim: %s\n", error.c_str());
        return 1;
    }
    std::puts("keystrand-sim: ready");
    std::fflush(stdout);
    sd_notify(0, "READY=1");
    return simulator->run() ? 0 : 1;
}

} // namespace

int main(int argc, char** argv) {
    std::signal(SIGPIPE, SIG_IGN);
    int exitStatus = 0;
    const auto options = keystrand::sim::parseOptions(argc, argv, exitStatus);
    if (!options) {
        return exitStatus;
    }
    if (options->controlWords) {
        return sendControlCommand(keystrand::sim::Paths(options->settings.root),
                                  *options->controlWords);
    }
    return simulate(options->settings);
}
