#include "tests/neighbours/UsbFiles.h"

#include "base/Concat.h"
#include "base/UnixAddress.h"
#include "tests/neighbours/Random.h"

#include <fstream>
#include <iterator>
#include <sys/socket.h>
#include <sys/stat.h>
#include <utility>

namespace neighbours {

namespace {

namespace fs = std::filesystem;

constexpr std::uint8_t kHumanInput = 3;
constexpr std::uint8_t kMassStorage = 8;

void put(const fs::path& path, std::string_view text) {
    std::ofstream(path, std::ios::binary)
        .write(text.data(), static_cast<std::streamsize>(text.size()));
}

/// Of a device with one interface and no endpoints.
std::string descriptors(std::uint8_t interfaceClass) {
    const Bytes bytes = {
        18, 1, 0, 2, 0,    0,  0, 64, 0x11, 0x11, 0x22, 0x22,           0, 1, 0, 0, 0, 1, 9, 2, 18,
        0,  1, 1, 0, 0x80, 50, 9, 4,  0,    0,    0,    interfaceClass, 0, 0, 0};
    return {bytes.begin(), bytes.end()};
}

} // namespace

UsbFiles::UsbFiles(fs::path root)
    : root_(std::move(root)), events_(::socket(AF_UNIX, SOCK_DGRAM | SOCK_CLOEXEC, 0)) {
    const fs::path parameters = root_ / "sys/module/usbcore/parameters";
    for (const fs::path& directory : {parameters, devices(), rootHub(), root_ / "dev/block"}) {
        fs::create_directories(directory);
    }
    put(parameters / "authorized_default", "-1\n");
    put(rootHub() / "authorized_default", "1\n");
    fs::create_directory_symlink("../../../devices/pci1/usb1", devices() / "usb1");
    plug("1-1", kHumanInput, true);
    plug("1-2", kMassStorage, false);
}

void UsbFiles::plugDisk() {
    // The directory of a device that went is empty for whoever still has it open.
    fs::remove(devices() / "1-2");
    fs::remove_all(rootHub() / "1-2");
    tell("remove", "1-2");
    plug("1-2", kMassStorage, !arePortsClosed());
    tell("add", "1-2");
}

void UsbFiles::plug(const std::string& port, std::uint8_t interfaceClass, bool isAccepted) {
    const fs::path directory = rootHub() / port;
    fs::create_directory(directory);
    put(directory / "devnum", base::concat(++lastNumber_, '\n'));
    put(directory / "idVendor", "1111\n");
    put(directory / "idProduct", "2222\n");
    put(directory / "product", "a device\n");
    put(directory / "descriptors", descriptors(interfaceClass));
    put(directory / "authorized", isAccepted ? "1\n" : "0\n");
    fs::create_directory_symlink("../../../devices/pci1/usb1/" + port, devices() / port);
}

void UsbFiles::tell(const char* action, const std::string& port) const {
    const std::string place = "/devices/pci1/usb1/" + port;
    std::string message = base::concat(action, '@', place);
    for (const std::string& field :
         {base::concat("ACTION=", action), base::concat("DEVPATH=", place),
          std::string("SUBSYSTEM=usb"), std::string("DEVTYPE=usb_device")}) {
        message += '\0';
        message += field;
    }
    const auto address =
        base::UnixAddress::of((root_ / "run/keystrand/kernel-events.sock").string()).value();
    require(::sendto(events_.get(), message.data(), message.size(), MSG_NOSIGNAL, address.get(),
                     address.size()) >= 0,
            "nobody listens to the kernel");
}

std::string UsbFiles::attribute(const std::string& path) const {
    std::ifstream file(path);
    std::string text{std::istreambuf_iterator<char>(file), {}};
    if (text.ends_with('\n')) {
        text.pop_back();
    }
    return text;
}

bool UsbFiles::arePortsClosed() const {
    return attribute(rootHub() / "authorized_default") != "1";
}

bool UsbFiles::isMouseIn() const {
    return attribute(rootHub() / "1-1/authorized") == "1";
}

bool UsbFiles::isDiskIn() const {
    return attribute(rootHub() / "1-2/authorized") == "1";
}

std::string UsbFiles::acceptRequest(const std::string& port) const {
    const fs::path directory = rootHub() / port;
    struct stat status {};
    static_cast<void>(::stat(directory.c_str(), &status));
    return base::concat("accept ", port, ' ', attribute(directory / "devnum"), ' ',
                        std::to_string(status.st_ino), '\n');
}

} // namespace neighbours
