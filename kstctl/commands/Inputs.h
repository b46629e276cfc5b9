#pragma once

#include "kstctl/CommandLine.h"
#include "platform/Date.h"
#include "platform/Result.h"
#include "platform/Value.h"

#include <cstddef>
#include <optional>
#include <string>
#include <string_view>

namespace kstctl {

/// What is read at the most. The largest message that there is has 128 KiB; twice as many digits
/// and some blanks fit.
inline constexpr std::size_t kMaxInputSize = 1024UL * 1024;

/// All bytes of the file, or of standard input when the path is "-". Fails with
/// ExitStatus::missing, ::unreadable or ::failed, and with ::malformed when it is longer than
/// kMaxInputSize or no file that can be read to its end.
[[nodiscard]] platform::Result<platform::Bytes> readInput(const std::string& path);

/// The bytes that pairs of hexadecimal digits stand for, in either case, with blanks and ends of
/// lines between pairs only. Anything else is ExitStatus::malformed.
[[nodiscard]] platform::Result<platform::Bytes> bytesOfHex(std::string_view text);

/// The date that a text says: 2026-11-20T08:15:00Z or with +hh:mm, or seconds since 1970-01-01 UTC
/// with up to nine decimals. None for anything else, and for a date that no Date can express.
[[nodiscard]] std::optional<platform::Date> dateOfText(std::string_view text);

struct EventName {
    std::string stream;
    std::string name;
};

/// The short names of events and of streams, as help and messages list them: "one, other".
[[nodiscard]] std::string eventShortNames();
[[nodiscard]] std::string streamShortNames();

/// The names that a `send` means. A short name stands for its event and, unless the command says
/// otherwise, the stream on which that comes. Any other name must have a point in it or be sent
/// with --exact: it is a mistake otherwise (ExitStatus::usage), because the daemon drops what it
/// does not know.
[[nodiscard]] platform::Result<EventName> findEventName(const SendCommand& command);

} // namespace kstctl
