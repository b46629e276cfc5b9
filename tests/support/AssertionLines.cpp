#include "tests/support/AssertionLines.h"

#include <string_view>

namespace support {

namespace {

/// Where the line number stands in a text that ends with a file, a colon, a line number and a
/// newline; the text's size when it does not.
std::size_t lineNumberIn(std::string_view text) {
    const std::size_t file = text.find(": AssertMacros: ");
    const std::size_t colon = text.rfind(':');
    const std::size_t end = text.size() - 1;
    const bool isNumbered = file != std::string_view::npos && text.find(" file: ", file) < colon &&
                            text.back() == '\n' &&
                            text.find_first_not_of("0123456789", colon + 1) == end &&
                            colon + 1 < end && text[colon + 1] != '0';
    return isNumbered ? colon + 1 : text.size();
}

} // namespace

std::vector<std::string> textsWithoutLineNumbers(const RecordingLog& log) {
    std::vector<std::string> texts = log.texts();
    for (std::string& text : texts) {
        if (const std::size_t number = lineNumberIn(text); number < text.size()) {
            text.replace(number, text.size() - number, "<n>\n");
        }
    }
    return texts;
}

} // namespace support
