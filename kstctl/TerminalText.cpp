#include "base/Concat.h"
#include "kstctl/Forms.h"
#include "platform/formats/UnicodeText.h"

#include <algorithm>
#include <optional>

namespace kstctl {

namespace {

constexpr char kHexDigits[] = "0123456789abcdef";

bool isBetween(char32_t character, char32_t first, char32_t last) {
    return character >= first && character <= last;
}

bool isUnsafe(char32_t character) {
    return character < U' ' || isBetween(character, 0x7f, 0x9f) || character == 0x61c ||
           isBetween(character, 0x200b, 0x200f) || isBetween(character, 0x2028, 0x202e) ||
           isBetween(character, 0x2060, 0x206f) || character == 0xfeff ||
           isBetween(character, 0xe0000, 0xe007f);
}

std::string byteEscape(char byte) {
    const auto value = static_cast<unsigned char>(byte);
    return base::concat("\\x", kHexDigits[value >> 4U], kHexDigits[value & 0xfU]);
}

std::string characterEscape(char32_t character) {
    switch (character) {
    case U'\n':
        return "\\n";
    case U'\r':
        return "\\r";
    case U'\t':
        return "\\t";
    default:
        return character < 0x80 ? byteEscape(static_cast<char>(character))
                                : base::concat("\\u{", base::Hex{character}, '}');
    }
}

std::string unitEscape(unsigned unit) {
    std::string text = "\\u0000";
    for (std::size_t digit = text.size(); digit > 2; --digit, unit >>= 4U) {
        text[digit - 1] = kHexDigits[unit & 0xfU];
    }
    return text;
}

std::string JSONEscape(char32_t character) {
    if (character < 0x10000) {
        return unitEscape(static_cast<unsigned>(character));
    }
    const auto rest = static_cast<unsigned>(character) - 0x10000U;
    return unitEscape(0xd800U + (rest >> 10U)) + unitEscape(0xdc00U + (rest & 0x3ffU));
}

} // namespace

std::string printable(std::string_view text) {
    std::string shown;
    shown.reserve(text.size());
    while (!text.empty()) {
        const std::string_view before = text;
        const std::optional<char32_t> character = platform::takeUTF8(text);
        if (!character) {
            shown += byteEscape(text.front());
            text.remove_prefix(1);
        } else if (*character == U'\\') {
            shown += "\\\\";
        } else if (isUnsafe(*character)) {
            shown += characterEscape(*character);
        } else {
            shown += before.substr(0, before.size() - text.size());
        }
    }
    return shown;
}

std::string printableJSON(std::string_view json) {
    std::string shown;
    shown.reserve(json.size());
    while (!json.empty()) {
        const std::string_view before = json;
        const std::optional<char32_t> character = platform::takeUTF8(json);
        if (character && isUnsafe(*character)) {
            shown += JSONEscape(*character);
            continue;
        }
        // JSON has no escape for a byte that is no character.
        if (!character) {
            json.remove_prefix(1);
        }
        shown += before.substr(0, before.size() - json.size());
    }
    return shown;
}

std::size_t characterCount(std::string_view printable) {
    return static_cast<std::size_t>(
        std::count_if(printable.begin(), printable.end(), [](char byte) {
            return (static_cast<unsigned char>(byte) & 0xc0U) != 0x80U;
        }));
}

} // namespace kstctl
