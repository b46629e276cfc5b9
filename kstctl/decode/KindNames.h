#pragma once

#include <string>
#include <vector>

namespace kstctl::decode {

[[nodiscard]] std::vector<std::string> kindNames();

/// Names and codes.
[[nodiscard]] std::vector<std::string> commandNames();

} // namespace kstctl::decode
