#pragma once

#include <cstdint>
#include <optional>
#include <span>

namespace keystrand {

/// A command frame as it stands in the input of a struct call; the payload points into the input.
struct CommandFrame {
    std::uint8_t code = 0;
    std::span<const std::uint8_t> payload;
};

/// The frame in `input`, or none when it is shorter than its header or has another magic. The
/// second, third and fourth byte after the magic may be anything.
[[nodiscard]] std::optional<CommandFrame> decodeCommandFrame(std::span<const std::uint8_t> input);

/// The control code with which the payload of a kernel-control command begins, none for any other
/// command and for a payload that is too short.
[[nodiscard]] std::optional<std::uint32_t> controlCodeOf(const CommandFrame& frame);

} // namespace keystrand
