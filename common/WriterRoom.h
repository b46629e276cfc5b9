#pragma once

#include "common/SerializationContext.h"

#include <cstdint>

/// The room that the writer of a payload is offered.
namespace kst {

/// The failure of a writer whose payload does not fit.
[[nodiscard]] inline KSTStatus failForRoom(CheckPlace place = CheckPlace::here()) noexcept {
    return fail(serializationContext(), "*outSize >= requiredSize", 0, kKSTErrorBadParameter,
                place);
}

/// `measured` is how measuring the payload ended: a failure is reported and returned. Otherwise the
/// size must fit.
[[nodiscard]] inline KSTStatus checkRoom(KSTStatus measured, std::uint64_t requiredSize,
                                         std::uint64_t room) noexcept {
    if (measured != kKSTErrorSuccess) {
        return failCall(serializationContext(), measured);
    }
    return room >= requiredSize ? kKSTErrorSuccess : failForRoom();
}

} // namespace kst
