// Reads JSON texts from standard input and writes each as it was understood to standard output. A
// text is a frame: its length as four bytes, least significant first, and so many bytes. A frame
// without bytes answers a text that is no JSON.

#include "platform/formats/JSONCodec.h"

#include <array>
#include <cstdint>
#include <iostream>
#include <optional>
#include <string>

namespace {

std::optional<std::string> readFrame(std::istream& stream) {
    std::array<char, 4> header{};
    if (!stream.read(header.data(), header.size())) {
        return std::nullopt;
    }
    std::uint32_t size = 0;
    for (std::size_t i = 0; i < header.size(); ++i) {
        size |= std::uint32_t{static_cast<std::uint8_t>(header[i])} << (8 * i);
    }
    std::string frame(size, '\0');
    stream.read(frame.data(), size);
    return frame;
}

void writeFrame(std::ostream& stream, std::string_view frame) {
    for (std::size_t i = 0; i < 4; ++i) {
        stream.put(static_cast<char>(frame.size() >> (8 * i)));
    }
    stream << frame;
}

} // namespace

int main() {
    platform::JSONCodec json;
    while (const auto frame = readFrame(std::cin)) {
        const auto value = json.read(*frame);
        if (!value) {
            writeFrame(std::cout, "");
            continue;
        }
        const auto text = json.makeText();
        platform::describe(value.value(), *text);
        writeFrame(std::cout, text->finish().value().view());
    }
    return std::cout.flush() ? 0 : 1;
}
