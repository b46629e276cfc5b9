#pragma once

#include <cstddef>
#include <string>
#include <string_view>

namespace platform {

/// How many bytes of a line one byte of a text can become.
inline constexpr std::size_t kLogTextGrowth = 4;

/// Writes the text to `line` as it is shown in a log, in one line, and returns where that ends.
/// There must be room for kLogTextGrowth times the text. Shown as escapes are control characters
/// (newlines too), line separators, bidirectional controls, and bytes that are not UTF-8.
char* showLogText(std::string_view text, char* line) noexcept;

/// The text without its final newline.
[[nodiscard]] constexpr std::string_view withoutFinalNewline(std::string_view text) noexcept {
    return text.substr(0, text.size() - (text.ends_with('\n') ? 1 : 0));
}

/// The text as one printable line: what showLogText makes of it without its final newline.
[[nodiscard]] std::string printableLine(std::string_view text);

} // namespace platform
