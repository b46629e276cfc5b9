#pragma once

#include <string>
#include <string_view>

namespace kstctl {

/// The text as a terminal may be shown it. Whatever could move the cursor, hide or reorder what is
/// shown (control characters of either set, line separators, marks of writing direction) and every
/// byte that is no part of UTF-8 becomes an escape: \n, \r, \t, \xNN for a byte, \u{N} for a
/// character. A backslash is doubled, so that two texts never look the same.
[[nodiscard]] std::string printable(std::string_view text);

/// A JSON text in which such characters are escaped in the way of JSON.
[[nodiscard]] std::string printableJSON(std::string_view json);

/// How many characters a printable text has.
[[nodiscard]] std::size_t characterCount(std::string_view printable);

} // namespace kstctl
