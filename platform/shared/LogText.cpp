#include "platform/shared/LogText.h"

namespace platform {

namespace {

constexpr char kHexDigits[] = "0123456789abcdef";
constexpr unsigned char kDelete = 0x7f;

void appendEscaped(std::string& line, unsigned char character) {
    switch (character) {
    case '\n':
        line += "\\n";
        return;
    case '\r':
        line += "\\r";
        return;
    case '\t':
        line += "\\t";
        return;
    default:
        line += "\\x";
        line += kHexDigits[character >> 4U];
        line += kHexDigits[character & 0xfU];
    }
}

} // namespace

std::string logLine(std::string_view text) {
    if (text.ends_with('\n')) {
        text.remove_suffix(1);
    }
    std::string line;
    line.reserve(text.size());
    for (const char character : text) {
        const auto byte = static_cast<unsigned char>(character);
        if (byte < ' ' || byte == kDelete) {
            appendEscaped(line, byte);
        } else {
            line += character;
        }
    }
    return line;
}

} // namespace platform
