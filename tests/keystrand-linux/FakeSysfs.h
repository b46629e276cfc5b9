#pragma once

#include "base/FileDescriptor.h"
#include "keystrand-linux/SysfsUsbBus.h"
#include "tests/keystrand-linux/FakeUsbBus.h"

#include <cstdint>
#include <filesystem>
#include <map>
#include <string>
#include <string_view>

namespace keystrand::usb {

/// A directory that looks like sysfs, and a small kernel behind it: what the machine does is shown
/// in the directory, with events, and what is written there is carried out by the machine. Like the
/// kernel's, the directory of a device that went is empty for whoever still has it open, and its
/// inode does not come back.
class FakeSysfs {
  public:
    explicit FakeSysfs(std::filesystem::path root);

    /// Where devices come and go. Whatever it tells of is shown at once.
    [[nodiscard]] FakeUsbBus& machine() { return machine_; }
    /// Shows what the machine did without telling.
    void show();

    /// To write and to hear through this kernel. Disks that are in use cannot be opened alone.
    [[nodiscard]] SysfsUsbBus::System system();

    /// The machine works with a disk, an interface or a network interface of what is shown there.
    void mountDisk(const std::string& port);
    void takeInterface(const std::string& port);
    void bringNetworkUp(const std::string& port);
    /// A disk that nobody uses.
    void addDisk(const std::string& port, const std::string& name);

    /// Each write fails like that, and does nothing; 0 ends it.
    void failWrites(int error) { failure_ = error; }
    /// As the kernel sends it; lost when nobody listens.
    void send(std::string_view message);
    [[nodiscard]] bool isHeard();

    [[nodiscard]] std::filesystem::path directoryOf(const std::string& name) const;
    [[nodiscard]] std::filesystem::path devices() const { return root_ / "sys/bus/usb/devices"; }
    [[nodiscard]] std::filesystem::path parameter() const;
    /// Nodes that are held open alone now.
    [[nodiscard]] std::size_t disksHeld() const;

  private:
    void bury(const std::string& name);
    void add(const std::string& name, const std::string& controller);
    void addDevice(const UsbDevice& device);
    void showInterface(const UsbDevice& device);
    void tell(std::string_view action, const std::string& name);
    [[nodiscard]] int write(int directory, const char* attribute, std::string_view text);
    [[nodiscard]] GateOutcome carryOut(std::uint64_t inode, int value);
    [[nodiscard]] base::FileDescriptor openDiskAlone(const std::string& node);

    std::filesystem::path root_;
    FakeUsbBus machine_;
    /// What is shown now.
    BusView view_;
    bool hidden_ = false;
    /// What the directories stand for: "usb1", "1-2.3", and the inode that the machine gives.
    std::map<std::string, std::uint64_t> shown_;
    std::map<std::string, std::string> places_;
    std::map<std::string, std::string> used_;
    std::vector<int> held_;
    unsigned buried_ = 0;
    int failure_ = 0;
    base::FileDescriptor events_;
};

} // namespace keystrand::usb
