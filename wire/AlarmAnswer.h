#pragma once

#include <cstddef>
#include <cstdint>
#include <optional>
#include <span>
#include <string>
#include <vector>

namespace wire {

/// What the alarm's helper tells the daemon about the init system's timer.
///
/// One message: version 1, the timer and whether it wakes the machine, a byte each; the date, 8
/// bytes, signed and little-endian; then the reason.
struct AlarmAnswer {
    enum class Timer : std::uint8_t {
        /// There is none, because no alarm is registered that is not due.
        none = 0,
        waits = 1,
        /// There may be none, though there should be; `reason` says why.
        failed = 2,
    };

    Timer timer = Timer::none;
    /// False when a timer was made that leaves a machine asleep.
    bool wakesMachine = true;
    /// Of the alarm that the timer waits for, or should: nanoseconds since 1970-01-01 UTC.
    std::int64_t date = 0;
    /// For people; cut after kAlarmReasonMaxSize bytes.
    std::string reason;

    friend bool operator==(const AlarmAnswer&, const AlarmAnswer&) = default;
};

inline constexpr std::size_t kAlarmReasonMaxSize = 256;
inline constexpr std::size_t kAlarmAnswerMaxSize = 11 + kAlarmReasonMaxSize;

[[nodiscard]] std::vector<std::uint8_t> encodeAlarmAnswer(const AlarmAnswer& answer);

/// None when the bytes are no such message.
[[nodiscard]] std::optional<AlarmAnswer> decodeAlarmAnswer(std::span<const std::uint8_t> bytes);

} // namespace wire
