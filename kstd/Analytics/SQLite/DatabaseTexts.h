#pragma once

#include "platform/Value.h"

#include <concepts>
#include <cstdint>
#include <initializer_list>
#include <span>
#include <string>
#include <string_view>
#include <type_traits>
#include <variant>

namespace kstd {

template <typename Number>
concept FormattableInteger =
    std::integral<Number> && !std::same_as<Number, bool> && !std::same_as<Number, char>;

/// What a conversion of a format writes: a text, an integer or a real number. A text is not copied:
/// it must last as long as the argument.
class FormatArgument {
  public:
    // NOLINTBEGIN(google-explicit-constructor): arguments are written as they are.
    template <typename Text>
    requires std::convertible_to<const Text&, std::string_view> FormatArgument(const Text& text)
        : content_(std::string_view(text)) {}
    template <FormattableInteger Number>
    FormatArgument(Number number) : content_(widest(number)) {}
    template <std::floating_point Number>
    FormatArgument(Number number) : content_(double{number}) {}
    // NOLINTEND(google-explicit-constructor)

    [[nodiscard]] const std::string_view* text() const {
        return std::get_if<std::string_view>(&content_);
    }
    [[nodiscard]] const std::int64_t* signedInteger() const {
        return std::get_if<std::int64_t>(&content_);
    }
    [[nodiscard]] const std::uint64_t* unsignedInteger() const {
        return std::get_if<std::uint64_t>(&content_);
    }
    [[nodiscard]] const double* real() const { return std::get_if<double>(&content_); }

  private:
    static std::int64_t widest(std::signed_integral auto number) { return number; }
    static std::uint64_t widest(std::unsigned_integral auto number) { return number; }

    std::variant<std::string_view, std::int64_t, std::uint64_t, double> content_;
};

/// `format` with its conversions replaced by the arguments, in order. Only the format is
/// interpreted, never an argument. The locale has no say.
///
///     %@                      a text, an integer in decimal, or the shortest decimal number that
///                             reads back as the same real
///     %s                      a text
///     %d %i %u %x             an integer of either sign, reduced to 32 bits; %x in lower case
///     %ld %li %lu %lx         the same with 64 bits, with "ll" too
///     %f                      a real with six decimals
///     %%                      a percent sign, without an argument
///
/// Every other sequence is left in the text as it stands, without using up an argument. So is a
/// conversion without an argument left, and one whose argument is of another kind, which does use
/// it up. Arguments too many are ignored.
[[nodiscard]] std::string formatText(std::string_view format,
                                     std::span<const FormatArgument> arguments);
[[nodiscard]] inline std::string formatText(std::string_view format,
                                            std::initializer_list<FormatArgument> arguments) {
    return formatText(format, std::span(arguments.begin(), arguments.size()));
}

/// `number` with exactly six decimals and a point, whatever the locale. Numbers beyond the finite
/// are "inf", "-inf" and "nan".
[[nodiscard]] std::string fixedText(double number);

/// The decimal number that `text` begins with, after blanks: a sign or none, digits with or without
/// a point, an exponent or none; what follows is ignored. Whatever the locale, the separator is the
/// point. 0 when there is no such number, or when no finite 32-bit number holds it.
[[nodiscard]] float leadingFloat(std::string_view text);

/// Two lower-case digits a byte, the high nibble first, with a blank between groups of four bytes.
[[nodiscard]] std::string RXHexString(std::span<const std::uint8_t> bytes);
[[nodiscard]] std::string RXLowercaseHexStringWithoutSpaces(std::span<const std::uint8_t> bytes);
[[nodiscard]] std::string RXUppercaseHexStringWithoutSpaces(std::span<const std::uint8_t> bytes);

/// The bytes that the digits of `text` make. Everything that is no digit of the chosen case is
/// skipped, digits of the other case included; a last digit without a partner is dropped.
[[nodiscard]] platform::Bytes RXDataWithHexString(std::string_view text,
                                                  bool stringIsUppercase = false);

} // namespace kstd
