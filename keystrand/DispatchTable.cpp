#include "keystrand/DispatchTable.h"

#include <utility>

namespace keystrand {

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
