#pragma once

#include "platform/Result.h"
#include "platform/Value.h"

#include <string_view>

namespace kstctl {

/// The bytes that pairs of hexadecimal digits stand for, in either case, with blanks and ends of
/// lines between pairs only. Anything else is ExitStatus::malformed.
[[nodiscard]] platform::Result<platform::Bytes> bytesOfHex(std::string_view text);

} // namespace kstctl
