#pragma once

#include <string>
#include <string_view>

namespace kstd {

/// SHA-256 of the bytes of `schema`, as 64 upper-case hexadecimal digits.
[[nodiscard]] std::string schemaHash(std::string_view schema);

} // namespace kstd
