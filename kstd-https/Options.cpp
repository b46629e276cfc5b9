#include "kstd-https/Options.h"

#include <CLI/CLI.hpp>

#include <chrono>
#include <cmath>
#include <string>

namespace https {

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

} // namespace

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

} // namespace https
