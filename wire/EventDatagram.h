#pragma once

#include <cstddef>
#include <cstdint>
#include <optional>
#include <span>
#include <string>
#include <string_view>
#include <vector>

/// The datagrams of the event socket: one datagram is one event. The layout is described in
/// docs/events.md.
namespace wire {

inline constexpr char kEventMagic[4] = {'K', 'S', 'T', 'E'};
inline constexpr std::uint8_t kEventVersion = 1;
inline constexpr std::size_t kEventHeaderSize = 4 + 1 + 1 + 2 + 4;
inline constexpr std::size_t kEventMaxStreamLength = 255;
inline constexpr std::size_t kEventMaxNameLength = 1024;
inline constexpr std::size_t kEventMaxSize = 4096;

/// The streams that the daemon knows.
inline constexpr char kNotifydMatchingStream[] = "com.zerva.notifyd.matching";
inline constexpr char kCorvidMatchingStream[] = "com.zerva.corvid.matching";
inline constexpr char kAlarmStream[] = "com.zerva.alarm";

/// The daemon's one alarm on that stream.
inline constexpr char kAlarmName[] = "com.zerva.kstd.alarm";

/// An event as it stands in a datagram; the views point into the datagram.
struct EventDatagram {
    std::string_view stream;
    std::string_view name;
    std::span<const std::uint8_t> payload;
};

/// The datagram for an event, or none when a name is empty, too long or holds a zero byte, or when
/// the datagram would be larger than kEventMaxSize.
[[nodiscard]] std::optional<std::vector<std::uint8_t>>
encodeEvent(std::string_view stream, std::string_view name,
            std::span<const std::uint8_t> payload = {});

/// The event in `datagram`, or none when it is not exactly one well-formed event.
[[nodiscard]] std::optional<EventDatagram> decodeEvent(std::span<const std::uint8_t> datagram);

} // namespace wire
