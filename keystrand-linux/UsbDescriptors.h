#pragma once

#include <cstdint>
#include <span>
#include <vector>

namespace keystrand::usb {

struct UsbClass {
    std::uint8_t number = 0;
    std::uint8_t subclass = 0;
    std::uint8_t protocol = 0;

    bool operator==(const UsbClass&) const = default;
};

/// What a device can be, over all its configurations and alternate settings.
struct UsbFunctions {
    /// False: nothing can be said about the device, and the rest is empty.
    bool understood = false;
    bool isHub = false;
    /// At least one interface is a keyboard that also speaks the boot protocol.
    bool isKeyboard = false;
    /// That, and every interface is for human input.
    bool isOnlyKeyboard = false;
    /// The classes of the interfaces, and the device's own unless it is 0, each once, as they come.
    std::vector<UsbClass> classes;

    bool operator==(const UsbFunctions&) const = default;
};

/// Reads descriptors as the kernel hands them out: the device's, and each configuration's with all
/// that belongs to it (Universal Serial Bus 2.0, chapters 9.5 and 9.6; the classes of
/// HID: Device Class Definition for Human Interface Devices 1.11, chapter 4).
///
/// Never reads beyond the bytes. Not understood is everything that contradicts itself: lengths that
/// do not add up, another number of configurations or of interfaces than is announced, interfaces
/// outside of a configuration, a device without any interface.
[[nodiscard]] UsbFunctions readDescriptors(std::span<const std::uint8_t> bytes);

/// A number for the bytes that does not depend on the run or the machine (64-bit FNV-1a).
[[nodiscard]] std::uint64_t hashOfDescriptors(std::span<const std::uint8_t> bytes);

} // namespace keystrand::usb
