#include "kstd-https/Options.h"

#include <CLI/CLI.hpp>

namespace https {

std::optional<platform::LinuxHTTPOptions> parseOptions(int argc, const char* const* argv,
                                                       int& exitStatus) {
    constexpr int kMostSeconds = 24 * 60 * 60;
    constexpr long kMostSpeed = 1024L * 1024 * 1024;
    platform::LinuxHTTPOptions options;
    int connectSeconds = 0;
    int slowSeconds = 0;
    CLI::App app("Makes one HTTP or HTTPS request for the daemon, over the connection that is its "
                 "descriptor 3.",
                 "kstd-https");
    app.add_option("--trust-anchors", options.trustAnchors,
                   "Certificates (PEM) that servers are trusted by")
        ->capture_default_str();
    app.add_option("--connect-limit", connectSeconds,
                   "Seconds that the way to a server may take, its handshake included")
        ->check(CLI::Range(1, kMostSeconds))
        ->default_str("30");
    app.add_option("--slow-limit", slowSeconds,
                   "Give a server up that is too slow for this many seconds")
        ->check(CLI::Range(1, kMostSeconds))
        ->default_str("60");
    app.add_option("--slowest-speed", options.slowestSpeed,
                   "Fewer bytes a second than this are too slow")
        ->check(CLI::Range(1L, kMostSpeed))
        ->capture_default_str();
    try {
        app.parse(argc, argv);
    } catch (const CLI::ParseError& problem) {
        exitStatus = app.exit(problem);
        return std::nullopt;
    }
    if (connectSeconds > 0) {
        options.connectLimit = std::chrono::seconds(connectSeconds);
    }
    if (slowSeconds > 0) {
        options.slowLimit = std::chrono::seconds(slowSeconds);
    }
    return options;
}

} // namespace https
