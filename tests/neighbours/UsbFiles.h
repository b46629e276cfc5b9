#pragma once

#include "base/FileDescriptor.h"

#include <cstdint>
#include <filesystem>
#include <string>

namespace neighbours {

/// A machine's USB as files under a root directory, with somebody in the place of the kernel who
/// tells of what is plugged in: one bus, a mouse that was there from the start, a disk.
class UsbFiles {
  public:
    explicit UsbFiles(std::filesystem::path root);

    /// Takes the disk out, if it was in, and plugs it in again: accepted where that is the bus's
    /// default. Tells whoever listens.
    void plugDisk();

    [[nodiscard]] bool arePortsClosed() const;
    [[nodiscard]] bool isMouseIn() const;
    [[nodiscard]] bool isDiskIn() const;

    /// The request by which an administrator lets it in.
    [[nodiscard]] std::string acceptMouse() const { return acceptRequest("1-1"); }
    [[nodiscard]] std::string acceptDisk() const { return acceptRequest("1-2"); }

  private:
    void plug(const std::string& port, std::uint8_t interfaceClass, bool isAccepted);
    void tell(const char* action, const std::string& port) const;
    [[nodiscard]] std::string attribute(const std::string& path) const;
    [[nodiscard]] std::string acceptRequest(const std::string& port) const;
    [[nodiscard]] std::filesystem::path devices() const { return root_ / "sys/bus/usb/devices"; }
    [[nodiscard]] std::filesystem::path rootHub() const { return root_ / "sys/devices/pci1/usb1"; }

    std::filesystem::path root_;
    base::FileDescriptor events_;
    unsigned lastNumber_ = 1;
};

} // namespace neighbours
