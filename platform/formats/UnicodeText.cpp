#include "platform/formats/UnicodeText.h"

#include <algorithm>
#include <cstring>

namespace platform {

namespace {

constexpr char32_t kLastCharacter = 0x10ffff;
constexpr char32_t kFirstBeyond16Bits = 0x10000;
constexpr char32_t kFirstHighSurrogate = 0xd800;
constexpr char32_t kFirstLowSurrogate = 0xdc00;
constexpr char32_t kLastLowSurrogate = 0xdfff;

bool isSurrogate(char32_t unit) {
    return unit >= kFirstHighSurrogate && unit <= kLastLowSurrogate;
}

std::uint8_t byteOf(char character) {
    return static_cast<std::uint8_t>(character);
}

/// How a character of several bytes begins: their number and the bits of the first one. A length
/// of 0 says that no character begins so.
struct Start {
    std::size_t length;
    char32_t bits;
    /// The first character that needs so many bytes.
    char32_t least;
};

Start startOf(std::uint8_t first) {
    if ((first & 0xe0U) == 0xc0) {
        return {2, first & 0x1fU, 0x80};
    }
    if ((first & 0xf0U) == 0xe0) {
        return {3, first & 0x0fU, 0x800};
    }
    if ((first & 0xf8U) == 0xf0) {
        return {4, first & 0x07U, kFirstBeyond16Bits};
    }
    return {0, 0, 0};
}

std::optional<char32_t> takeSeveralBytes(std::string_view& text) {
    const Start start = startOf(byteOf(text.front()));
    if (start.length == 0 || start.length > text.size()) {
        return std::nullopt;
    }
    char32_t character = start.bits;
    for (const char next : text.substr(1, start.length - 1)) {
        if ((byteOf(next) & 0xc0U) != 0x80) {
            return std::nullopt;
        }
        character = (character << 6U) | (byteOf(next) & 0x3fU);
    }
    if (character < start.least || character > kLastCharacter || isSurrogate(character)) {
        return std::nullopt;
    }
    text.remove_prefix(start.length);
    return character;
}

void appendCharacter(std::string& text, char32_t character) {
    const auto put = [&text](char32_t byte) {
        text.push_back(static_cast<char>(byte));
    };
    if (character < 0x80) {
        put(character);
        return;
    }
    if (character < 0x800) {
        put(0xc0U | (character >> 6U));
    } else {
        if (character < kFirstBeyond16Bits) {
            put(0xe0U | (character >> 12U));
        } else {
            put(0xf0U | (character >> 18U));
            put(0x80U | ((character >> 12U) & 0x3fU));
        }
        put(0x80U | ((character >> 6U) & 0x3fU));
    }
    put(0x80U | (character & 0x3fU));
}

/// The same as isPlainASCII for the 8 bytes at `text`.
bool isPlainASCIIWord(const char* text) {
    constexpr std::uint64_t kEveryHighBit = 0x8080808080808080;
    constexpr std::uint64_t kEveryLowBit = 0x0101010101010101;
    std::uint64_t word = 0;
    std::memcpy(&word, text, sizeof word);
    // Among bytes without their high bit only a 0 gets it when 1 is taken away.
    return ((word | (word - kEveryLowBit)) & kEveryHighBit) == 0;
}

} // namespace

bool isPlainASCII(std::string_view text) {
    constexpr std::size_t kWord = sizeof(std::uint64_t);
    if (text.size() < kWord) {
        return std::all_of(text.begin(), text.end(), [](char character) {
            return byteOf(character) >= 1 && byteOf(character) <= 0x7f;
        });
    }
    for (std::size_t i = 0; i < text.size() - kWord; i += kWord) {
        if (!isPlainASCIIWord(text.data() + i)) {
            return false;
        }
    }
    return isPlainASCIIWord(text.data() + text.size() - kWord);
}

std::optional<char32_t> takeUTF8(std::string_view& text) {
    if (text.empty()) {
        return std::nullopt;
    }
    const std::uint8_t first = byteOf(text.front());
    if (first < 0x80) {
        text.remove_prefix(1);
        return first;
    }
    return takeSeveralBytes(text);
}

std::optional<std::size_t> countUTF16(std::string_view utf8) {
    std::size_t units = 0;
    while (!utf8.empty()) {
        const std::optional<char32_t> character = takeUTF8(utf8);
        if (!character || *character == 0) {
            return std::nullopt;
        }
        units += *character < kFirstBeyond16Bits ? 1U : 2U;
    }
    return units;
}

bool appendUTF8(std::span<const std::uint8_t> utf16BigEndian, std::string& text) {
    char32_t high = 0;
    for (std::size_t i = 0; i + 1 < utf16BigEndian.size(); i += 2) {
        const auto unit = static_cast<char32_t>((utf16BigEndian[i] << 8U) | utf16BigEndian[i + 1]);
        const bool isLow = unit >= kFirstLowSurrogate && unit <= kLastLowSurrogate;
        if (unit == 0 || isLow != (high != 0)) {
            return false;
        }
        if (isLow) {
            appendCharacter(text, kFirstBeyond16Bits + ((high - kFirstHighSurrogate) << 10U) +
                                      (unit - kFirstLowSurrogate));
            high = 0;
        } else if (isSurrogate(unit)) {
            high = unit;
        } else {
            appendCharacter(text, unit);
        }
    }
    return high == 0;
}

} // namespace platform
