#pragma once

#include <array>
#include <charconv>
#include <concepts>
#include <cstddef>
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

/// A text in place that takes as many characters as it has room for, and drops the others.
template <std::size_t room>
class BoundedText {
  public:
    void append(std::string_view part) { size_ += part.copy(&text_[size_], room - size_); }
    void push_back(char part) { append({&part, 1}); }

    [[nodiscard]] std::string_view view() const { return {text_.data(), size_}; }

  private:
    // One more than is used, so that there is a place behind a full text.
    std::array<char, room + 1> text_;
    std::size_t size_ = 0;
};

template <typename Text>
void append(Text& text, std::string_view part) {
    text.append(part);
}

// Only char itself: a plain char parameter would also take booleans, floating-point numbers and
// enumerators, and append them as one character.
template <typename Text, std::same_as<char> Character>
void append(Text& text, Character part) {
    text.push_back(part);
}

template <typename Text, std::integral Number>
requires(!std::same_as<Number, char> && !std::same_as<Number, bool>) void append(Text& text,
                                                                                 Number part) {
    char digits[24];
    const auto end = std::to_chars(std::begin(digits), std::end(digits), part);
    text.append(std::string_view(digits, static_cast<std::size_t>(end.ptr - digits)));
}

template <typename Text>
void append(Text& text, Hex part) {
    char digits[16];
    const auto end = std::to_chars(std::begin(digits), std::end(digits), part.value, 16);
    text.append(std::string_view(digits, static_cast<std::size_t>(end.ptr - digits)));
}

/// Joins texts, characters and integers (decimal) into one string, independent of the locale.
template <typename... Parts>
[[nodiscard]] std::string concat(const Parts&... parts) {
    std::string text;
    (append(text, parts), ...);
    return text;
}

} // namespace base
