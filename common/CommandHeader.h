#pragma once

#include "KSTLib/Command.h"

#include <cstdint>
#include <cstring>

namespace kst {

static_assert(sizeof KST_COMMAND_MAGIC - 1 == kKSTCommandMagicSize);

/// Writes bytes 0 to 6 of a command frame. `frame` has room for the header; its byte 7 is left
/// alone.
inline void writeCommandHeader(std::uint8_t* frame, std::uint8_t code, std::uint8_t secondByte,
                               std::uint8_t thirdByte) noexcept {
    std::memcpy(frame, KST_COMMAND_MAGIC, kKSTCommandMagicSize);
    frame[kKSTCommandCodeOffset] = code;
    frame[kKSTCommandSecondByteOffset] = secondByte;
    frame[kKSTCommandThirdByteOffset] = thirdByte;
}

} // namespace kst
