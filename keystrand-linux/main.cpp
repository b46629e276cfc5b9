#include "keystrand-linux/JournalGateLog.h"
#include "keystrand-linux/KeystrandService.h"
#include "keystrand/ListeningSocket.h"

#include <CLI/CLI.hpp>
#include <systemd/sd-daemon.h>

#include <csignal>
#include <cstdio>
#include <exception>
#include <optional>
#include <string>
#include <utility>

namespace {

constexpr int kWrongUsage = 2;

struct CommandLine {
    std::string root = "/";
    bool restore = false;
    bool all = false;
};

/// None when there is nothing to run; `exitStatus` is then the program's status, and what is to be
/// said has been said.
std::optional<CommandLine> parseOptions(int argc, const char* const* argv, int& exitStatus) {
    CommandLine options;
    CLI::App app("Refuses new USB devices while the machine is locked.", "keystrand");
    app.add_option("--root", options.root, "All paths lie under this directory")
        ->capture_default_str();
    auto* const restore =
        app.add_flag("--restore", options.restore,
                     "Put back what a service that has ended left closed, and end");
    app.add_flag("--all", options.all, "Open all that is closed, whoever has closed it")
        ->needs(restore);
    try {
        app.parse(argc, argv);
    } catch (const CLI::ParseError& problem) {
        exitStatus = app.exit(problem) == 0 ? 0 : kWrongUsage;
        return std::nullopt;
    }
    return options;
}

using keystrand::usb::JournalGateLog;

int serve(const std::string& root, JournalGateLog::Target target, JournalGateLog& log) {
    std::string error;
    auto activated = keystrand::takeActivatedServiceSocket(error);
    const auto service =
        activated
            ? keystrand::usb::KeystrandService::create(root, std::move(*activated), log, error)
            : nullptr;
    if (!service) {
        std::fprintf(stderr, "keystrand: %s\n", error.c_str());
        return 1;
    }
    if (target == JournalGateLog::Target::journal) {
        log.write(keystrand::usb::GateLine::started, "keystrand: ready");
    } else {
        std::puts("keystrand: ready");
        std::fflush(stdout);
    }
    sd_notify(0, "READY=1");
    return service->run() ? 0 : 1;
}

} // namespace

int main(int argc, char** argv) try {
    std::signal(SIGPIPE, SIG_IGN);
    int exitStatus = 0;
    const auto options = parseOptions(argc, argv, exitStatus);
    if (!options) {
        return exitStatus;
    }
    const auto target = JournalGateLog::targetFor(options->root);
    JournalGateLog log(target);
    if (options->restore) {
        using Service = keystrand::usb::KeystrandService;
        return Service::restore(options->root,
                                options->all ? Service::Restored::all
                                             : Service::Restored::whatWasClosed,
                                keystrand::usb::SystemClocks(), log)
                   ? 0
                   : 1;
    }
    return serve(options->root, target, log);
} catch (const std::exception& problem) {
    std::fprintf(stderr, "keystrand: %s\n", problem.what());
    return 1;
}
