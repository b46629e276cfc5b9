#include "keystrand/CommandFrame.h"

#include "KSTLib/Command.h"
#include "base/ByteReader.h"

#include <string_view>

namespace keystrand {

std::optional<CommandFrame> decodeCommandFrame(std::span<const std::uint8_t> input) {
    constexpr std::size_t kBytesAfterCode = kKSTCommandHeaderSize - kKSTCommandSecondByteOffset;
    base::ByteReader reader(input);
    std::string_view magic;
    CommandFrame frame;
    if (!reader.readText(magic, kKSTCommandMagicSize) || magic != KST_COMMAND_MAGIC ||
        !reader.readU8(frame.code) || !reader.skip(kBytesAfterCode)) {
        return std::nullopt;
    }
    frame.payload = reader.rest();
    return frame;
}

std::optional<std::uint32_t> controlCodeOf(const CommandFrame& frame) {
    base::ByteReader reader(frame.payload);
    std::uint32_t control = 0;
    if (frame.code != kKSTCommandKernelControl || !reader.readU32(control)) {
        return std::nullopt;
    }
    return control;
}

} // namespace keystrand
