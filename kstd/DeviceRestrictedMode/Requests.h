#pragma once

#include "KSTLib/KSTLib.h"
#include "wire/RestrictedMode.h"

#include <cstdint>
#include <span>

namespace kstd {

/// Sends a kernel-control request that has no output. 0 or the status of the kernel side.
[[nodiscard]] inline KSTStatus sendRequest(wire::rm::ControlCode code,
                                           std::span<const std::uint8_t> input) {
    return KSTKernelControl(code, input.data(), input.size(), nullptr);
}

} // namespace kstd
