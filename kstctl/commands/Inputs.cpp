#include "kstctl/commands/Inputs.h"

#include "base/Concat.h"
#include "base/Digits.h"
#include "kstctl/ExitStatus.h"
#include "kstd/Analytics/SQLite/DateFormatter.h"
#include "platform/ManagedSettings.h"
#include "platform/linux/RegularFile.h"
#include "wire/EventDatagram.h"
#include "wire/RestrictedMode.h"

#include <algorithm>
#include <array>
#include <cerrno>
#include <charconv>
#include <iterator>
#include <optional>
#include <span>
#include <string_view>
#include <system_error>
#include <unistd.h>
#include <utility>

namespace kstctl {

namespace {

platform::Error tooLong(const std::string& path) {
    return failure(ExitStatus::malformed,
                   base::concat(path, ": longer than ", kMaxInputSize, " bytes"));
}

platform::Result<platform::Bytes> readStandardInput() {
    constexpr char kName[] = "standard input";
    platform::Bytes bytes;
    std::array<std::uint8_t, 4096> buffer{};
    for (;;) {
        const ssize_t count = ::read(STDIN_FILENO, buffer.data(), buffer.size());
        if (count == 0) {
            return bytes;
        }
        if (count < 0 && errno != EINTR) {
            return fileError(kName, errno);
        }
        bytes.insert(bytes.end(), buffer.begin(), buffer.begin() + (count > 0 ? count : 0));
        if (bytes.size() > kMaxInputSize) {
            return tooLong(kName);
        }
    }
}

} // namespace

platform::Result<platform::Bytes> readInput(const std::string& path) {
    if (path == "-") {
        return readStandardInput();
    }
    platform::RegularFile file = platform::readRegularFile(path, kMaxInputSize);
    switch (file.failure) {
    case platform::ReadFailure::none:
        return std::move(file.bytes);
    case platform::ReadFailure::notRegular:
        return failure(ExitStatus::malformed, base::concat(path, " is not a regular file"));
    case platform::ReadFailure::tooLarge:
        return tooLong(path);
    case platform::ReadFailure::missing:
    case platform::ReadFailure::unreadable:
        break;
    }
    return fileError(path, file.error);
}

namespace {

constexpr std::string_view kBlanks = " \t\r\n";

platform::Error notHex(std::size_t at, std::string_view why) {
    return failure(ExitStatus::malformed,
                   base::concat("no hexadecimal digits: ", why, " at character ", at + 1));
}

} // namespace

platform::Result<platform::Bytes> bytesOfHex(std::string_view text) {
    platform::Bytes bytes;
    bytes.reserve(text.size() / 2);
    std::optional<std::uint8_t> high;
    for (std::size_t i = 0; i < text.size(); ++i) {
        const bool isBlank = kBlanks.find(text[i]) != std::string_view::npos;
        const std::optional<std::uint8_t> digit = base::hexDigitValue(text[i]);
        if (isBlank && high) {
            return notHex(i, "half a byte");
        }
        if (isBlank) {
            continue;
        }
        if (!digit) {
            return notHex(i, "another character");
        }
        if (high) {
            bytes.push_back(static_cast<std::uint8_t>(*high << 4U | *digit));
            high.reset();
        } else {
            high = digit;
        }
    }
    if (high) {
        return notHex(text.size(), "half a byte");
    }
    return bytes;
}

namespace {

constexpr std::size_t kDecimals = 9;

std::optional<std::int64_t> digits(std::string_view text) {
    std::int64_t number = 0;
    const char* const end = text.data() + text.size();
    const auto result = std::from_chars(text.data(), end, number);
    if (text.empty() || text.front() == '-' || result.ec != std::errc() || result.ptr != end) {
        return std::nullopt;
    }
    return number;
}

std::optional<platform::Date> dateOf(std::int64_t seconds, std::int64_t nanoseconds) {
    std::int64_t all = 0;
    if (__builtin_mul_overflow(seconds, platform::kNanosecondsPerSecond, &all) ||
        __builtin_add_overflow(all, nanoseconds, &all)) {
        return std::nullopt;
    }
    return platform::Date{all};
}

std::optional<platform::Date> dateOfSeconds(std::string_view text) {
    const std::size_t point = text.find('.');
    const auto seconds = digits(text.substr(0, point));
    if (!seconds || point == std::string_view::npos) {
        return seconds ? dateOf(*seconds, 0) : std::nullopt;
    }
    std::string decimals(text.substr(point + 1));
    if (decimals.empty() || decimals.size() > kDecimals) {
        return std::nullopt;
    }
    decimals.resize(kDecimals, '0');
    const auto nanoseconds = digits(decimals);
    return nanoseconds ? dateOf(*seconds, *nanoseconds) : std::nullopt;
}

} // namespace

std::optional<platform::Date> dateOfText(std::string_view text) {
    const auto written = kstd::DateFormatter().date(text);
    if (!written) {
        return dateOfSeconds(text);
    }
    // Whole seconds of a year with four digits: exact.
    return dateOf(
        static_cast<std::int64_t>(written->secondsSince2001) + platform::kSecondsFrom1970To2001, 0);
}

namespace {

using namespace wire::rm;

struct ShortName {
    std::string_view name;
    /// Put before what it stands for.
    std::string_view prefix;
    std::string_view whole;
    std::string_view stream = wire::kNotifydMatchingStream;
};

constexpr ShortName kOtherEvents[] = {
    {"settings", "", platform::kSettingsChangedEvent},
    {"alarm", "", wire::kAlarmName, wire::kAlarmStream},
};

/// The kernel service's notifications and the events of others.
constexpr auto kEvents = [] {
    std::array<ShortName, std::size(kNotificationKinds) + std::size(kOtherEvents)> events{};
    auto* next = std::copy(std::begin(kOtherEvents), std::end(kOtherEvents), events.begin());
    for (const NotificationKind& kind : kNotificationKinds) {
        *next++ = {kind.shortName, kNotificationNamePrefix, kind.property};
    }
    return events;
}();

constexpr std::array kStreams = {
    ShortName{"notifyd", "", wire::kNotifydMatchingStream},
    ShortName{"corvid", "", wire::kCorvidMatchingStream},
    ShortName{"alarm", "", wire::kAlarmStream},
};

const ShortName* find(std::span<const ShortName> names, std::string_view name) {
    for (const ShortName& candidate : names) {
        if (candidate.name == name) {
            return &candidate;
        }
    }
    return nullptr;
}

platform::Result<std::string> wholeName(std::span<const ShortName> names, const std::string& name,
                                        const char* what, bool isExact) {
    if (isExact) {
        return name;
    }
    if (const ShortName* const known = find(names, name)) {
        return base::concat(known->prefix, known->whole);
    }
    if (name.find('.') != std::string::npos) {
        return name;
    }
    return failure(ExitStatus::usage, base::concat("there is no ", what, ' ', name,
                                                   "; --exact sends it all the same"));
}

std::string listed(std::span<const ShortName> names) {
    std::string list;
    for (const ShortName& name : names) {
        list += base::concat(list.empty() ? "" : ", ", name.name);
    }
    return list;
}

} // namespace

std::string eventShortNames() {
    return listed(kEvents);
}

std::string streamShortNames() {
    return listed(kStreams);
}

platform::Result<EventName> findEventName(const SendCommand& command) {
    auto name = wholeName(kEvents, command.name, "event", command.isExact);
    if (!name) {
        return name.error();
    }
    const ShortName* const known = find(kEvents, command.name);
    const std::string_view usual =
        known != nullptr ? known->stream : std::string_view(wire::kNotifydMatchingStream);
    auto stream = command.stream ? wholeName(kStreams, *command.stream, "stream", command.isExact)
                                 : platform::Result<std::string>(std::string(usual));
    if (!stream) {
        return stream.error();
    }
    return EventName{.stream = std::move(stream).value(), .name = std::move(name).value()};
}

} // namespace kstctl
