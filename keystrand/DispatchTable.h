#pragma once

#include "KSTLib/Words.h"

#include <cstddef>
#include <cstdint>
#include <functional>
#include <limits>
#include <map>
#include <optional>
#include <span>
#include <vector>

namespace keystrand {

/// What the kernel service answers when it refuses; listed in docs/kernel-socket.md, and known to
/// clients by the same numbers.
using KernelStatus = std::int32_t;

inline constexpr KernelStatus kKernelSuccess = 0;
inline constexpr KernelStatus kKernelMalformedRequest = kKSTKernelErrorMalformedRequest;
inline constexpr KernelStatus kKernelNoSuchEntry = kKSTKernelErrorNoSuchEntry;
inline constexpr KernelStatus kKernelNotOpen = kKSTKernelErrorNotOpen;
inline constexpr KernelStatus kKernelUnknownSelector = kKSTKernelErrorUnknownSelector;
inline constexpr KernelStatus kKernelMalformedFrame = kKSTKernelErrorMalformedFrame;
inline constexpr KernelStatus kKernelUnknownCommand = kKSTKernelErrorUnknownCommand;
inline constexpr KernelStatus kKernelBadPayload = kKSTKernelErrorBadPayload;
inline constexpr KernelStatus kKernelReplyDoesNotFit = kKSTKernelErrorReplyDoesNotFit;
inline constexpr KernelStatus kKernelTableFull = kKSTKernelErrorTableFull;
inline constexpr KernelStatus kKernelNoSuchContext = kKSTKernelErrorNoSuchContext;
inline constexpr KernelStatus kKernelTooManyContexts = kKSTKernelErrorTooManyContexts;
inline constexpr KernelStatus kKernelTooManyCredentials = kKSTKernelErrorTooManyCredentials;
inline constexpr KernelStatus kKernelNoSuchPolicy = kKSTKernelErrorNoSuchPolicy;
inline constexpr KernelStatus kKernelBadConstraint = kKSTKernelErrorBadConstraint;

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

/// What a command did. `output` is empty unless `status` is 0.
struct CommandResult {
    KernelStatus status = kKernelSuccess;
    std::vector<std::uint8_t> output;
    /// What waits until the client has its answer; null for nothing.
    std::function<void()> afterwards = nullptr;
};

/// Commands by number, each with the payload lengths that it takes. The command codes of a frame
/// are one such table, the control codes inside the kernel-control command another.
class DispatchTable {
  public:
    using Handler = std::function<CommandResult(std::span<const std::uint8_t> payload)>;
    struct Lengths {
        std::size_t min = 0;
        std::size_t max = 0;
        /// The least room for output that the caller must offer.
        std::size_t output = 0;
    };
    static constexpr std::size_t kAnyRoom = std::numeric_limits<std::size_t>::max();

    void add(std::uint32_t code, Lengths lengths, Handler handler);

    /// kKernelUnknownCommand for a number that is not in the table, kKernelBadPayload for a length
    /// that the command does not take, kKernelReplyDoesNotFit for less room than it needs;
    /// otherwise what its handler says.
    [[nodiscard]] CommandResult run(std::uint32_t code, std::span<const std::uint8_t> payload,
                                    std::size_t offered = kAnyRoom) const;

  private:
    struct Entry {
        Lengths lengths;
        Handler handler;
    };
    std::map<std::uint32_t, Entry> entries_;
};

} // namespace keystrand
