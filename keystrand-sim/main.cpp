#include "base/Concat.h"
#include "keystrand-sim/ControlClient.h"
#include "keystrand-sim/Simulator.h"
#include "keystrand/ListeningSocket.h"
#include "wire/SystemPaths.h"

#include <CLI/CLI.hpp>
#include <systemd/sd-daemon.h>

#include <csignal>
#include <cstdio>
#include <exception>
#include <limits>
#include <optional>
#include <string>
#include <utility>
#include <vector>

namespace {

using keystrand::sim::Simulator;

constexpr int kUnreachable = 2;

/// What the command line asks for.
struct CommandLine {
    Simulator::Settings settings;
    /// The words of a control command to send; none to be the simulator.
    std::optional<std::vector<std::string>> controlWords;
};

/// None when there is nothing to run; `exitStatus` is then the program's status, and what is to be
/// said has been said.
std::optional<CommandLine> parseOptions(int argc, const char* const* argv, int& exitStatus) {
    constexpr auto kMaxPeriod = std::numeric_limits<std::uint32_t>::max();
    CommandLine options;
    Simulator::Settings& settings = options.settings;
    CLI::App app("Stands in for the kernel service behind a socket.", "keystrand-sim");
    app.add_option("--root", settings.root, "All paths lie under this directory")
        ->capture_default_str();
    app.add_option("--period", settings.periods.untilRestricted,
                   "Seconds from locking to restricted mode")
        ->check(CLI::Range(std::uint32_t{1}, kMaxPeriod))
        ->capture_default_str();
    app.add_option("--analytics-period", settings.periods.analytics,
                   "Seconds that the collected figures cover")
        ->check(CLI::Range(std::uint32_t{1}, kMaxPeriod))
        ->capture_default_str();
    app.add_option("--clock", settings.clock,
                   "Stand still at this time (seconds since 1970) until told to move")
        ->check(CLI::Range(keystrand::RestrictedModeTimer::Seconds{1},
                           keystrand::RestrictedModeTimer::kLatestTime));
    unsigned logLevel = settings.logLevel;
    app.add_option("--log-level", logLevel, "The library's log level")
        ->check(CLI::Range(0U, 255U))
        ->capture_default_str();

    app.add_flag("--quiet", settings.quiet, "Publish nothing but what a command asks for");

    app.add_option("--policies", settings.policies, "The policies are in this file");

    std::vector<std::string> words;
    CLI::App* control = app.add_subcommand("ctl", "Send one command to a running simulator");
    control->add_option("--root", settings.root, "The running simulator's root directory")
        ->capture_default_str();
    control->add_option("words", words, "The command; `help` lists them")->required();
    try {
        app.parse(argc, argv);
    } catch (const CLI::ParseError& problem) {
        exitStatus = app.exit(problem);
        return std::nullopt;
    }
    settings.logLevel = static_cast<std::uint8_t>(logLevel);
    if (control->parsed()) {
        options.controlWords = std::move(words);
    }
    return options;
}

std::string joined(const std::vector<std::string>& words) {
    std::string line;
    for (const std::string& word : words) {
        line += line.empty() ? word : base::concat(' ', word);
    }
    return line;
}

int sendControlCommand(const std::string& root, const std::vector<std::string>& words) {
    const std::string path = wire::underRoot(root, wire::kSimulatorControlSocket);
    auto client = keystrand::sim::ControlClient::connect(path);
    if (!client) {
        std::fprintf(stderr, "keystrand-sim: nobody listens at %s\n", path.c_str());
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

int simulate(const Simulator::Settings& settings) {
    std::string error;
    auto activated = keystrand::takeActivatedServiceSocket(error);
    const auto simulator =
        activated ? Simulator::create(settings, std::move(*activated), error) : nullptr;
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

int main(int argc, char** argv) try {
    std::signal(SIGPIPE, SIG_IGN);
    int exitStatus = 0;
    const auto options = parseOptions(argc, argv, exitStatus);
    if (!options) {
        return exitStatus;
    }
    if (options->controlWords) {
        return sendControlCommand(options->settings.root, *options->controlWords);
    }
    return simulate(options->settings);
} catch (const std::exception& problem) {
    std::fprintf(stderr, "keystrand-sim: %s\n", problem.what());
    return 1;
}
