#include "tests/keystrand-linux/FakeUsbBus.h"

#include "base/Concat.h"

#include <utility>

namespace keystrand::usb {

namespace {

constexpr UsbClass kBootKeyboard{3, 1, 1};
constexpr UsbClass kBootMouse{3, 1, 2};
constexpr UsbClass kMassStorage{8, 6, 0x50};
constexpr UsbClass kHub{9, 0, 0};

} // namespace

std::vector<std::uint8_t> descriptorsOf(std::span<const UsbClass> interfaces) {
    constexpr std::uint8_t kInterfaceLength = 9;
    const auto count = static_cast<std::uint8_t>(interfaces.size());
    const std::size_t total = 9 + interfaces.size() * kInterfaceLength;
    std::vector<std::uint8_t> bytes = {18,   1,    0,    2, 0, 0, 0, 64, 0x11,
                                       0x11, 0x22, 0x22, 0, 1, 1, 2, 3,  1};
    bytes.insert(bytes.end(), {9, 2, static_cast<std::uint8_t>(total),
                               static_cast<std::uint8_t>(total >> 8U), count, 1, 0, 0x80, 50});
    std::uint8_t number = 0;
    for (const UsbClass& is : interfaces) {
        bytes.insert(bytes.end(),
                     {kInterfaceLength, 4, number++, 0, 0, is.number, is.subclass, is.protocol, 0});
    }
    return bytes;
}

Plug aKeyboard() {
    return {.name = "keyboard",
            .descriptors = descriptorsOf(std::vector<UsbClass>{kBootKeyboard, {3, 0, 0}})};
}

Plug aMouse() {
    return {.name = "mouse", .descriptors = descriptorsOf(std::vector{kBootMouse})};
}

Plug aDisk() {
    return {.name = "disk", .descriptors = descriptorsOf(std::vector{kMassStorage})};
}

Plug aHub() {
    return {.name = "hub", .descriptors = descriptorsOf(std::vector{kHub})};
}

Plug aKeyboardWithDisk() {
    return {.name = "both", .descriptors = descriptorsOf(std::vector{kBootKeyboard, kMassStorage})};
}

void FakeUsbBus::addRootHub(std::uint32_t bus, const std::string& controller) {
    rootHubs_[bus] = {
        .bus = bus,
        .controller = controller.empty() ? base::concat("pci", std::to_string(bus)) : controller,
        .inode = ++lastInode_,
        .authorizedDefault = parameter_ == kAsTheControllerHasIt ? kEverybody : parameter_};
    tell();
}

void FakeUsbBus::removeRootHub(std::uint32_t bus) {
    rootHubs_.erase(bus);
    for (const auto& [port, what] : std::map(plugs_)) {
        if (busOf(port) == bus) {
            plugs_.erase(port);
            seen_.erase(port);
        }
    }
    tell();
}

void FakeUsbBus::plug(const std::string& port, const Plug& what) {
    plugs_[port] = what;
    appear(port);
    tell();
}

void FakeUsbBus::plugUnseen(const std::string& port, const Plug& what) {
    plugs_[port] = what;
    unseen_[port] = letsIn(port);
}

void FakeUsbBus::show(const std::string& port) {
    appear(port);
    tell();
}

void FakeUsbBus::unplug(const std::string& port) {
    for (const auto& [at, what] : std::map(plugs_)) {
        if (at == port || isBehind(at, port)) {
            plugs_.erase(at);
            seen_.erase(at);
            unseen_.erase(at);
        }
    }
    tell();
}

void FakeUsbBus::replug(const std::string& port) {
    const Plug what = plugs_.at(port);
    unplug(port);
    plug(port, what);
}

void FakeUsbBus::setAuthorized(const std::string& port, bool authorized) {
    seen_.at(port).authorized = authorized;
    if (authorized) {
        becomeAuthorized(port);
    } else {
        disappear(port);
    }
}

void FakeUsbBus::setRootHubDefault(std::uint32_t bus, AuthorizedDefault value) {
    rootHubs_.at(bus).authorizedDefault = value;
}

bool FakeUsbBus::isAuthorized(const std::string& port) const {
    const auto found = seen_.find(port);
    return found != seen_.end() && found->second.authorized;
}

Attachment FakeUsbBus::attachmentAt(const std::string& port) const {
    return seen_.at(port).attachment;
}

AuthorizedDefault FakeUsbBus::rootHubDefault(std::uint32_t bus) const {
    return rootHubs_.at(bus).authorizedDefault;
}

void FakeUsbBus::setMissing(bool missing) {
    missing_ = missing;
    if (missing) {
        parameter_ = kAsTheControllerHasIt;
    }
}

std::optional<BusView> FakeUsbBus::look(std::string& problem) {
    auto view = glance(problem);
    if (view && hanging_ && !view->devices.empty()) {
        hanging_();
    }
    if (view && view->hasUsb) {
        *view = present();
        for (UsbDevice& device : view->devices) {
            if (busy_.contains(device.port())) {
                device.saidAll = false;
                device.manufacturer.clear();
                device.name.clear();
                device.serial.clear();
            }
        }
    }
    return view;
}

std::optional<BusView> FakeUsbBus::glance(std::string& problem) {
    happen();
    problem.clear();
    if (unreadable_) {
        problem = "it cannot be read";
        return std::nullopt;
    }
    if (missing_) {
        problem = "no USB here";
        return BusView{.hasUsb = false, .rootHubs = {}, .devices = {}};
    }
    BusView view = present();
    for (UsbDevice& device : view.devices) {
        device = UsbDevice{.attachment = device.attachment,
                           .controller = device.controller,
                           .manufacturer = {},
                           .name = {},
                           .serial = {},
                           .functions = {},
                           .authorized = device.authorized};
    }
    return view;
}

BusView FakeUsbBus::present() const {
    BusView view{.parameter = parameter_, .rootHubs = {}, .devices = {}};
    for (const auto& [bus, hub] : rootHubs_) {
        view.rootHubs.push_back(hub);
    }
    // A port sorts behind the hub that it belongs to.
    for (const auto& [port, seen] : seen_) {
        const Plug& plug = plugs_.at(port);
        view.devices.push_back({.attachment = seen.attachment,
                                .controller = rootHubs_.at(busOf(port)).controller,
                                .vendor = plug.vendor,
                                .product = plug.product,
                                .manufacturer = "maker",
                                .name = plug.name,
                                .serial = plug.serial,
                                .descriptorsHash = hashOfDescriptors(plug.descriptors),
                                .functions = readDescriptors(plug.descriptors),
                                .authorized = seen.authorized,
                                .hardWired = plug.hardWired});
    }
    return view;
}

GateOutcome FakeUsbBus::setParameter(AuthorizedDefault value) {
    happen();
    writes_.push_back(base::concat("parameter=", std::to_string(value)));
    return writeDefault(parameter_, value);
}

GateOutcome FakeUsbBus::setRootHub(const RootHub& hub, AuthorizedDefault value) {
    happen();
    const auto found = rootHubs_.find(hub.bus);
    if (found == rootHubs_.end() || found->second.inode != hub.inode) {
        return {.kind = GateOutcome::Kind::vanished};
    }
    writes_.push_back(base::concat("usb", std::to_string(hub.bus), '=', std::to_string(value)));
    return writeDefault(found->second.authorizedDefault, value);
}

GateOutcome FakeUsbBus::writeDefault(AuthorizedDefault& at, AuthorizedDefault value) const {
    if (defaultsFail_) {
        return {.kind = GateOutcome::Kind::failed, .readBack = at, .reason = "Input/output error"};
    }
    at = defaultsAreIgnored_ ? at : read(value);
    return {.kind = GateOutcome::Kind::done, .readBack = at};
}

GateOutcome FakeUsbBus::accept(const UsbDevice& device) {
    return write(device, true);
}

GateOutcome FakeUsbBus::refuse(const UsbDevice& device) {
    if (isUsed(device.port())) {
        return {.kind = GateOutcome::Kind::inUse, .reason = "mounted"};
    }
    return write(device, false);
}

void FakeUsbBus::happen() {
    if (meanwhile_) {
        // What happens may look by itself.
        std::exchange(meanwhile_, nullptr)();
    }
}

void FakeUsbBus::tell() {
    // Whoever is told may end it.
    if (const Changed changed = changed_) {
        changed();
    }
}

void FakeUsbBus::appear(const std::string& port) {
    if (!hubAboveIsIn(port)) {
        return;
    }
    const std::uint32_t bus = busOf(port);
    constexpr std::uint32_t kNumbers = 127;
    std::uint32_t& number = lastNumber_[bus];
    number = number % kNumbers + 1;
    const auto decided = unseen_.extract(port);
    const bool authorized = decided ? decided.mapped() : letsIn(port);
    seen_[port] = {.attachment = {.port = port, .number = number, .inode = ++lastInode_},
                   .authorized = authorized};
    if (authorized) {
        becomeAuthorized(port);
    }
}

/// What is behind a hub comes when the hub is let in, and is gone when it is refused.
void FakeUsbBus::becomeAuthorized(const std::string& port) {
    for (const auto& [at, what] : std::map(plugs_)) {
        if (isBehind(at, port) && !seen_.contains(at)) {
            appear(at);
        }
    }
}

void FakeUsbBus::disappear(const std::string& port) {
    std::erase_if(seen_, [&](const auto& entry) { return isBehind(entry.first, port); });
}

bool FakeUsbBus::letsIn(const std::string& port) const {
    const AuthorizedDefault decides = rootHubs_.at(busOf(port)).authorizedDefault;
    return decides == kEverybody || (decides == kHardWiredOnly && plugs_.at(port).hardWired);
}

bool FakeUsbBus::hubAboveIsIn(const std::string& port) const {
    const std::size_t point = port.rfind('.');
    return point == std::string::npos ? rootHubs_.contains(busOf(port))
                                      : isAuthorized(port.substr(0, point));
}

bool FakeUsbBus::isUsed(const std::string& port) const {
    for (const std::string& used : used_) {
        if (used == port || isBehind(used, port)) {
            return true;
        }
    }
    return false;
}

GateOutcome FakeUsbBus::write(const UsbDevice& device, bool authorized) {
    happen();
    const auto found = seen_.find(device.port());
    if (found == seen_.end() || found->second.attachment != device.attachment) {
        return {.kind = GateOutcome::Kind::vanished};
    }
    if (failures_ > 0) {
        --failures_;
        return {.kind = GateOutcome::Kind::failed, .reason = "Input/output error"};
    }
    writes_.push_back(base::concat(device.port(), authorized ? "=1" : "=0"));
    setAuthorized(device.port(), authorized);
    return {};
}

AuthorizedDefault FakeUsbBus::read(AuthorizedDefault value) const {
    return twoValues_ && value == kHardWiredOnly ? kEverybody : value;
}

} // namespace keystrand::usb
