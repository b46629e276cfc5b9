#pragma once

#include "platform/Value.h"

#include <cstdint>
#include <span>
#include <string>
#include <string_view>

namespace kstd {

/// Two lower-case digits a byte, the high nibble first, with a blank between groups of four bytes.
[[nodiscard]] std::string RXHexString(std::span<const std::uint8_t> bytes);
[[nodiscard]] std::string RXLowercaseHexStringWithoutSpaces(std::span<const std::uint8_t> bytes);
[[nodiscard]] std::string RXUppercaseHexStringWithoutSpaces(std::span<const std::uint8_t> bytes);

/// The bytes that the digits of `text` make. Everything that is no digit of the chosen case is
/// skipped, digits of the other case included; a last digit without a partner is dropped.
[[nodiscard]] platform::Bytes RXDataWithHexString(std::string_view text,
                                                  bool stringIsUppercase = false);

} // namespace kstd
