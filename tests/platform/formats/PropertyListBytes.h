#pragma once

#include "platform/Value.h"

#include <cstddef>
#include <cstdint>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

namespace support {

/// The bytes of a text of hexadecimal digits; blanks between them do not matter.
inline platform::Bytes fromHex(std::string_view text) {
    platform::Bytes bytes;
    std::string digits;
    for (const char character : text) {
        if (character != ' ') {
            digits.push_back(character);
        }
        if (digits.size() == 2) {
            bytes.push_back(static_cast<std::uint8_t>(std::stoul(digits, nullptr, 16)));
            digits.clear();
        }
    }
    return bytes;
}

inline std::string toHex(const platform::Bytes& bytes) {
    constexpr char kDigits[] = "0123456789abcdef";
    std::string text;
    for (const std::uint8_t byte : bytes) {
        text.push_back(kDigits[byte >> 4U]);
        text.push_back(kDigits[byte & 0xfU]);
    }
    return text;
}

inline void append(platform::Bytes& bytes, const platform::Bytes& more) {
    bytes.insert(bytes.end(), more.begin(), more.end());
}

inline void appendNumber(platform::Bytes& bytes, std::uint64_t number, std::size_t width) {
    for (std::size_t i = width; i > 0; --i) {
        bytes.push_back(i > 8 ? std::uint8_t{0}
                              : static_cast<std::uint8_t>(number >> (8 * (i - 1))));
    }
}

/// A binary property list put together by hand. Objects that are not given another place come one
/// behind the other.
struct HandMadePropertyList {
    std::string magic = "bplist00";
    std::vector<platform::Bytes> objects;
    std::size_t offsetWidth = 1;
    std::size_t referenceWidth = 1;
    std::uint64_t top = 0;

    [[nodiscard]] platform::Bytes bytes() const {
        platform::Bytes file(magic.begin(), magic.end());
        platform::Bytes offsets;
        for (const platform::Bytes& object : objects) {
            appendNumber(offsets, file.size(), offsetWidth);
            append(file, object);
        }
        const std::size_t offsetTable = file.size();
        append(file, offsets);
        append(file, platform::Bytes(6));
        appendNumber(file, offsetWidth, 1);
        appendNumber(file, referenceWidth, 1);
        appendNumber(file, objects.size(), 8);
        appendNumber(file, top, 8);
        appendNumber(file, offsetTable, 8);
        return file;
    }
};

/// One object that is the whole value.
inline platform::Bytes singleObject(const platform::Bytes& object) {
    HandMadePropertyList file;
    file.objects = {object};
    file.offsetWidth = object.size() + file.magic.size() > 0xff ? 2 : 1;
    file.offsetWidth = object.size() + file.magic.size() > 0xffff ? 4 : file.offsetWidth;
    return file.bytes();
}

} // namespace support
