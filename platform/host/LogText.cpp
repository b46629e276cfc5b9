#include "platform/host/LogText.h"

#include "platform/formats/UnicodeText.h"

#include <algorithm>
#include <charconv>
#include <optional>

namespace platform {

namespace {

constexpr char kHexDigits[] = "0123456789abcdef";

bool isBetween(char32_t character, char32_t first, char32_t last) {
    return character >= first && character <= last;
}

/// Control characters of ASCII.
bool isControl(char32_t character) {
    return character < U' ' || character == 0x7f;
}

/// What the log's readers may take for a control sequence, the end of a line, or an order to show
/// the text in another direction.
bool isDeceptive(char32_t character) {
    return isBetween(character, 0x80, 0x9f) || isBetween(character, 0x2028, 0x202e) ||
           isBetween(character, 0x2066, 0x2069);
}

char* put(std::string_view text, char* place) {
    return std::copy(text.begin(), text.end(), place);
}

char* putByte(unsigned char byte, char* place) {
    place = put("\\x", place);
    *place++ = kHexDigits[byte >> 4U];
    *place++ = kHexDigits[byte & 0xfU];
    return place;
}

char* putControl(char32_t character, char* place) {
    switch (character) {
    case U'\n':
        return put("\\n", place);
    case U'\r':
        return put("\\r", place);
    case U'\t':
        return put("\\t", place);
    default:
        return putByte(static_cast<unsigned char>(character), place);
    }
}

/// At most four digits are needed: two bytes become 6, three become 8.
char* putDeceptive(char32_t character, char* place) {
    place = put("\\u{", place);
    place = std::to_chars(place, place + 4, static_cast<unsigned>(character), 16).ptr;
    return put("}", place);
}

} // namespace

char* showLogText(std::string_view text, char* line) noexcept {
    while (!text.empty()) {
        // Most lines have nothing else.
        if (isBetween(static_cast<unsigned char>(text.front()), ' ', '~')) {
            *line++ = text.front();
            text.remove_prefix(1);
            continue;
        }
        const std::string_view before = text;
        const std::optional<char32_t> character = takeUTF8(text);
        if (!character) {
            line = putByte(static_cast<unsigned char>(text.front()), line);
            text.remove_prefix(1);
        } else if (isControl(*character)) {
            line = putControl(*character, line);
        } else if (isDeceptive(*character)) {
            line = putDeceptive(*character, line);
        } else {
            line = put(before.substr(0, before.size() - text.size()), line);
        }
    }
    return line;
}

std::string printableLine(std::string_view text) {
    const std::string_view shown = withoutFinalNewline(text);
    std::string line(shown.size() * kLogTextGrowth, '\0');
    const char* const end = showLogText(shown, line.data());
    line.resize(static_cast<std::size_t>(end - line.data()));
    return line;
}

} // namespace platform
