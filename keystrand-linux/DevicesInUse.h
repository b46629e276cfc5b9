#pragma once

#include "base/FileDescriptor.h"

#include <functional>
#include <string>
#include <string_view>
#include <sys/types.h>
#include <vector>

namespace keystrand::usb {

/// Opens the disk with that number at that path so that nobody else can mount or claim it, or a
/// part of it, for as long as the descriptor is open. Not open, with errno set, when it cannot.
using OpenDiskAlone = std::function<base::FileDescriptor(const std::string& node, dev_t number)>;
[[nodiscard]] base::FileDescriptor openDiskAlone(const std::string& node, dev_t number);

/// Whether the machine works with a USB device, or with something behind it. What it does not work
/// with stays unused for as long as the object exists: its disks are held open.
///
/// In use are a disk of which a whole node cannot be opened alone, because it, a partition of it,
/// or what is built on it is mounted or claimed; an interface that a program has taken through
/// usbfs; a network interface that is up. Where that cannot be told, the device counts as in use:
/// taking away what the machine runs from is worse than leaving a device that a line tells of.
class DevicesInUse {
  public:
    /// Looks below the device's directory in sysfs, and for its disks under `root`/dev.
    DevicesInUse(std::string root, const std::string& directory, const OpenDiskAlone& openAlone);

    /// What uses it, for people; empty when nothing does.
    [[nodiscard]] const std::string& user() const { return user_; }

  private:
    void lookBelow(const std::string& directory, const OpenDiskAlone& openAlone);
    void lookAtDisk(const std::string& directory, const std::string& name,
                    const OpenDiskAlone& openAlone);
    void lookAtNetwork(const std::string& directory, const std::string& name);
    void lookAtInterface(const std::string& directory, const std::string& name);

    std::string root_;
    std::string user_;
    std::vector<base::FileDescriptor> held_;
};

} // namespace keystrand::usb
