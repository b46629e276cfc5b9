#include "keystrand-linux/SysfsUsbBus.h"

#include "base/Concat.h"
#include "base/Digits.h"
#include "wire/SystemPaths.h"

#include <algorithm>
#include <cerrno>
#include <filesystem>
#include <sys/stat.h>
#include <unistd.h>
#include <utility>

namespace keystrand::usb {

namespace {

namespace fs = std::filesystem;
using Outcome = GateOutcome::Kind;

/// The device's descriptor and eight configurations of 65535 bytes are less.
constexpr std::size_t kDescriptorsLimit = std::size_t{1} << 20U;
/// Two hundred buses full of devices with four interfaces each have less.
constexpr std::size_t kMostNames = 131072;

constexpr char kAuthorizedDefault[] = "authorized_default";
constexpr char kAuthorized[] = "authorized";

bool isGone(int error) {
    return error == ENOENT || error == ENODEV;
}

bool isNumber(std::string_view text) {
    return !text.empty() && std::all_of(text.begin(), text.end(),
                                        [](char each) { return each >= '0' && each <= '9'; });
}

/// "usb1"
std::optional<std::uint32_t> busOfRootHub(std::string_view name) {
    return name.starts_with("usb") && isNumber(name.substr(3))
               ? base::parseNumber<std::uint32_t>(name.substr(3))
               : std::nullopt;
}

/// "1-2.3", not "1-2:1.0" or "1-0:1.0".
bool isPort(std::string_view name) {
    const std::size_t dash = name.find('-');
    if (dash == std::string_view::npos || !isNumber(name.substr(0, dash))) {
        return false;
    }
    for (name.remove_prefix(dash + 1);;) {
        const std::size_t point = std::min(name.find('.'), name.size());
        if (!isNumber(name.substr(0, point))) {
            return false;
        }
        if (point == name.size()) {
            return true;
        }
        name.remove_prefix(point + 1);
    }
}

std::string withoutNewline(std::string text) {
    if (text.ends_with('\n')) {
        text.pop_back();
    }
    return text;
}

/// The text of an attribute; none when it is not there.
std::optional<std::string> attribute(int directory, const char* name) {
    SmallFile file = readSmallFile(directory, name, kAttributeLimit);
    return file.isRead() ? std::optional(withoutNewline(std::move(file.bytes))) : std::nullopt;
}

template <typename Number>
std::optional<Number> numberAttribute(int directory, const char* name) {
    const auto text = attribute(directory, name);
    return text ? base::parseNumber<Number>(trimmed(*text)) : std::nullopt;
}

std::uint16_t identifier(int directory, const char* name) {
    constexpr std::size_t kDigits = 4;
    const std::string text = attribute(directory, name).value_or("");
    unsigned value = 0;
    for (const char digit : std::string_view(text).substr(0, kDigits)) {
        value = value << 4U | base::hexDigitValue(digit).value_or(0);
    }
    return static_cast<std::uint16_t>(value);
}

std::uint64_t inodeOf(int directory) {
    struct stat status {};
    return ::fstat(directory, &status) == 0 ? status.st_ino : 0;
}

/// Whether the directory is that of the device that was seen.
bool isSeen(int directory, const Attachment& attachment) {
    return inodeOf(directory) == attachment.inode &&
           numberAttribute<std::uint32_t>(directory, "devnum") == attachment.number;
}

/// Where the root hub's controller is, below the directory of all devices.
std::string controllerOf(const std::string& rootHub, const std::string& root) {
    std::error_code error;
    const fs::path controller = fs::canonical(rootHub, error).parent_path();
    const fs::path all = fs::canonical(wire::underRoot(root, "/sys/devices"), error);
    const fs::path below = controller.lexically_relative(all);
    return below.empty() || *below.begin() == ".." ? controller.string() : below.string();
}

GateOutcome failed(int error) {
    // What cannot be read is not known to be closed.
    return isGone(error) ? GateOutcome{.kind = Outcome::vanished}
                         : GateOutcome{.kind = Outcome::failed,
                                       .readBack = kEverybody,
                                       .reason = errorText(error)};
}

} // namespace

SysfsUsbBus::SysfsUsbBus(EventLoop& loop, std::string root, GateLog& log, System system)
    : loop_(loop),
      root_(std::move(root)),
      devices_(wire::underRoot(root_, "/sys/bus/usb/devices")),
      parameters_(wire::underRoot(root_, "/sys/module/usbcore/parameters")),
      log_(log),
      system_(std::move(system)) {}

std::optional<BusView> SysfsUsbBus::look(std::string& problem) {
    auto view = glance(problem);
    if (view) {
        const ReadDeadline until = std::chrono::steady_clock::now() + kPatienceWithAll;
        // One that goes while it is read is not there any more.
        std::erase_if(view->devices,
                      [&](UsbDevice& device) { return !readWhatItSays(device, until); });
        said_.clear();
        for (const UsbDevice& device : view->devices) {
            if (device.functions.understood && device.saidAll) {
                said_.emplace(device.attachment, device);
            }
        }
    }
    return view;
}

std::optional<BusView> SysfsUsbBus::glance(std::string& problem) {
    problem.clear();
    std::vector<std::string> names;
    const int error = readNames(names, problem);
    const base::FileDescriptor parameters = openDirectory(parameters_);
    const bool hasParameter =
        ::faccessat(parameters.get(), kAuthorizedDefault, F_OK, AT_EACCESS) == 0;
    if (error == ENOENT && !hasParameter) {
        return BusView{.hasUsb = false, .rootHubs = {}, .devices = {}};
    }
    // The parameter is there before the directory of the devices is.
    if (error != 0 && error != ENOENT) {
        return std::nullopt;
    }
    problem.clear();
    const auto parameter = numberAttribute<AuthorizedDefault>(parameters.get(), kAuthorizedDefault);
    if (!parameter) {
        problem = base::concat(parameters_, '/', kAuthorizedDefault, ": cannot be read");
        return std::nullopt;
    }
    if (::faccessat(parameters.get(), kAuthorizedDefault, W_OK, AT_EACCESS) != 0) {
        problem = base::concat(parameters_, '/', kAuthorizedDefault,
                               ": cannot be written: ", errorText(errno));
        return std::nullopt;
    }
    BusView view{.parameter = *parameter, .rootHubs = {}, .devices = {}};
    for (const std::string& name : names) {
        if (auto hub = readRootHub(name)) {
            view.rootHubs.push_back(std::move(*hub));
        } else if (auto device = readDevice(name)) {
            view.devices.push_back(std::move(*device));
        }
    }
    for (UsbDevice& device : view.devices) {
        const auto hub =
            std::find_if(view.rootHubs.begin(), view.rootHubs.end(),
                         [&](const RootHub& each) { return each.bus == busOf(device.port()); });
        device.controller = hub == view.rootHubs.end() ? std::string() : hub->controller;
    }
    // Its hub went while this was read, and the device with it.
    std::erase_if(view.devices, [](const UsbDevice& device) { return device.controller.empty(); });
    return view;
}

/// The error's number, or 0. Sorted, so that a hub comes before what is behind it.
int SysfsUsbBus::readNames(std::vector<std::string>& names, std::string& problem) const {
    std::error_code error;
    for (fs::directory_iterator each(devices_, error); !error && each != fs::directory_iterator();
         each.increment(error)) {
        names.push_back(each->path().filename().string());
        if (names.size() > kMostNames) {
            problem = base::concat(devices_, ": more devices than can be looked at");
            return EFBIG;
        }
    }
    if (error) {
        problem = base::concat(devices_, ": ", errorText(error.value()));
        return error.value();
    }
    std::sort(names.begin(), names.end());
    return 0;
}

std::optional<RootHub> SysfsUsbBus::readRootHub(const std::string& name) const {
    const auto bus = busOfRootHub(name);
    const base::FileDescriptor directory =
        bus ? openDirectory(directoryOf(name)) : base::FileDescriptor();
    const SmallFile value = readSmallFile(directory.get(), kAuthorizedDefault, kAttributeLimit);
    if (!directory.isOpen() || isGone(value.error)) {
        return std::nullopt;
    }
    // One that says what nobody understands has to be closed like one that is open.
    return RootHub{
        .bus = *bus,
        .controller = controllerOf(directoryOf(name), root_),
        .inode = inodeOf(directory.get()),
        .authorizedDefault =
            base::parseNumber<AuthorizedDefault>(trimmed(value.bytes)).value_or(kEverybody)};
}

std::optional<UsbDevice> SysfsUsbBus::readDevice(const std::string& name) const {
    const base::FileDescriptor directory =
        isPort(name) ? openDirectory(directoryOf(name)) : base::FileDescriptor();
    if (!directory.isOpen()) {
        return std::nullopt;
    }
    const int fd = directory.get();
    const auto number = numberAttribute<std::uint32_t>(fd, "devnum");
    const auto authorized = numberAttribute<int>(fd, kAuthorized);
    if (!number || !authorized) {
        return std::nullopt;
    }
    return UsbDevice{.attachment = {.port = name, .number = *number, .inode = inodeOf(fd)},
                     .controller = {},
                     .manufacturer = {},
                     .name = {},
                     .serial = {},
                     .functions = {},
                     .authorized = *authorized != 0};
}

/// False when it is not the one that was seen any more.
bool SysfsUsbBus::readWhatItSays(UsbDevice& device, ReadDeadline until) const {
    if (const auto said = said_.find(device.attachment); said != said_.end()) {
        const bool authorized = device.authorized;
        device = said->second;
        device.authorized = authorized;
        return true;
    }
    const base::FileDescriptor directory = openDirectory(directoryOf(device.port()));
    const int fd = directory.get();
    const ReadDeadline ours = std::min(until, std::chrono::steady_clock::now() + kPatience);
    const auto readText = [&](const char* name, std::size_t limit) {
        SmallFile file = device.saidAll ? system_.read(fd, name, limit, ours) : SmallFile();
        device.saidAll = device.saidAll && file.error != ETIMEDOUT;
        return std::move(file.bytes);
    };
    const auto readLine = [&](const char* name) {
        return withoutNewline(readText(name, kAttributeLimit));
    };
    device.vendor = identifier(fd, "idVendor");
    device.product = identifier(fd, "idProduct");
    // What is decided by comes first: the kernel hardly ever holds it back.
    const std::string descriptors = readText("descriptors", kDescriptorsLimit);
    const std::span bytes(reinterpret_cast<const std::uint8_t*>(descriptors.data()),
                          descriptors.size());
    device.serial = readLine("serial");
    device.manufacturer = readLine("manufacturer");
    device.name = readLine("product");
    device.descriptorsHash = hashOfDescriptors(bytes);
    device.functions = readDescriptors(bytes);
    // What the kernel itself goes by. "removable" also says what the hub above says about its
    // ports, and that may be anybody's.
    device.hardWired = attribute(fd, "port/connect_type") == "hardwired";
    // Last, because it is gone with the device: what was read before was the device's.
    return isSeen(fd, device.attachment);
}

GateOutcome SysfsUsbBus::setParameter(AuthorizedDefault value) {
    const base::FileDescriptor directory = openDirectory(parameters_);
    GateOutcome outcome = directory.isOpen() ? writeDefault(directory.get(), value) : failed(errno);
    if (outcome.kind == Outcome::vanished) {
        // A device may go; the kernel's parameter only with all of USB.
        outcome = {.kind = Outcome::failed,
                   .readBack = kEverybody,
                   .reason = base::concat(parameters_, ": is not there")};
    }
    return outcome;
}

GateOutcome SysfsUsbBus::setRootHub(const RootHub& hub, AuthorizedDefault value) {
    const base::FileDescriptor directory = openDirectory(directoryOf(base::concat("usb", hub.bus)));
    if (!directory.isOpen()) {
        return failed(errno);
    }
    return inodeOf(directory.get()) == hub.inode ? writeDefault(directory.get(), value)
                                                 : GateOutcome{.kind = Outcome::vanished};
}

GateOutcome SysfsUsbBus::writeDefault(int directory, AuthorizedDefault value) const {
    const int error = system_.write(directory, kAuthorizedDefault, std::to_string(value));
    const SmallFile file = readSmallFile(directory, kAuthorizedDefault, kAttributeLimit);
    const auto now = base::parseNumber<AuthorizedDefault>(trimmed(file.bytes));
    if (error != 0 || !file.isRead()) {
        GateOutcome outcome = failed(error != 0 ? error : file.error);
        outcome.readBack = now.value_or(outcome.readBack);
        return outcome;
    }
    return {.kind = Outcome::done, .readBack = now.value_or(kEverybody)};
}

GateOutcome SysfsUsbBus::accept(const UsbDevice& device) {
    return writeDevice(openSeen(device.attachment), true);
}

GateOutcome SysfsUsbBus::refuse(const UsbDevice& device) {
    const base::FileDescriptor directory = openSeen(device.attachment);
    if (!directory.isOpen()) {
        return failed(errno);
    }
    const DevicesInUse use(root_, directoryOf(device.port()), system_.openAlone);
    if (!use.user().empty()) {
        return {.kind = Outcome::inUse, .reason = use.user()};
    }
    return writeDevice(directory, false);
}

GateOutcome SysfsUsbBus::writeDevice(const base::FileDescriptor& directory, bool authorized) const {
    if (!directory.isOpen()) {
        return failed(errno);
    }
    const int error = system_.write(directory.get(), kAuthorized, authorized ? "1" : "0");
    if (error != 0) {
        return failed(error);
    }
    const SmallFile file = readSmallFile(directory.get(), kAuthorized, kAttributeLimit);
    if (!file.isRead()) {
        return failed(file.error);
    }
    const std::string_view now = trimmed(file.bytes);
    if (now != (authorized ? "1" : "0")) {
        return {.kind = Outcome::failed,
                .reason = base::concat("it reads ", now.empty() ? "nothing" : now, " afterwards")};
    }
    return {};
}

/// Not open, with ENODEV or the reason in errno, when it is not the one that was seen.
base::FileDescriptor SysfsUsbBus::openSeen(const Attachment& attachment) const {
    base::FileDescriptor directory = openDirectory(directoryOf(attachment.port));
    if (directory.isOpen() && !isSeen(directory.get(), attachment)) {
        directory.reset();
        errno = ENODEV;
    }
    return directory;
}

std::string SysfsUsbBus::directoryOf(const std::string& name) const {
    return base::concat(devices_, '/', name);
}

void SysfsUsbBus::watch(Changed changed) {
    events_.reset();
    if (!changed) {
        return;
    }
    const auto tell = [this](const std::string& reason) {
        log_.write(GateLine::cannotGuard,
                   base::concat("keystrand: what is plugged in is not noticed at once: ", reason));
    };
    std::string problem;
    base::FileDescriptor socket = system_.openEvents(problem);
    if (!socket.isOpen()) {
        tell(problem);
        return;
    }
    events_.emplace(loop_, std::move(socket),
                    UsbEvents::Handlers{.changed = std::move(changed), .ended = tell});
    if (!events_->isHeard()) {
        events_.reset();
        tell("the loop cannot wait for the kernel's events");
    }
}

} // namespace keystrand::usb
