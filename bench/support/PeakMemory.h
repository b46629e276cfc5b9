#pragma once

#include "bench/support/Comparison.h"

#include <cstddef>

namespace bench {

/// Runs a work in a copy of this process: how far the copy's resident memory rose above what it
/// had before, in bytes. That is everything: heap, stacks, and the pages of programs, libraries and
/// files that came in. Throws when the copy cannot be made or the work threw.
[[nodiscard]] std::size_t peakMemoryOf(const Work& work);

} // namespace bench
