#pragma once

#include <string>
#include <string_view>

namespace kstd {

/// `number` with exactly six decimals and a point, whatever the locale. Numbers beyond the finite
/// are "inf", "-inf" and "nan".
[[nodiscard]] std::string fixedText(double number);

/// The decimal number that `text` begins with, after blanks: a sign or none, digits with or without
/// a point, an exponent or none; what follows is ignored. Whatever the locale, the separator is the
/// point. 0 when there is no such number, or when no finite 32-bit number holds it.
[[nodiscard]] float leadingFloat(std::string_view text);

} // namespace kstd
