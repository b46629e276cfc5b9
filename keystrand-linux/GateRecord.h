#pragma once

#include "keystrand-linux/GatePolicy.h"

#include <optional>
#include <set>
#include <string>
#include <string_view>
#include <tuple>

namespace keystrand::usb {

/// What one start of the machine remembers of the gate, whichever service guards it.
struct GateRecord {
    GateState gate = {};
    struct Service {
        /// Restricted mode was on.
        bool restricted = false;
        /// Whether it was on when the machine went off was not known yet.
        bool starting = false;
        /// Until when an administrator has opened the gate.
        std::optional<BootTime> openUntil = std::nullopt;

        bool operator==(const Service&) const = default;
    };
    Service service = {};
    /// There was one before that nobody could read: who closed what it is about is not known.
    bool replacesLost = false;

    bool operator==(const GateRecord&) const = default;
};

/// As lines of words, the last of which is "end".
[[nodiscard]] std::string encodeGateRecord(const GateRecord& record);
/// None for anything else than what `encodeGateRecord` makes.
[[nodiscard]] std::optional<GateRecord> decodeGateRecord(std::string_view text);

/// A device as it is recognised after a restart of the machine: by its place and by what it says
/// about itself. Whoever says the same at the same place is taken for it.
struct KnownAcrossStarts {
    std::string controller;
    /// The chain of ports behind the controller's root hub: "2.3".
    std::string path;
    std::uint16_t vendor = 0;
    std::uint16_t product = 0;
    std::uint64_t descriptorsHash = 0;
    std::string serial;

    auto operator<=>(const KnownAcrossStarts&) const = default;
};

[[nodiscard]] KnownAcrossStarts acrossStarts(const UsbDevice& device);

using KnownDevices = std::set<KnownAcrossStarts>;

[[nodiscard]] std::string encodeKnownDevices(const KnownDevices& devices);
/// None for anything else than what `encodeKnownDevices` makes.
[[nodiscard]] std::optional<KnownDevices> decodeKnownDevices(std::string_view text);

/// The name of a standing in these texts and in those for people's tools, and back.
[[nodiscard]] std::string_view nameOf(Standing standing);
[[nodiscard]] std::optional<Standing> standingNamed(std::string_view name);

} // namespace keystrand::usb
