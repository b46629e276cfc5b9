#include "keystrand-sim/HexText.h"

#include "base/Digits.h"

namespace keystrand::sim {

namespace {

constexpr std::string_view kEmptyWord = "empty";

} // namespace

std::string toHexWord(std::span<const std::uint8_t> bytes) {
    return bytes.empty() ? std::string(kEmptyWord) : base::hexDigits(bytes);
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
        const auto high = base::hexDigitValue(word[i]);
        const auto low = base::hexDigitValue(word[i + 1]);
        if (!high || !low) {
            return std::nullopt;
        }
        bytes.push_back(static_cast<std::uint8_t>(*high << 4U | *low));
    }
    return bytes;
}

} // namespace keystrand::sim
