#pragma once

#include <cstdint>
#include <optional>
#include <span>
#include <string>
#include <string_view>
#include <vector>

namespace keystrand::sim {

/// Two lower-case digits for each byte; the word `empty` for no bytes.
[[nodiscard]] std::string toHexWord(std::span<const std::uint8_t> bytes);

/// The bytes of a word that `toHexWord` made, or of upper-case digits. None when it is anything
/// else.
[[nodiscard]] std::optional<std::vector<std::uint8_t>> fromHexWord(std::string_view word);

} // namespace keystrand::sim
