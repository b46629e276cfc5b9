#include "keystrand/DispatchTable.h"

#include "KSTLib/Command.h"
#include "base/ByteReader.h"

#include <string_view>
#include <utility>

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

void DispatchTable::add(std::uint32_t code, Lengths lengths, Handler handler) {
    entries_.insert_or_assign(code, Entry{lengths, std::move(handler)});
}

CommandResult DispatchTable::run(std::uint32_t code, std::span<const std::uint8_t> payload,
                                 std::size_t offered) const {
    const auto found = entries_.find(code);
    if (found == entries_.end()) {
        return {.status = kKernelUnknownCommand, .output = {}};
    }
    const Entry& entry = found->second;
    if (payload.size() < entry.lengths.min || payload.size() > entry.lengths.max) {
        return {.status = kKernelBadPayload, .output = {}};
    }
    if (offered < entry.lengths.output) {
        return {.status = kKernelReplyDoesNotFit, .output = {}};
    }
    return entry.handler(payload);
}

} // namespace keystrand
