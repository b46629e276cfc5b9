#pragma once

#include <cstddef>
#include <cstdint>
#include <optional>
#include <string>
#include <string_view>
#include <variant>
#include <vector>

/// What an administrator's tool asks the gate in front of the USB ports, and what it answers: one
/// packet of text for each, on wire::kGateSocket. Lines end with a newline, words are apart by one
/// blank, texts of others are in hexadecimal, "-" for an empty one.
namespace wire {

inline constexpr std::size_t kGateRequestSize = 256;
inline constexpr std::size_t kGateAnswerSize = std::size_t{192} * 1024;
/// As many devices as one answer has room for.
inline constexpr std::size_t kMostGateDevices = 128;
/// Of a text of a device; the rest is cut.
inline constexpr std::size_t kMostGateText = 126;
inline constexpr std::uint32_t kMostGateOpenSeconds = 7 * 24 * 3600;

/// "devices"
struct GateDevicesRequest {
    bool operator==(const GateDevicesRequest&) const = default;
};
/// "status"
struct GateStatusRequest {
    bool operator==(const GateStatusRequest&) const = default;
};
/// "accept PORT NUMBER INODE": one time that a device was plugged in, as it was listed.
struct GateAcceptRequest {
    std::string port;
    std::uint32_t number = 0;
    std::uint64_t inode = 0;
    bool operator==(const GateAcceptRequest&) const = default;
};
/// "open SECONDS"; 0 ends what was opened.
struct GateOpenRequest {
    std::uint32_t seconds = 0;
    bool operator==(const GateOpenRequest&) const = default;
};
using GateRequest =
    std::variant<GateDevicesRequest, GateStatusRequest, GateAcceptRequest, GateOpenRequest>;

[[nodiscard]] std::string encodeGateRequest(const GateRequest& request);
/// None for anything else than what `encodeGateRequest` makes, and for more than
/// kMostGateOpenSeconds.
[[nodiscard]] std::optional<GateRequest> decodeGateRequest(std::string_view text);

struct GateDevice {
    std::string port;
    std::uint32_t number = 0;
    std::uint64_t inode = 0;
    std::uint16_t vendor = 0;
    std::uint16_t product = 0;
    /// Any bytes.
    std::string manufacturer = {};
    std::string name = {};
    std::string serial = {};
    /// "08/06/50", several apart by commas; empty for a device that was not understood.
    std::string classes = {};
    bool accepted = false;
    /// By which rule it is in or out; empty while the gate is open.
    std::string rule = {};
    /// How long that has held, in seconds.
    std::uint64_t forSeconds = 0;

    bool operator==(const GateDevice&) const = default;
};

struct GateStatus {
    bool locked = false;
    /// Nobody has said yet what held before the machine's start.
    bool starting = false;
    bool sleeping = false;
    bool restricted = false;
    bool closed = false;
    bool allowed = true;
    bool passwordSet = true;
    bool bootArgument = false;
    /// Seconds until restricted mode, and until the end of what was opened.
    std::optional<std::uint64_t> untilRestricted = std::nullopt;
    std::optional<std::uint64_t> untilClosed = std::nullopt;
    /// Devices that are out.
    std::uint32_t refused = 0;
    /// What is open though all is to be closed, in words for people; empty when nothing is.
    std::string gap = {};

    bool operator==(const GateStatus&) const = default;
};

/// "error TEXT"; the text is one line for people.
struct GateRefusal {
    std::string reason;
    bool operator==(const GateRefusal&) const = default;
};
/// "ok", and what was asked for.
struct GateDone {
    bool operator==(const GateDone&) const = default;
};
using GateDevices = std::vector<GateDevice>;
using GateAnswer = std::variant<GateDone, GateRefusal, GateDevices, GateStatus>;

/// Devices beyond kMostGateDevices are left out, and texts cut at kMostGateText bytes.
[[nodiscard]] std::string encodeGateAnswer(const GateAnswer& answer);
/// None for anything else than what `encodeGateAnswer` makes.
[[nodiscard]] std::optional<GateAnswer> decodeGateAnswer(std::string_view text);

} // namespace wire
