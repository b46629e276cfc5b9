// Programs of the tree among neighbours who mean no good, or who are there for a very long time.

#include "tests/neighbours/Random.h"
#include "tests/neighbours/Runs.h"

#include <CLI/CLI.hpp>

#include <csignal>
#include <cstdio>
#include <cstdlib>
#include <exception>
#include <map>
#include <string>
#include <unistd.h>

int main(int argc, char** argv) {
    using Run = void (*)(const neighbours::RunOptions&);
    const std::map<std::string, Run> runs = {
        {"events", neighbours::runEvents},      {"kernel", neighbours::runKernelSide},
        {"https", neighbours::runHTTPSProcess}, {"bus", neighbours::runBus},
        {"library", neighbours::runLibrary},    {"clients", neighbours::runClients},
        {"gate", neighbours::runGate},          {"soak", neighbours::runSoak}};
    std::string name;
    neighbours::RunOptions options;
    options.daemon = KSTD_DEV;
    CLI::App app("Puts programs of the tree among hostile neighbours, or friendly ones for long.");
    app.add_option("run", name, "events, kernel, https, library, bus, clients, gate or soak")
        ->required()
        ->check(CLI::IsMember(runs));
    app.add_option("--count", options.count, "How many exchanges, or notifications of a soak");
    app.add_option("--seed", options.seed, "One seed makes the same exchanges again");
    app.add_option("--first-batch", options.firstBatch, "Where to begin");
    app.add_option("--silences", options.silences,
                   "How many waits for somebody silent, 5 to 30 s each");
    app.add_option("--uploads", options.uploads, "Of a soak");
    app.add_option("--lives", options.lives, "How many daemons a soak has, one after the other");
    app.add_option("--daemon", options.daemon, "A kstd-dev of another build");
    CLI11_PARSE(app, argc, argv);
    std::signal(SIGPIPE, SIG_IGN);
    // What a sync costs is not looked at here, and would be most of the time.
    if (::access("/dev/shm", W_OK) == 0) {
        ::setenv("TMPDIR", "/dev/shm", 0);
    }
    std::printf("%s: seed %llu\n", name.c_str(), static_cast<unsigned long long>(options.seed));
    std::fflush(stdout);
    try {
        runs.at(name)(options);
    } catch (const std::exception& error) {
        std::fprintf(stderr, "%s: seed %llu: %s\n", name.c_str(),
                     static_cast<unsigned long long>(options.seed), error.what());
        return 1;
    }
}
