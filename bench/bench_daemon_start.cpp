// The start of the daemon, until it waits for events, against that of a minimal program with the
// same kind of event loop.

#include "base/Concat.h"
#include "bench/support/Benchmark.h"
#include "bench/support/Comparison.h"
#include "bench/support/PrivateRoot.h"
#include "bench/support/ProcessStatus.h"
#include "bench/support/StartedProgram.h"

#include <chrono>
#include <cstdio>
#include <string>
#include <vector>

namespace {

constexpr int kDefaultRounds = 200;
constexpr double kTarget = 1.8;
constexpr char kLine[] = "Entering the main runloop.\n";

/// A program that is started over and over, and what was found each time.
class Started {
  public:
    explicit Started(std::vector<std::string> arguments) : arguments_(std::move(arguments)) {}

    void start() {
        const auto begin = std::chrono::steady_clock::now();
        bench::StartedProgram program(arguments_);
        program.awaitText(kLine);
        const std::chrono::duration<double, std::nano> time =
            std::chrono::steady_clock::now() - begin;
        times_.push_back(time.count());
        cpuTimes_.push_back(bench::cpuTimeOf(program.pid()));
        const bench::ProcessMemory memory = bench::memoryOf(program.pid());
        resident_.push_back(static_cast<double>(memory.resident));
        proportional_.push_back(static_cast<double>(memory.proportional));
        own_.push_back(static_cast<double>(memory.own));
        sharedLibraries_ = bench::sharedLibrariesOf(program.pid());
    }

    /// As if it had never been started.
    void forget() { *this = Started(std::move(arguments_)); }

    [[nodiscard]] const bench::Samples& times() const { return times_; }
    [[nodiscard]] const bench::Samples& cpuTimes() const { return cpuTimes_; }

    void printMemory(const char* name) const {
        const auto mebibytes = [](const bench::Samples& sizes) {
            return bench::median(sizes) / (1024 * 1024);
        };
        std::printf("%-20s %8.2f MiB %8.2f MiB %8.2f MiB %10zu\n", name, mebibytes(resident_),
                    mebibytes(proportional_), mebibytes(own_), sharedLibraries_);
    }

  private:
    std::vector<std::string> arguments_;
    bench::Samples times_;
    bench::Samples cpuTimes_;
    bench::Samples resident_;
    bench::Samples proportional_;
    bench::Samples own_;
    std::size_t sharedLibraries_ = 0;
};

void measure(const bench::Options& options, const std::filesystem::path& directory) {
    const std::string root = directory;
    bench::makePrivateRoot(directory);
    bench::StartedProgram kernel({KEYSTRAND_SIM, "--root", root, "--quiet"});
    kernel.awaitText("keystrand-sim: ready");
    Started minimal({MINIMAL_EVENT_LOOP, (directory / "minimal.sock").string()});
    Started daemon({DAEMON, root});

    bench::printHead(base::concat("Start to the run loop against a minimal program, ",
                                  options.rounds, " rounds, ",
                                  options.pinned ? "one CPU" : "any CPU"));
    minimal.start();
    daemon.start();
    minimal.forget();
    daemon.forget();
    for (int round = 0; round < options.rounds; ++round) {
        minimal.start();
        daemon.start();
    }
    bench::printRow("start of the daemon",
                    bench::compare({{minimal.times(), daemon.times()}, 0}, 0, 1), kTarget);
    // Whoever else wants the CPU has no part in it.
    bench::printRow("its CPU time",
                    bench::compare({{minimal.cpuTimes(), daemon.cpuTimes()}, 0}, 0, 1), kTarget);
    std::printf("\n%-20s %12s %12s %12s %10s\n", "", "resident", "proportional", "its own",
                "libraries");
    minimal.printMemory("minimal program");
    daemon.printMemory("daemon");
}

} // namespace

int main(int argc, char** argv) {
    return bench::runBenchmark(argc, argv, "What the start of the daemon takes.",
                               {.rounds = kDefaultRounds}, measure);
}
