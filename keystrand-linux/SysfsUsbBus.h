#pragma once

#include "keystrand-linux/DevicesInUse.h"
#include "keystrand-linux/GateLog.h"
#include "keystrand-linux/SmallFile.h"
#include "keystrand-linux/UsbBus.h"
#include "keystrand-linux/UsbEvents.h"

#include <chrono>
#include <cstddef>
#include <functional>
#include <map>
#include <optional>
#include <string>
#include <string_view>

namespace keystrand::usb {

/// The machine's USB as sysfs shows it under a root directory.
///
/// A device is always the one that was seen: its directory is opened, held against what was seen,
/// and only then is something in it written; the directory of a device that went stays empty, even
/// when another one is at its port already. `inUse` is what DevicesInUse says.
///
/// What a device says about itself is read once: it does not change as long as the device is there.
/// While the kernel sets a device up, or one behind a hub, it has whoever reads that wait: nobody
/// waits longer than kPatience for a device, nor longer than kPatienceWithAll in one look.
///
/// A sysfs that cannot be written is one that cannot be guarded: `look` says so.
class SysfsUsbBus : public UsbBus {
  public:
    static constexpr std::chrono::milliseconds kPatience{50};
    static constexpr std::chrono::milliseconds kPatienceWithAll{500};

    /// Where a test puts something of its own.
    struct System {
        /// Writes an attribute in an open directory; the error's number, or 0.
        std::function<int(int directory, const char* attribute, std::string_view text)> write =
            writeAttribute;
        /// Reads what a device says, as `readSmallFileUntil` does.
        std::function<SmallFile(int directory, const char* attribute, std::size_t limit,
                                ReadDeadline until)>
            read = readSmallFileUntil;
        OpenDiskAlone openAlone = openDiskAlone;
        std::function<base::FileDescriptor(std::string& problem)> openEvents = openKernelEvents;
    };

    /// The loop and the log outlive it.
    SysfsUsbBus(EventLoop& loop, std::string root, GateLog& log, System system);

    [[nodiscard]] std::optional<BusView> look(std::string& problem) override;
    [[nodiscard]] std::optional<BusView> glance(std::string& problem) override;
    [[nodiscard]] GateOutcome setParameter(AuthorizedDefault value) override;
    [[nodiscard]] GateOutcome setRootHub(const RootHub& hub, AuthorizedDefault value) override;
    [[nodiscard]] GateOutcome accept(const UsbDevice& device) override;
    [[nodiscard]] GateOutcome refuse(const UsbDevice& device) override;

    /// Where events cannot be heard, a line says so; then only what the gate itself does, and what
    /// time it is, leads to a look.
    void watch(Changed changed) override;

  private:
    [[nodiscard]] int readNames(std::vector<std::string>& names, std::string& problem) const;
    [[nodiscard]] std::optional<RootHub> readRootHub(const std::string& name) const;
    [[nodiscard]] std::optional<UsbDevice> readDevice(const std::string& name) const;
    [[nodiscard]] bool readWhatItSays(UsbDevice& device, ReadDeadline until) const;
    [[nodiscard]] GateOutcome writeDefault(int directory, AuthorizedDefault value) const;
    [[nodiscard]] GateOutcome writeDevice(const base::FileDescriptor& directory,
                                          bool authorized) const;
    [[nodiscard]] base::FileDescriptor openSeen(const Attachment& attachment) const;
    [[nodiscard]] std::string directoryOf(const std::string& name) const;

    EventLoop& loop_;
    std::string root_;
    std::string devices_;
    std::string parameters_;
    GateLog& log_;
    System system_;
    std::optional<UsbEvents> events_;
    /// What the devices said when they were looked at last: they say it once.
    std::map<Attachment, UsbDevice> said_;
};

} // namespace keystrand::usb
