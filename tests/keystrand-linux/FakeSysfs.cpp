#include "tests/keystrand-linux/FakeSysfs.h"

#include "base/Concat.h"
#include "base/Digits.h"

#include <algorithm>
#include <cerrno>
#include <fcntl.h>
#include <fstream>
#include <stdexcept>
#include <sys/socket.h>
#include <sys/stat.h>
#include <unistd.h>
#include <utility>

namespace keystrand::usb {

namespace {

namespace fs = std::filesystem;

void put(const fs::path& path, std::string_view text) {
    // Not truncated and written anew: whoever reads meanwhile sees the one or the other.
    const fs::path next = path.string() + ".new";
    std::ofstream(next, std::ios::binary)
        .write(text.data(), static_cast<std::streamsize>(text.size()));
    fs::rename(next, path);
}

void putLine(const fs::path& path, std::string_view text) {
    put(path, base::concat(text, '\n'));
}

std::string hexOf(std::uint16_t number) {
    const std::uint8_t bytes[] = {static_cast<std::uint8_t>(number >> 8U),
                                  static_cast<std::uint8_t>(number)};
    return base::hexDigits(bytes);
}

std::uint64_t inodeOf(const fs::path& path) {
    struct stat status {};
    return ::stat(path.c_str(), &status) == 0 ? status.st_ino : 0;
}

std::string hubAbove(const std::string& port) {
    const std::size_t point = port.rfind('.');
    return point == std::string::npos ? base::concat("usb", busOf(port)) : port.substr(0, point);
}

/// Where a hub's directory holds the port.
fs::path portOf(const std::string& port) {
    const std::string hub = hubAbove(port);
    const std::string interface =
        hub.starts_with("usb") ? base::concat(busOf(port), "-0:1.0") : hub + ":1.0";
    return fs::path(interface) /
           base::concat(hub, "-port", port.substr(port.find_last_of("-.") + 1));
}

} // namespace

FakeSysfs::FakeSysfs(fs::path root) : root_(std::move(root)) {
    fs::create_directories(devices());
    fs::create_directories(parameter().parent_path());
    fs::create_directories(root_ / "sys/devices");
    fs::create_directories(root_ / "dev/block");
    fs::create_directories(root_ / "buried");
    machine_.watch([this] { show(); });
    show();
}

fs::path FakeSysfs::parameter() const {
    return root_ / "sys/module/usbcore/parameters/authorized_default";
}

fs::path FakeSysfs::directoryOf(const std::string& name) const {
    return root_ / "sys/devices" / places_.at(name);
}

void FakeSysfs::show() {
    if (std::exchange(hidden_, machine_.isMissing()) != hidden_) {
        // The kernel has neither the bus nor the module's parameters then.
        const fs::path places[] = {devices().parent_path(), parameter().parent_path()};
        for (const fs::path& place : places) {
            const fs::path away = root_ / base::concat("no-", place.filename().string());
            hidden_ ? fs::rename(place, away) : fs::rename(away, place);
        }
    }
    if (hidden_) {
        return;
    }
    view_ = machine_.present();
    std::map<std::string, std::uint64_t> present;
    for (const RootHub& hub : view_.rootHubs) {
        present[base::concat("usb", hub.bus)] = hub.inode;
    }
    for (const UsbDevice& device : view_.devices) {
        present[device.port()] = device.attachment.inode;
    }
    // What is behind a hub goes before the hub.
    const auto shown = shown_;
    for (auto each = shown.rbegin(); each != shown.rend(); ++each) {
        if (const auto found = present.find(each->first);
            found == present.end() || found->second != each->second) {
            bury(each->first);
        }
    }
    putLine(parameter(), std::to_string(view_.parameter));
    for (const RootHub& hub : view_.rootHubs) {
        const std::string name = base::concat("usb", hub.bus);
        if (shown_.emplace(name, hub.inode).second) {
            add(name, hub.controller);
        }
        putLine(directoryOf(name) / "authorized_default", std::to_string(hub.authorizedDefault));
    }
    for (const UsbDevice& device : view_.devices) {
        if (shown_.emplace(device.port(), device.attachment.inode).second) {
            addDevice(device);
        }
        putLine(directoryOf(device.port()) / "authorized", device.authorized ? "1" : "0");
        showInterface(device);
    }
}

void FakeSysfs::add(const std::string& name, const std::string& controller) {
    const std::string above = name.starts_with("usb") ? controller : places_.at(hubAbove(name));
    places_[name] = base::concat(above, '/', name);
    fs::create_directories(directoryOf(name));
    fs::create_directory_symlink("../../../devices/" + places_.at(name), devices() / name);
    tell("add", name);
}

void FakeSysfs::addDevice(const UsbDevice& device) {
    add(device.port(), {});
    const fs::path directory = directoryOf(device.port());
    putLine(directory / "devnum", std::to_string(device.attachment.number));
    putLine(directory / "idVendor", hexOf(device.vendor));
    putLine(directory / "idProduct", hexOf(device.product));
    // A hub may call its ports what it likes; only the firmware's word is in "connect_type".
    putLine(directory / "removable", "fixed");
    const fs::path port = portOf(device.port());
    fs::create_directories(directory.parent_path() / port);
    putLine(directory.parent_path() / port / "connect_type",
            device.hardWired ? "hardwired" : "unknown");
    fs::create_directory_symlink(".." / port, directory / "port");
    putLine(directory / "manufacturer", device.manufacturer);
    putLine(directory / "product", device.name);
    if (!device.serial.empty()) {
        putLine(directory / "serial", device.serial);
    }
    const auto bytes = machine_.descriptorsAt(device.port());
    put(directory / "descriptors", {reinterpret_cast<const char*>(bytes.data()), bytes.size()});
}

/// A device has its interfaces only while it is accepted.
void FakeSysfs::showInterface(const UsbDevice& device) {
    const std::string name = device.port() + ":1.0";
    const fs::path directory = directoryOf(device.port()) / name;
    if (device.authorized && !fs::exists(directory)) {
        fs::create_directory(directory);
        fs::create_directory_symlink(
            base::concat("../../../devices/", places_.at(device.port()), '/', name),
            devices() / name);
    } else if (!device.authorized && fs::exists(directory)) {
        fs::remove_all(directory);
        fs::remove(devices() / name);
    }
}

void FakeSysfs::bury(const std::string& name) {
    const fs::path grave = root_ / "buried" / std::to_string(++buried_);
    fs::remove(devices() / name);
    fs::remove(devices() / (name + ":1.0"));
    fs::rename(directoryOf(name), grave);
    for (const fs::directory_entry& each : fs::directory_iterator(grave)) {
        fs::remove_all(each.path());
    }
    shown_.erase(name);
    used_.erase(name);
    tell("remove", name);
}

void FakeSysfs::tell(std::string_view action, const std::string& name) {
    std::string message = base::concat(action, "@/devices/", places_.at(name));
    for (const std::string& field :
         {base::concat("ACTION=", action), base::concat("DEVPATH=/devices/", places_.at(name)),
          std::string("SUBSYSTEM=usb"), std::string("DEVTYPE=usb_device")}) {
        message += '\0';
        message += field;
    }
    send(message);
}

void FakeSysfs::send(std::string_view message) {
    static_cast<void>(::send(events_.get(), message.data(), message.size(), MSG_NOSIGNAL));
}

bool FakeSysfs::isHeard() {
    return events_.isOpen() && (::send(events_.get(), "?", 1, MSG_NOSIGNAL) == 1);
}

SysfsUsbBus::System FakeSysfs::system() {
    return {.write = [this](int directory, const char* attribute,
                            std::string_view text) { return write(directory, attribute, text); },
            .openAlone = [this](const std::string& node, dev_t) { return openDiskAlone(node); },
            .openEvents =
                [this](std::string& problem) {
                    int ends[2] = {-1, -1};
                    if (::socketpair(AF_UNIX, SOCK_DGRAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0, ends) !=
                        0) {
                        problem = "no pair of sockets";
                    }
                    events_ = base::FileDescriptor(ends[0]);
                    return base::FileDescriptor(ends[1]);
                }};
}

int FakeSysfs::write(int directory, const char* attribute, std::string_view text) {
    if (failure_ != 0) {
        return failure_;
    }
    const auto value = base::parseNumber<int>(text);
    if (!value) {
        return EINVAL;
    }
    struct stat status {};
    static_cast<void>(::fstat(directory, &status));
    const GateOutcome outcome = carryOut(status.st_ino, *value);
    if (outcome.kind == GateOutcome::Kind::failed) {
        return EIO;
    }
    const int error = writeAttribute(directory, attribute, text);
    show();
    return error;
}

GateOutcome FakeSysfs::carryOut(std::uint64_t inode, int value) {
    const int counted = value > kHardWiredOnly ? kEverybody : value;
    if (inode == inodeOf(parameter().parent_path())) {
        return machine_.setParameter(counted);
    }
    const BusView view = view_;
    for (const RootHub& hub : view.rootHubs) {
        if (inode == inodeOf(directoryOf(base::concat("usb", hub.bus)))) {
            return machine_.setRootHub(hub, counted);
        }
    }
    for (const UsbDevice& device : view.devices) {
        if (inode == inodeOf(directoryOf(device.port()))) {
            return value != 0 ? machine_.accept(device) : machine_.refuse(device);
        }
    }
    return {.kind = GateOutcome::Kind::vanished};
}

void FakeSysfs::addDisk(const std::string& port, const std::string& name) {
    const fs::path disk =
        directoryOf(port) / (port + ":1.0") / "host0/target0:0:0/0:0:0:0/block" / name;
    fs::create_directories(disk);
    putLine(disk / "dev", "8:16");
    put(root_ / "dev" / name, "");
}

void FakeSysfs::mountDisk(const std::string& port) {
    addDisk(port, "sdb");
    used_[port] = (root_ / "dev/sdb").string();
}

void FakeSysfs::takeInterface(const std::string& port) {
    fs::create_directory_symlink("../../bus/usb/drivers/usbfs",
                                 directoryOf(port) / (port + ":1.0") / "driver");
}

void FakeSysfs::bringNetworkUp(const std::string& port) {
    const fs::path network = directoryOf(port) / (port + ":1.0") / "net/usb0";
    fs::create_directories(network);
    putLine(network / "flags", "0x1003");
}

base::FileDescriptor FakeSysfs::openDiskAlone(const std::string& node) {
    for (const auto& [port, used] : used_) {
        if (used == node) {
            errno = EBUSY;
            return {};
        }
    }
    base::FileDescriptor fd(::open(node.c_str(), O_RDONLY | O_CLOEXEC));
    held_.push_back(fd.get());
    return fd;
}

std::size_t FakeSysfs::disksHeld() const {
    return static_cast<std::size_t>(std::count_if(
        held_.begin(), held_.end(), [](int fd) { return ::fcntl(fd, F_GETFD) >= 0; }));
}

} // namespace keystrand::usb
