#include "kstctl/HexText.h"

#include "base/Concat.h"
#include "base/Digits.h"
#include "kstctl/ExitStatus.h"

#include <optional>

namespace kstctl {

namespace {

constexpr std::string_view kBlanks = " \t\r\n";

platform::Error notHex(std::size_t at, std::string_view why) {
    return failure(ExitStatus::malformed,
                   base::concat("no hexadecimal digits: ", why, " at character ", at + 1));
}

} // namespace

platform::Result<platform::Bytes> bytesOfHex(std::string_view text) {
    platform::Bytes bytes;
    bytes.reserve(text.size() / 2);
    std::optional<std::uint8_t> high;
    for (std::size_t i = 0; i < text.size(); ++i) {
        const bool isBlank = kBlanks.find(text[i]) != std::string_view::npos;
        const std::optional<std::uint8_t> digit = base::hexDigitValue(text[i]);
        if (isBlank && high) {
            return notHex(i, "half a byte");
        }
        if (isBlank) {
            continue;
        }
        if (!digit) {
            return notHex(i, "another character");
        }
        if (high) {
            bytes.push_back(static_cast<std::uint8_t>(*high << 4U | *digit));
            high.reset();
        } else {
            high = digit;
        }
    }
    if (high) {
        return notHex(text.size(), "half a byte");
    }
    return bytes;
}

} // namespace kstctl
