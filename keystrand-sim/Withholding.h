#pragma once

#include <cstddef>
#include <cstdint>
#include <optional>
#include <span>

namespace keystrand::sim {

/// What the request log leaves out of an input that carries a credential.
struct Withholding {
    /// How many bytes from the start may be kept.
    std::size_t kept = 0;
    /// The type of the credential, if the input has one in its place.
    std::optional<std::uint8_t> credentialType;
};

/// None for a command that carries no credential. Of those that do, the handle may be kept.
[[nodiscard]] std::optional<Withholding> withholdingFrom(std::uint8_t command,
                                                         std::span<const std::uint8_t> payload);

} // namespace keystrand::sim
