#pragma once

#include <cstddef>
#include <cstdint>
#include <optional>
#include <span>
#include <string>
#include <string_view>

namespace platform {

/// Whether every byte of the text is from 1 to 127.
[[nodiscard]] bool isPlainASCII(std::string_view text);

/// Takes one character off the front of `text`. None, and `text` as it was, when it does not begin
/// with a whole character in UTF-8: shortest form, no surrogates, at most U+10FFFF.
[[nodiscard]] std::optional<char32_t> takeUTF8(std::string_view& text);

/// How many 16-bit units the text takes in UTF-16; none when it is not UTF-8 or holds a NUL.
[[nodiscard]] std::optional<std::size_t> countUTF16(std::string_view utf8);

[[nodiscard]] inline bool isUTF8WithoutNUL(std::string_view text) {
    return isPlainASCII(text) || countUTF16(text).has_value();
}

/// Appends the UTF-8 form of units that are given with the high byte first; a last odd byte is left
/// out. False when a surrogate stands alone or a NUL is among them; `text` then ends anywhere.
[[nodiscard]] bool appendUTF8(std::span<const std::uint8_t> utf16BigEndian, std::string& text);

} // namespace platform
