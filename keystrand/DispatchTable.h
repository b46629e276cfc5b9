#pragma once

#include "keystrand/KernelStatus.h"

#include <cstddef>
#include <cstdint>
#include <functional>
#include <limits>
#include <map>
#include <span>
#include <vector>

namespace keystrand {

/// What a command did. `output` is empty unless `status` is 0.
struct CommandResult {
    KernelStatus status = kKernelSuccess;
    std::vector<std::uint8_t> output;
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
