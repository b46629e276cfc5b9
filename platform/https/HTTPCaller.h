#pragma once

#include <cstddef>
#include <cstdint>
#include <span>

namespace platform {

/// Who waits for the end of a transfer, and gives the body of its request piece by piece. Called on
/// the thread that makes the transfer, while it does.
class HTTPCaller {
  public:
    HTTPCaller() = default;
    HTTPCaller(const HTTPCaller&) = delete;
    HTTPCaller& operator=(const HTTPCaller&) = delete;
    virtual ~HTTPCaller() = default;

    [[nodiscard]] virtual std::uint64_t bodySize() const = 0;

    /// Fills the beginning of `room` with what comes next of the body and says how much that is.
    /// 0, when there is no more to be had, ends the transfer.
    [[nodiscard]] virtual std::size_t giveBody(std::span<char> room) = 0;

    /// Whether the transfer is to go on. Asked about once a second or more often.
    [[nodiscard]] virtual bool isWaiting() = 0;
};

} // namespace platform
