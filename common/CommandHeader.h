#pragma once

#include "KSTLib/Command.h"

#include <cstdint>

namespace kst {

/// Writes bytes 0 to 6 of a command frame. `frame` has room for the header; its byte 7 is left
/// alone.
void writeCommandHeader(std::uint8_t* frame, std::uint8_t code, std::uint8_t secondByte,
                        std::uint8_t thirdByte) noexcept;

} // namespace kst
