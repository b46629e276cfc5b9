#pragma once

#include "base/NotCopied.h"
#include "keystrand-linux/GatePolicy.h"
#include "keystrand-linux/UsbDevice.h"

#include <functional>
#include <optional>
#include <string>

namespace keystrand::usb {

/// The machine's USB, as the gate sees it. Everything happens on the thread of the loop.
class UsbBus : private base::NotCopied {
  public:
    virtual ~UsbBus() = default;

    /// What is there now; none, with the reason for people in `problem`, where it cannot be read or
    /// nothing could be written. A machine without USB has a view that says so, and a reason, too.
    /// A device that goes while it is read is not in it; one whose descriptors cannot be read is,
    /// with nothing understood. What a device says is waited for only shortly: one that hangs, or
    /// one that hangs behind a hub, has then not said all.
    [[nodiscard]] virtual std::optional<BusView> look(std::string& problem) = 0;
    /// The same, but nothing of what a device says about itself: of each its attachment and whether
    /// it is in. Never waits.
    [[nodiscard]] virtual std::optional<BusView> glance(std::string& problem) = 0;

    /// Writes, and reads back what is there then, whether the write failed or not.
    [[nodiscard]] virtual GateOutcome setParameter(AuthorizedDefault value) = 0;
    [[nodiscard]] virtual GateOutcome setRootHub(const RootHub& hub, AuthorizedDefault value) = 0;

    /// The device that was seen, never another one at its port: `vanished` when it is not there any
    /// more.
    [[nodiscard]] virtual GateOutcome accept(const UsbDevice& device) = 0;
    /// The same. `inUse`, with nothing written and what uses it as the reason, while the machine
    /// works with the device or with something behind it: a disk that is open for itself somewhere
    /// (it is held open until the device is refused, so that nobody mounts it in between), an
    /// interface that a program has taken, a network interface that is up.
    [[nodiscard]] virtual GateOutcome refuse(const UsbDevice& device) = 0;

    /// Calls `changed` after each device or root hub that came or went, and after events were lost.
    /// Null ends that, and then nothing wakes the process.
    using Changed = std::function<void()>;
    virtual void watch(Changed changed) = 0;
};

} // namespace keystrand::usb
