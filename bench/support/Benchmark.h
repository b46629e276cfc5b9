#pragma once

#include <filesystem>
#include <functional>
#include <string>

namespace bench {

/// What a benchmark is started with.
struct Options {
    /// Rounds of the interleaved measurement, at least 1.
    int rounds;
    /// Where the private directory is made; what is measured on a disk is measured on this one.
    std::string directory = ".";
    /// How many events a benchmark of stored events works on; 0 in all others, which have no such
    /// option.
    int events = 0;
    /// Whether the processes share one CPU, so that no wake-up crosses to another.
    bool pinned = true;
};

/// Measures and prints, in a private directory that is removed afterwards; throws when it cannot.
using Measure =
    std::function<void(const Options& options, const std::filesystem::path& privateDirectory)>;

/// The body of a benchmark's main: reads the options, those that are not given stay as in
/// `defaults`; pins the process if that is wanted; measures. Returns the exit status: 0 when
/// everything was measured, whatever came out; 1, with the reason on standard error, when it was
/// not.
[[nodiscard]] int runBenchmark(int argc, char** argv, const std::string& description,
                               const Options& defaults, const Measure& measure);

} // namespace bench
