#include "keystrand-sim/HexText.h"

namespace sim {

namespace {

constexpr std::string_view kDigits = "0123456789abcdef";
constexpr std::string_view kEmptyWord = "empty";

std::optional<unsigned> digitValue(char digit) {
    if (digit >= 'A' && digit <= 'F') {
        digit = static_cast<char>(digit - 'A' + 'a');
    }
    const std::size_t value = kDigits.find(digit);
    if (value == std::string_view::npos) {
        return std::nullopt;
    }
    return static_cast<unsigned>(value);
}

} // namespace

std::string toHexWord(std::span<const std::uint8_t> bytes) {
    if (bytes.empty()) {
        return std::string(kEmptyWord);
    }
    std::string text;
    text.reserve(bytes.size() * 2);
    for (const unsigned byte : bytes) {
        text.push_back(kDigits[byte >> 4U]);
        text.push_back(kDigits[byte & 0xfU]);
    }
    return text;
}

std::optional<std::vector<std::uint8_t>> fromHexWord(std::string_view word) {
    if (word == kEmptyWord) {
        return std::vector<std::uint8_t>();
    }
    if (word.empty() || word.size() % 2 != 0) {
        return std::nullopt;
    }
    std::vector<std::uint8_t> bytes;
    bytes.reserve(word.size() / 2);
    for (std::size_t i = 0; i < word.size(); i += 2) {
        const auto high = digitValue(word[i]);
        const auto low = digitValue(word[i + 1]);
        if (!high || !low) {
            return std::nullopt;
        }
        bytes.push_back(static_cast<std::uint8_t>(*high << 4U | *low));
    }
    return bytes;
}

} // namespace sim
