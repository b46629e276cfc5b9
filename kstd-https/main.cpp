#include "base/FileDescriptor.h"
#include "kstd-https/RequestService.h"
#include "platform/https/HTTPTransfer.h"

#include <CLI/CLI.hpp>

#include <chrono>
#include <cmath>
#include <csignal>
#include <cstdio>
#include <cstdlib>
#include <exception>
#include <optional>
#include <string>
#include <utility>

namespace {

using platform::HTTPLimits;

void addLimit(CLI::App& app, const char* name, HTTPLimits::Time& limit, const char* description) {
    constexpr double kMillisecondsPerSecond = 1000;
    constexpr double kLeast = 0.001;
    constexpr double kMost = 24 * 60 * 60;
    app.add_option_function<double>(
           name,
           [&limit](double seconds) {
               limit = HTTPLimits::Time(static_cast<HTTPLimits::Time::rep>(
                   std::llround(seconds * kMillisecondsPerSecond)));
           },
           description)
        ->check(CLI::Range(kLeast, kMost))
        ->default_str(
            std::to_string(std::chrono::duration_cast<std::chrono::seconds>(limit).count()));
}

/// The options of the command line. None, with the status to end with, when there is nothing to do
/// but end.
std::optional<platform::HTTPOptions> parseOptions(int argc, const char* const* argv,
                                                  int& exitStatus) {
    platform::HTTPOptions options;
    CLI::App app("Makes one HTTP or HTTPS request for the daemon, over the connection that is its "
                 "descriptor 3.",
                 "kstd-https");
    app.add_option("--trust-anchors", options.trustAnchors,
                   "Certificates (PEM) that servers are trusted by")
        ->capture_default_str();
    platform::HTTPLimits& limits = options.limits;
    addLimit(app, "--connect-limit", limits.connecting,
             "Seconds that the way to a server may take, its handshake included");
    addLimit(app, "--fetch-limit", limits.fetching, "Seconds that a GET may take");
    addLimit(app, "--send-limit", limits.sending,
             "Seconds that a document may take, and again for each full 4 MiB of it");
    addLimit(app, "--answer-limit", limits.answering,
             "Seconds that a server may take to answer a document");
    try {
        app.parse(argc, argv);
    } catch (const CLI::ParseError& problem) {
        exitStatus = app.exit(problem);
        return std::nullopt;
    }
    return options;
}

} // namespace

int main(int argc, char** argv) try {
    // Nothing that the environment says about proxies, certificates, names of hosts or the settings
    // of libraries is obeyed.
    ::clearenv();
    // A peer that hangs up shows as a status, not as a signal.
    std::signal(SIGPIPE, SIG_IGN);

    int exitStatus = 0;
    const auto options = parseOptions(argc, argv, exitStatus);
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
} catch (const std::exception& problem) {
    std::fprintf(stderr, "kstd-https: %s\n", problem.what());
    return EXIT_FAILURE;
}
