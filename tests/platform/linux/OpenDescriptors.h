#pragma once

#include <cstddef>
#include <filesystem>
#include <iterator>

namespace support {

/// How many descriptors this process has open.
[[nodiscard]] inline std::size_t countOpenDescriptors() {
    const std::filesystem::directory_iterator entries("/proc/self/fd");
    // The iterator has one itself.
    return static_cast<std::size_t>(std::distance(begin(entries), end(entries))) - 1;
}

} // namespace support
