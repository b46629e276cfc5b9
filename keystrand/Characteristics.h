#pragma once

#include "keystrand/Requirement.h"

#include <cstdint>

namespace keystrand {

/// Which credentials matter to a requirement: bit T stands for credentials of type T.
struct Characteristics {
    /// At least one leaf asks for it.
    std::uint32_t usable = 0;
    /// The requirement cannot be met without it.
    std::uint32_t indispensable = 0;

    bool operator==(const Characteristics&) const = default;
};

[[nodiscard]] Characteristics characteristicsOf(const Requirement& requirement);

} // namespace keystrand
