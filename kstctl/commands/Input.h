#pragma once

#include "platform/Result.h"
#include "platform/Value.h"

#include <cstddef>
#include <string>

namespace kstctl {

/// What is read at the most. The largest message that there is has 128 KiB; twice as many digits
/// and some blanks fit.
inline constexpr std::size_t kMaxInputSize = 1024UL * 1024;

/// All bytes of the file, or of standard input when the path is "-". Fails with
/// ExitStatus::missing, ::unreadable or ::failed, and with ::malformed when it is longer than
/// kMaxInputSize or no file that can be read to its end.
[[nodiscard]] platform::Result<platform::Bytes> readInput(const std::string& path);

} // namespace kstctl
