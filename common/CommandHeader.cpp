#include "common/CommandHeader.h"

#include <cstring>

namespace kst {

static_assert(sizeof KST_COMMAND_MAGIC - 1 == kKSTCommandMagicSize);

void writeCommandHeader(std::uint8_t* frame, std::uint8_t code, std::uint8_t secondByte,
                        std::uint8_t thirdByte) noexcept {
    std::memcpy(frame, KST_COMMAND_MAGIC, kKSTCommandMagicSize);
    frame[kKSTCommandCodeOffset] = code;
    frame[kKSTCommandSecondByteOffset] = secondByte;
    frame[kKSTCommandThirdByteOffset] = thirdByte;
}

} // namespace kst
