#pragma once

#include "bench/support/Comparison.h"

#include <cstdint>
#include <functional>
#include <map>

namespace bench {

/// How often each system call was made, by its number.
using SystemCalls = std::map<long, std::uint64_t>;

/// Runs a work in a copy of this process, stopped at each of its system calls, and counts them.
/// `prepare` runs in the copy too and makes the work; its own calls are not counted. The work must
/// not ask for its parent's id: that call marks the beginning and the end. Throws when the copy
/// cannot be traced, or when `prepare` or the work threw.
[[nodiscard]] SystemCalls countSystemCalls(const std::function<Work()>& prepare);

} // namespace bench
