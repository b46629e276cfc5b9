#pragma once

#include <charconv>
#include <concepts>
#include <cstdint>
#include <iterator>
#include <string>
#include <string_view>
#include <system_error>

namespace base {

/// A number that `concat` writes in lower-case hexadecimal, without a prefix.
struct Hex {
    std::uint64_t value;
};

inline void append(std::string& text, std::string_view part) {
    text.append(part);
}

// Only char itself: a plain char parameter would also take booleans, floating-point numbers and
// enumerators, and append them as one character.
template <std::same_as<char> Character>
void append(std::string& text, Character part) {
    text.push_back(part);
}

template <std::integral Number>
requires(!std::same_as<Number, char> && !std::same_as<Number, bool>) void append(std::string& text,
                                                                                 Number part) {
    char digits[24];
    const auto end = std::to_chars(std::begin(digits), std::end(digits), part);
    text.append(digits, end.ptr);
}

inline void append(std::string& text, Hex part) {
    char digits[16];
    const auto end = std::to_chars(std::begin(digits), std::end(digits), part.value, 16);
    text.append(digits, end.ptr);
}

/// Joins texts, characters and integers (decimal) into one string, independent of the locale.
template <typename... Parts>
[[nodiscard]] std::string concat(const Parts&... parts) {
    std::string text;
    (append(text, parts), ...);
    return text;
}

} // namespace base
