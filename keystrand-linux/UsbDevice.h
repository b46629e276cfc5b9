#pragma once

#include "keystrand-linux/UsbDescriptors.h"

#include <cstdint>
#include <string>
#include <string_view>
#include <vector>

namespace keystrand::usb {

/// What a root hub decides about devices that come, as sysfs counts it.
using AuthorizedDefault = int;
inline constexpr AuthorizedDefault kNobody = 0;
inline constexpr AuthorizedDefault kEverybody = 1;
/// Devices on ports that nobody can reach from outside.
inline constexpr AuthorizedDefault kHardWiredOnly = 2;
/// The kernel's parameter only: each root hub as its controller has it.
inline constexpr AuthorizedDefault kAsTheControllerHasIt = -1;

/// Whether a root hub that reads this refuses whom the kernel's own default lets in.
[[nodiscard]] constexpr bool isClosed(AuthorizedDefault value) {
    return value == kNobody || value == kHardWiredOnly;
}

/// One time that a device was plugged in. The port alone names a place, the device's number comes
/// back after 127 others, and the directory's inode makes the pair unique within a start of the
/// machine.
struct Attachment {
    /// Bus and chain of ports: "1-2.3".
    std::string port;
    std::uint32_t number = 0;
    std::uint64_t inode = 0;

    bool operator==(const Attachment&) const = default;
    auto operator<=>(const Attachment&) const = default;
};

/// A device as it is found on the bus, root hubs apart.
struct UsbDevice {
    Attachment attachment;
    /// The controller's place in the machine, which outlives a restart; bus numbers do not.
    std::string controller;
    std::uint16_t vendor = 0;
    std::uint16_t product = 0;
    /// As the device gives them: any bytes.
    std::string manufacturer;
    std::string name;
    std::string serial;
    /// Of all its descriptors as they were read.
    std::uint64_t descriptorsHash = 0;
    UsbFunctions functions;
    /// False as long as the kernel is busy with it: some of this cannot be had then, and is empty.
    bool saidAll = true;
    bool authorized = false;
    /// The firmware says that its port is inside the machine.
    bool hardWired = false;

    [[nodiscard]] const std::string& port() const { return attachment.port; }
};

struct RootHub {
    std::uint32_t bus = 0;
    std::string controller;
    /// Unique within a start of the machine.
    std::uint64_t inode = 0;
    AuthorizedDefault authorizedDefault = kEverybody;

    bool operator==(const RootHub&) const = default;
};

/// One look at everything. What went away while it was taken is not in it.
struct BusView {
    /// False on a machine without USB, as long as nobody has loaded it.
    bool hasUsb = true;
    AuthorizedDefault parameter = kAsTheControllerHasIt;
    std::vector<RootHub> rootHubs;
    /// Each hub before what is behind it.
    std::vector<UsbDevice> devices;

    /// Null when it is not there.
    [[nodiscard]] const UsbDevice* find(const Attachment& attachment) const;
};

/// Whether `port` lies behind the hub at `hub`.
[[nodiscard]] inline bool isBehind(std::string_view port, std::string_view hub) {
    return port.size() > hub.size() && port.substr(0, hub.size()) == hub && port[hub.size()] == '.';
}

/// The bus of a port, 0 for what is none.
[[nodiscard]] std::uint32_t busOf(std::string_view port);

} // namespace keystrand::usb
