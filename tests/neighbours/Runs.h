#pragma once

#include <cstddef>
#include <cstdint>
#include <string>

namespace neighbours {

/// What a run is asked for.
struct RunOptions {
    /// The daemon for a root directory.
    std::string daemon;
    std::uint64_t seed = 1;
    /// How many exchanges are to be made, at least.
    std::uint64_t count = 10'000;
    /// Batches have numbers, and each its own ideas: a run can begin where another has stopped.
    std::uint64_t firstBatch = 0;
    /// How many waits for somebody silent, seconds each, the run may have.
    std::size_t silences = 0;
    /// A soak's.
    std::uint64_t uploads = 100;
    std::uint64_t lives = 4;
};

// Each makes its exchanges and throws a Fault when something is not as it must be. What was done is
// printed.

/// A daemon with a hostile sender of events.
void runEvents(const RunOptions& options);
/// A daemon with a hostile kernel side.
void runKernelSide(const RunOptions& options);
/// A daemon with a hostile HTTPS process.
void runHTTPSProcess(const RunOptions& options);
/// The library with a hostile kernel side.
void runLibrary(const RunOptions& options);
/// The alarm's helper with a hostile bus, and hostile words about the alarms.
void runBus(const RunOptions& options);
/// A kernel side with hostile clients.
void runClients(const RunOptions& options);
/// Keystrand for Linux with hostile tools, and hostile words about sessions.
void runGate(const RunOptions& options);
/// Daemons, one after the other, whose neighbours all behave.
void runSoak(const RunOptions& options);

} // namespace neighbours
