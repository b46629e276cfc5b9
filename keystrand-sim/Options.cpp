#include "keystrand-sim/Options.h"

#include <CLI/CLI.hpp>

#include <limits>

namespace keystrand::sim {

std::optional<Options> parseOptions(int argc, const char* const* argv, int& exitStatus) {
    constexpr auto kMaxPeriod = std::numeric_limits<std::uint32_t>::max();
    Options options;
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
        ->check(CLI::Range(RestrictedModeTimer::Seconds{1}, RestrictedModeTimer::kLatestTime));
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

} // namespace keystrand::sim
