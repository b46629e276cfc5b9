#pragma once

#include "platform/Date.h"
#include "platform/Timestamp.h"

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

namespace kstctl {

/// 2026-11-20T08:15:00Z, to the second, cut off towards the past.
[[nodiscard]] std::string timeText(platform::Timestamp time);
[[nodiscard]] std::string timeText(platform::Date time);
/// The same for seconds since 1970-01-01 UTC; empty for 0, which stands for no time, and for times
/// after the year 9999.
[[nodiscard]] std::string timeText(std::uint64_t secondsSince1970);

/// The date that a text says: 2026-11-20T08:15:00Z or with +hh:mm, or seconds since 1970-01-01 UTC
/// with up to nine decimals. None for anything else, and for a date that no Date can express.
[[nodiscard]] std::optional<platform::Date> dateOfText(std::string_view text);

} // namespace kstctl
