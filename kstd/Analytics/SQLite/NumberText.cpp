#include "kstd/Analytics/SQLite/NumberText.h"

#include <algorithm>
#include <array>
#include <charconv>
#include <cmath>
#include <limits>
#include <system_error>

namespace kstd {

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

} // namespace kstd
