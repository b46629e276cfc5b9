#include "kstd/Analytics/SQLite/DatabaseTexts.h"

#include "base/Concat.h"

#include <algorithm>
#include <array>
#include <charconv>
#include <cmath>
#include <cstddef>
#include <limits>
#include <optional>
#include <system_error>

namespace kstd {

namespace {

struct Conversion {
    char letter = 0;
    bool isLong = false;
    /// With the percent sign.
    std::size_t length = 0;
};

/// The conversion that `text`, which begins with a percent sign, begins with.
std::optional<Conversion> conversionAt(std::string_view text) {
    std::size_t letter = 1;
    // At most two: "lll" is no conversion.
    while (letter < 3 && letter < text.size() && text[letter] == 'l') {
        ++letter;
    }
    if (letter == text.size()) {
        return std::nullopt;
    }
    const bool isLong = letter > 1;
    const std::string_view letters = isLong ? "diux" : "@sdiuxf%";
    if (letters.find(text[letter]) == std::string_view::npos) {
        return std::nullopt;
    }
    return Conversion{text[letter], isLong, letter + 1};
}

std::string shortestText(double number) {
    std::array<char, 32> digits{};
    const auto end = std::to_chars(digits.data(), digits.data() + digits.size(), number);
    return {digits.data(), end.ptr};
}

std::string objectText(const FormatArgument& argument) {
    if (const std::string_view* const text = argument.text()) {
        return std::string(*text);
    }
    if (const std::int64_t* const number = argument.signedInteger()) {
        return base::concat(*number);
    }
    if (const std::uint64_t* const number = argument.unsignedInteger()) {
        return base::concat(*number);
    }
    return shortestText(*argument.real());
}

/// The bits of an integer argument, which are the same for either sign.
std::optional<std::uint64_t> integerBits(const FormatArgument& argument) {
    if (const std::int64_t* const number = argument.signedInteger()) {
        return static_cast<std::uint64_t>(*number);
    }
    if (const std::uint64_t* const number = argument.unsignedInteger()) {
        return *number;
    }
    return std::nullopt;
}

std::string integerText(const Conversion& conversion, std::uint64_t bits) {
    const bool isSigned = conversion.letter == 'd' || conversion.letter == 'i';
    if (isSigned) {
        return conversion.isLong ? base::concat(static_cast<std::int64_t>(bits))
                                 : base::concat(static_cast<std::int32_t>(bits));
    }
    const std::uint64_t number = conversion.isLong ? bits : static_cast<std::uint32_t>(bits);
    return conversion.letter == 'x' ? base::concat(base::Hex{number}) : base::concat(number);
}

/// None when the argument is of another kind than the conversion wants.
std::optional<std::string> convertedText(const Conversion& conversion,
                                         const FormatArgument& argument) {
    switch (conversion.letter) {
    case '@':
        return objectText(argument);
    case 's':
        return argument.text() ? std::optional(std::string(*argument.text())) : std::nullopt;
    case 'f':
        return argument.real() ? std::optional(fixedText(*argument.real())) : std::nullopt;
    default:
        break;
    }
    const std::optional<std::uint64_t> bits = integerBits(argument);
    return bits ? std::optional(integerText(conversion, *bits)) : std::nullopt;
}

/// What stands in the result for the conversion. Uses up the argument that it wants.
std::string replacement(const Conversion& conversion, std::string_view asWritten,
                        std::span<const FormatArgument>& arguments) {
    if (conversion.letter == '%') {
        return "%";
    }
    if (arguments.empty()) {
        return std::string(asWritten);
    }
    // Used up even when it is of another kind, so that the conversions after it get their own.
    const FormatArgument& argument = arguments.front();
    arguments = arguments.subspan(1);
    return convertedText(conversion, argument).value_or(std::string(asWritten));
}

} // namespace

std::string formatText(std::string_view format, std::span<const FormatArgument> arguments) {
    std::string text;
    while (!format.empty()) {
        const std::size_t percent = std::min(format.find('%'), format.size());
        text.append(format.substr(0, percent));
        format.remove_prefix(percent);
        if (format.empty()) {
            break;
        }
        const std::optional<Conversion> conversion = conversionAt(format);
        const std::size_t length = conversion ? conversion->length : 1;
        const std::string_view asWritten = format.substr(0, length);
        text.append(conversion ? replacement(*conversion, asWritten, arguments)
                               : std::string(asWritten));
        format.remove_prefix(length);
    }
    return text;
}

namespace {

constexpr int kDecimals = 6;
/// A sign, the digits of the largest number, the point and the decimals.
constexpr std::size_t kLongestFixedText =
    1 + std::numeric_limits<double>::max_exponent10 + 1 + 1 + kDecimals;

constexpr std::string_view kBlanks = " \t\n\v\f\r";

} // namespace

std::string fixedText(double number) {
    if (std::isnan(number)) {
        return "nan"; // whatever its sign
    }
    std::array<char, kLongestFixedText> digits{};
    const auto end = std::to_chars(digits.data(), digits.data() + digits.size(), number,
                                   std::chars_format::fixed, kDecimals);
    return {digits.data(), end.ptr};
}

float leadingFloat(std::string_view text) {
    text.remove_prefix(std::min(text.find_first_not_of(kBlanks), text.size()));
    // A plus sign is the one thing that from_chars does not take; a minus sign may not follow it.
    if (text.starts_with('+') && !text.starts_with("+-")) {
        text.remove_prefix(1);
    }
    float number = 0;
    const auto end = std::from_chars(text.data(), text.data() + text.size(), number);
    return end.ec == std::errc() && std::isfinite(number) ? number : 0;
}

namespace {

constexpr std::string_view kLowercaseDigits = "0123456789abcdef";
constexpr std::string_view kUppercaseDigits = "0123456789ABCDEF";
constexpr std::size_t kBytesInGroup = 4;

void appendByte(std::string& text, std::uint8_t byte, std::string_view digits) {
    text.push_back(digits[byte >> 4U]);
    text.push_back(digits[byte & 0xfU]);
}

std::string withoutSpaces(std::span<const std::uint8_t> bytes, std::string_view digits) {
    std::string text;
    text.reserve(2 * bytes.size());
    for (const std::uint8_t byte : bytes) {
        appendByte(text, byte, digits);
    }
    return text;
}

} // namespace

std::string RXHexString(std::span<const std::uint8_t> bytes) {
    std::string text;
    text.reserve(2 * bytes.size() + bytes.size() / kBytesInGroup);
    for (std::size_t i = 0; i < bytes.size(); ++i) {
        if (i != 0 && i % kBytesInGroup == 0) {
            text.push_back(' ');
        }
        appendByte(text, bytes[i], kLowercaseDigits);
    }
    return text;
}

std::string RXLowercaseHexStringWithoutSpaces(std::span<const std::uint8_t> bytes) {
    return withoutSpaces(bytes, kLowercaseDigits);
}

std::string RXUppercaseHexStringWithoutSpaces(std::span<const std::uint8_t> bytes) {
    return withoutSpaces(bytes, kUppercaseDigits);
}

platform::Bytes RXDataWithHexString(std::string_view text, bool stringIsUppercase) {
    const std::string_view digits = stringIsUppercase ? kUppercaseDigits : kLowercaseDigits;
    platform::Bytes bytes;
    bytes.reserve(text.size() / 2);
    std::size_t highNibble = std::string_view::npos;
    for (const char character : text) {
        const std::size_t nibble = digits.find(character);
        if (nibble == std::string_view::npos) {
            continue;
        }
        if (highNibble == std::string_view::npos) {
            highNibble = nibble;
        } else {
            bytes.push_back(static_cast<std::uint8_t>(highNibble << 4U | nibble));
            highNibble = std::string_view::npos;
        }
    }
    return bytes;
}

} // namespace kstd
