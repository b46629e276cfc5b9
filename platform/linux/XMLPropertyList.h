#pragma once

#include "platform/ValueSink.h"

#include <cstddef>
#include <cstdint>
#include <span>

namespace platform {

inline constexpr std::size_t kMaxXMLPropertyListSize = 1024UL * 1024;
/// Lists and maps in one file, empty ones and those in comments counted too.
inline constexpr std::size_t kMaxXMLPropertyListContainers = 10'000;

/// Reads a property list in the XML form, by libplist. Of a key that stands twice the later value
/// counts.
///
/// False for what libplist does not take for a property list, a text or key that is not UTF-8, and
/// anything beyond the limits above or deeper than kMaxPropertyListDepth. The sink has then taken
/// some part of it.
///
/// libplist 2.2 is no judge of single values: an integer, real or date that is malformed becomes
/// some number or date (12abc is 12, abc is 0), an integer beyond 64 bits the nearest end or
/// anything, and what follows the value is not looked at. What is well-formed comes as it is
/// written: integers from -2^63 to 2^64-1 with their sign, reals, dates of any year to the second.
[[nodiscard]] bool readXMLPropertyList(std::span<const std::uint8_t> data, ValueSink& sink);

} // namespace platform
