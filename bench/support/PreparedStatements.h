#pragma once

#include "bench/support/Comparison.h"

#include <cstddef>

namespace bench {

/// What sqlite3_prepare_v2 was asked for.
struct PreparedStatements {
    std::size_t calls = 0;
    /// Calls with a text that the connection had been asked for before.
    std::size_t repeated = 0;
};

/// Runs `work` and counts the calls of the program's own code; those within SQLite are not. The
/// program needs the linker's --wrap=sqlite3_prepare_v2.
[[nodiscard]] PreparedStatements countPreparedStatements(const Work& work);

} // namespace bench
