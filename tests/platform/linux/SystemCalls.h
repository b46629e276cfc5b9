#pragma once

#include "base/NotCopied.h"

#include <cstddef>
#include <deque>
#include <string>
#include <vector>

namespace support {

/// The system calls by which the Linux platform saves files, as the linker has wrapped them for
/// this test program: they are noted, and can be made to fail.
class SystemCalls : private base::NotCopied {
  public:
    SystemCalls();
    ~SystemCalls();

    /// What was called on which file while this exists: "pwrite <path> 13", "fsync <path>",
    /// "close <path>", "fchmod <path>".
    std::vector<std::string> calls;

    /// Only files below this directory are noted and made to fail; their paths are told from there.
    std::string root;

    /// What the next calls of a kind do instead of their work; 0 does the work.
    std::deque<int> pwriteErrors;
    std::deque<int> fsyncErrors;
    std::deque<int> fchmodErrors;
    /// The descriptor is closed all the same, as the system does.
    std::deque<int> closeErrors;
    /// The most that a pwrite takes.
    std::size_t pwriteAtMost = static_cast<std::size_t>(-1);

    [[nodiscard]] static SystemCalls* current();

    /// The path of a descriptor below the root, or an empty text when it is not to be looked at.
    [[nodiscard]] std::string pathOf(int descriptor) const;
};

} // namespace support
