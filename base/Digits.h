#pragma once

#include <charconv>
#include <concepts>
#include <cstdint>
#include <optional>
#include <span>
#include <string>
#include <string_view>
#include <system_error>

namespace base {

/// The whole of `text` as a decimal number of the type, or none: no sign for an unsigned one, no
/// blanks, nothing that follows.
template <std::integral Number>
[[nodiscard]] std::optional<Number> parseNumber(std::string_view text) {
    Number value{};
    const char* const end = text.data() + text.size();
    const auto result = std::from_chars(text.data(), end, value);
    if (text.empty() || result.ec != std::errc() || result.ptr != end) {
        return std::nullopt;
    }
    return value;
}

/// What a hexadecimal digit of either case stands for; none for any other character.
[[nodiscard]] inline std::optional<std::uint8_t> hexDigitValue(char digit) {
    const char lower = digit >= 'A' && digit <= 'F' ? static_cast<char>(digit - 'A' + 'a') : digit;
    if (lower >= '0' && lower <= '9') {
        return static_cast<std::uint8_t>(lower - '0');
    }
    if (lower >= 'a' && lower <= 'f') {
        return static_cast<std::uint8_t>(lower - 'a' + 10);
    }
    return std::nullopt;
}

/// Two lower-case digits for each byte.
[[nodiscard]] inline std::string hexDigits(std::span<const std::uint8_t> bytes) {
    constexpr std::string_view kDigits = "0123456789abcdef";
    std::string text;
    text.reserve(bytes.size() * 2);
    for (const unsigned byte : bytes) {
        text.push_back(kDigits[byte >> 4U]);
        text.push_back(kDigits[byte & 0xfU]);
    }
    return text;
}

} // namespace base
