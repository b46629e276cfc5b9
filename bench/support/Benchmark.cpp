#include "bench/support/Benchmark.h"

#include "base/NotCopied.h"
#include "bench/support/SystemError.h"

#include <CLI/CLI.hpp>

#include <csignal>
#include <cstddef>
#include <exception>
#include <iostream>
#include <sched.h>
#include <stdlib.h>
#include <system_error>

namespace bench {

namespace {

constexpr int kMaxRounds = 1000000;
constexpr int kMaxEvents = 10000000;

class PrivateDirectory : private base::NotCopied {
  public:
    explicit PrivateDirectory(const std::string& parent) {
        std::string pattern = std::filesystem::absolute(parent) / "kstd-bench.XXXXXX";
        if (::mkdtemp(pattern.data()) == nullptr) {
            throw systemError("cannot make a directory in " + parent);
        }
        path_ = pattern;
    }
    ~PrivateDirectory() {
        std::error_code ignored;
        std::filesystem::remove_all(path_, ignored);
    }

    [[nodiscard]] const std::filesystem::path& path() const { return path_; }

  private:
    std::filesystem::path path_;
};

/// Keeps this process, and those it starts from now on, on the last CPU that it may use: the first
/// ones tend to serve the devices.
void pinToOneCpu() {
    cpu_set_t allowed;
    if (::sched_getaffinity(0, sizeof allowed, &allowed) != 0) {
        throw systemError("cannot ask for the CPUs");
    }
    std::size_t last = CPU_SETSIZE - 1;
    while (last > 0 && !CPU_ISSET(last, &allowed)) {
        --last;
    }
    cpu_set_t one;
    CPU_ZERO(&one);
    CPU_SET(last, &one);
    if (::sched_setaffinity(0, sizeof one, &one) != 0) {
        throw systemError("cannot stay on one CPU");
    }
}

} // namespace

int runBenchmark(int argc, char** argv, const std::string& description, const Options& defaults,
                 const Measure& measure) {
    std::signal(SIGPIPE, SIG_IGN);
    CLI::App app(description);
    Options options = defaults;
    app.add_option("--rounds", options.rounds, "Rounds of the interleaved measurement")
        ->check(CLI::Range(1, kMaxRounds))
        ->capture_default_str();
    app.add_option("--dir", options.directory, "Where the private directory is made")
        ->capture_default_str();
    if (defaults.events > 0) {
        app.add_option("--events", options.events, "How many events are stored")
            ->check(CLI::Range(1, kMaxEvents))
            ->capture_default_str();
    }
    app.add_flag("!--no-pin", options.pinned, "Let the processes run on any CPU");
    CLI11_PARSE(app, argc, argv);
    try {
        if (options.pinned) {
            pinToOneCpu();
        }
        const PrivateDirectory directory(options.directory);
        measure(options, directory.path());
        return 0;
    } catch (const std::exception& error) {
        std::cerr << argv[0] << ": " << error.what() << '\n';
        return 1;
    }
}

} // namespace bench
