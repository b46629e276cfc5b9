#pragma once

#include <cstdint>

namespace kstctl::decode {

/// What an age limit of global credentials stands for when it is no number; else empty.
[[nodiscard]] inline const char* ageText(std::uint32_t maxGlobalCredentialAge) {
    return maxGlobalCredentialAge == 0xffffffffU ? "any age" : "";
}

} // namespace kstctl::decode
