#pragma once

#include "platform/linux/RegularFile.h"

#include <cstddef>
#include <string>

namespace platform {

/// Why a configuration file that was read with this limit counts for nothing; empty when it counts.
///
/// A file counts when it was read in full, root or the user of this process owns it and nobody else
/// may write it.
[[nodiscard]] std::string distrust(const RegularFile& file, std::size_t limit);

} // namespace platform
