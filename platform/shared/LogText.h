#pragma once

#include <string>
#include <string_view>

namespace platform {

/// The text as one printable line: without its final newline, other control characters escaped.
[[nodiscard]] std::string logLine(std::string_view text);

} // namespace platform
