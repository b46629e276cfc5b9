#include "kstd/Analytics/SQLite/HexText.h"

#include <cstddef>

namespace kstd {

namespace {

constexpr std::string_view kLowercaseDigits = "0123456789abcdef";
constexpr std::string_view kUppercaseDigits = "0123456789ABCDEF";
constexpr std::size_t kBytesInGroup = 4;

void appendByte(std::string& text, std::uint8_t byte, std::string_view digits) {
    text.push_back(digits[byte >> 4U]);
    text.push_back(digits[byte & 0xfU]);
}

std::string withoutSpaces(std::span<const std::uint8_t> bytes, std::string_view digits) {
    std::string text;
    text.reserve(2 * bytes.size());
    for (const std::uint8_t byte : bytes) {
        appendByte(text, byte, digits);
    }
    return text;
}

} // namespace

std::string RXHexString(std::span<const std::uint8_t> bytes) {
    std::string text;
    text.reserve(2 * bytes.size() + bytes.size() / kBytesInGroup);
    for (std::size_t i = 0; i < bytes.size(); ++i) {
        if (i != 0 && i % kBytesInGroup == 0) {
            text.push_back(' ');
        }
        appendByte(text, bytes[i], kLowercaseDigits);
    }
    return text;
}

std::string RXLowercaseHexStringWithoutSpaces(std::span<const std::uint8_t> bytes) {
    return withoutSpaces(bytes, kLowercaseDigits);
}

std::string RXUppercaseHexStringWithoutSpaces(std::span<const std::uint8_t> bytes) {
    return withoutSpaces(bytes, kUppercaseDigits);
}

platform::Bytes RXDataWithHexString(std::string_view text, bool stringIsUppercase) {
    const std::string_view digits = stringIsUppercase ? kUppercaseDigits : kLowercaseDigits;
    platform::Bytes bytes;
    bytes.reserve(text.size() / 2);
    std::size_t highNibble = std::string_view::npos;
    for (const char character : text) {
        const std::size_t nibble = digits.find(character);
        if (nibble == std::string_view::npos) {
            continue;
        }
        if (highNibble == std::string_view::npos) {
            highNibble = nibble;
        } else {
            bytes.push_back(static_cast<std::uint8_t>(highNibble << 4U | nibble));
            highNibble = std::string_view::npos;
        }
    }
    return bytes;
}

} // namespace kstd
