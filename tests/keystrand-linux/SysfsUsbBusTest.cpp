#include "keystrand-linux/SysfsUsbBus.h"

#include "base/Concat.h"
#include "base/UnixAddress.h"
#include "keystrand-linux/UsbGate.h"
#include "tests/keystrand-linux/FakeSysfs.h"
#include "tests/keystrand/LoopTurns.h"
#include "tests/support/FailingCalls.h"
#include "tests/support/TemporaryDirectory.h"

#include <gtest/gtest.h>

#include <array>
#include <cerrno>
#include <deque>
#include <fcntl.h>
#include <fstream>
#include <linux/netlink.h>
#include <sched.h>
#include <set>
#include <sys/mount.h>
#include <sys/socket.h>
#include <unistd.h>

namespace keystrand::usb {
namespace {

namespace fs = std::filesystem;
using namespace std::chrono_literals;
using Kind = GateOutcome::Kind;
using Lines = std::vector<std::string>;

class KeptLog : public GateLog {
  public:
    void write(GateLine /*about*/, const std::string& text) override { lines.push_back(text); }
    Lines lines;
};

class SysfsUsbBusTest : public testing::Test {
  protected:
    SysfsUsbBusTest() { machine.addRootHub(1, "pci0000:00/0000:00:14.0"); }

    BusView look() {
        std::string problem;
        const auto view = bus.look(problem);
        EXPECT_TRUE(view) << problem;
        return view.value_or(BusView());
    }
    std::string problemOfLook() {
        std::string problem;
        EXPECT_FALSE(bus.look(problem));
        return problem;
    }
    UsbDevice only() { return look().devices.at(0); }
    fs::path at(const std::string& port, const std::string& attribute) {
        return sysfs.directoryOf(port) / attribute;
    }
    static void put(const fs::path& path, std::string_view text) {
        std::ofstream(path, std::ios::binary) << text;
    }
    SysfsUsbBus busWith(SysfsUsbBus::System system) {
        return {*loop, directory.path().string(), log, std::move(system)};
    }

    const support::TemporaryDirectory directory;
    std::unique_ptr<EventLoop> loop = EventLoop::create();
    KeptLog log;
    FakeSysfs sysfs{directory.path()};
    FakeUsbBus& machine = sysfs.machine();
    SysfsUsbBus bus = busWith(sysfs.system());
};

TEST_F(SysfsUsbBusTest, OnlyDevicesAreDevices) {
    machine.plug("1-1", aMouse());
    const fs::path device = sysfs.directoryOf("1-1");
    for (const char* name : {"1-0:1.0", "usb", "usbx", "usb-1", "1-", "1-2.", "1-.2", "-1",
                             "1-2..3", "a-1", "1-1 ", "1-1.2:1.0", "usb99999999999"}) {
        fs::create_directory_symlink(device, sysfs.devices() / name);
    }
    const BusView view = look();
    ASSERT_EQ(view.devices.size(), 1U);
    EXPECT_EQ(view.devices[0].port(), "1-1");
    EXPECT_EQ(view.rootHubs.size(), 1U);
}

TEST_F(SysfsUsbBusTest, WhatADeviceDoesNotSayIsEmpty) {
    machine.plug("1-1", aMouse());
    for (const char* name : {"manufacturer", "product", "idVendor", "idProduct", "port"}) {
        fs::remove(at("1-1", name));
    }
    const UsbDevice device = only();
    EXPECT_EQ(device.manufacturer, "");
    EXPECT_EQ(device.name, "");
    EXPECT_EQ(device.serial, "");
    EXPECT_EQ(device.vendor, 0);
    EXPECT_EQ(device.product, 0);
    EXPECT_FALSE(device.hardWired);
    EXPECT_TRUE(device.functions.understood);
}

TEST_F(SysfsUsbBusTest, TextsHaveALimit) {
    machine.plug("1-1", aMouse());
    put(at("1-1", "manufacturer"), std::string(4096, 'm'));
    put(at("1-1", "product"), std::string(4097, 'p'));
    const UsbDevice device = only();
    EXPECT_EQ(device.manufacturer.size(), 4096U);
    EXPECT_EQ(device.name, "");
}

/// Reads like the kernel does while it is busy with some devices.
class BusyDevicesTest : public SysfsUsbBusTest {
  protected:
    BusyDevicesTest() {
        for (const char* const port : {"1-1", "1-2", "1-3"}) {
            machine.plug(port, {.descriptors = aMouse().descriptors, .serial = port});
        }
        SysfsUsbBus::System system = sysfs.system();
        system.read = [this](int at, const char* name, std::size_t limit, ReadDeadline until) {
            EXPECT_LE(until, began + SysfsUsbBus::kPatienceWithAll + (Clock::now() - began));
            EXPECT_LE(until, Clock::now() + SysfsUsbBus::kPatience);
            const bool isHeld = name == held;
            readsOfHeld += isHeld ? 1 : 0;
            return isHeld && busy.contains(numberIn(at))
                       ? SmallFile{.error = ETIMEDOUT, .bytes = {}}
                       : readSmallFileUntil(at, name, limit, Clock::now() + 1h);
        };
        slow.emplace(*loop, directory.path().string(), log, std::move(system));
    }
    static std::string numberIn(int device) {
        return std::string(trimmed(readSmallFile(device, "devnum", kAttributeLimit).bytes));
    }
    BusView lookSlowly() {
        std::string problem;
        began = Clock::now();
        readsOfHeld = 0;
        return slow->look(problem).value_or(BusView());
    }

    using Clock = std::chrono::steady_clock;
    ReadDeadline began;
    std::set<std::string> busy;
    std::string held = "serial";
    int readsOfHeld = 0;
    std::optional<SysfsUsbBus> slow;
};

TEST_F(BusyDevicesTest, WhatIsBusyIsThereWithWhatDecides) {
    busy = {"2"};
    BusView view = lookSlowly();
    ASSERT_EQ(view.devices.size(), 3U);
    EXPECT_TRUE(view.devices[0].saidAll);
    EXPECT_EQ(view.devices[0].serial, "1-1");
    EXPECT_FALSE(view.devices[1].saidAll);
    EXPECT_EQ(view.devices[1].serial, "");
    EXPECT_EQ(view.devices[1].name, "");
    EXPECT_EQ(view.devices[1].vendor, 0x1111);
    EXPECT_TRUE(view.devices[1].functions.understood);
    EXPECT_TRUE(view.devices[2].saidAll);
    EXPECT_EQ(view.devices[2].serial, "1-3");
    // Asked again, as the only one, and kept when it has answered.
    view = lookSlowly();
    EXPECT_EQ(readsOfHeld, 1);
    busy.clear();
    view = lookSlowly();
    EXPECT_EQ(readsOfHeld, 1);
    EXPECT_EQ(view.devices[1].serial, "1-2");
    EXPECT_TRUE(view.devices[1].saidAll);
    view = lookSlowly();
    EXPECT_EQ(readsOfHeld, 0);
}

TEST_F(BusyDevicesTest, WhatHoldsBackItsDescriptorsIsUnknownForNow) {
    busy = {"2"};
    held = "descriptors";
    EXPECT_FALSE(lookSlowly().devices.at(1).saidAll);
    EXPECT_EQ(lookSlowly().devices.at(1).functions, UsbFunctions());
    busy.clear();
    EXPECT_TRUE(lookSlowly().devices.at(1).functions.understood);
}

TEST(SmallFileTest, WhatWaitsInTheKernelIsInterrupted) {
    int ends[2] = {-1, -1};
    ASSERT_EQ(::pipe2(ends, O_CLOEXEC), 0);
    const base::FileDescriptor in(ends[0]);
    const base::FileDescriptor out(ends[1]);
    char byte = 0;
    {
        const Interruptions interruptions(std::chrono::steady_clock::now());
        EXPECT_EQ(::read(in.get(), &byte, 1), -1);
        EXPECT_EQ(errno, EINTR);
        // Again, should the first one have come too early.
        EXPECT_EQ(::read(in.get(), &byte, 1), -1);
        EXPECT_EQ(errno, EINTR);
    }
    ASSERT_EQ(::write(out.get(), "x", 1), 1);
    EXPECT_EQ(::read(in.get(), &byte, 1), 1);
}

TEST(SmallFileTest, ReadIsGivenUpAtItsTimeAndNotBefore) {
    const support::TemporaryDirectory directory;
    std::ofstream(directory.file("serial")) << "123\n";
    const base::FileDescriptor open = openDirectory(directory.path());
    const auto read = [&](ReadDeadline until) {
        return readSmallFileUntil(open.get(), "serial", kAttributeLimit, until);
    };
    const auto now = std::chrono::steady_clock::now();
    support::FailingCalls::read = {EINTR, EINTR};
    EXPECT_EQ(read(now + 1h).bytes, "123\n");
    // Who need not wait is never late.
    EXPECT_EQ(read(now).bytes, "123\n");
    support::FailingCalls::read = {EINTR};
    EXPECT_EQ(read(now).error, ETIMEDOUT);
}

TEST_F(SysfsUsbBusTest, DescriptorsAreReadToTheEndUpToALimit) {
    machine.plug("1-1", aMouse());
    constexpr std::size_t kLimit = std::size_t{1} << 20U;
    const std::vector<std::uint8_t> most(kLimit, 'x');
    put(at("1-1", "descriptors"), std::string(kLimit, 'x'));
    EXPECT_EQ(only().descriptorsHash, hashOfDescriptors(most));
    put(at("1-1", "descriptors"), std::string(kLimit + 1, 'x'));
    EXPECT_EQ(only().descriptorsHash, hashOfDescriptors({}));
    EXPECT_EQ(only().functions, UsbFunctions());
}

TEST_F(SysfsUsbBusTest, DeviceWhoseDescriptorsCannotBeReadIsThereAndUnknown) {
    machine.plug("1-1", aMouse());
    fs::remove(at("1-1", "descriptors"));
    fs::create_directory(at("1-1", "descriptors"));
    EXPECT_EQ(only().functions, UsbFunctions());
}

TEST_F(SysfsUsbBusTest, DeviceThatGoesWhileItIsReadIsNotThere) {
    for (const char* name : {"devnum", "authorized"}) {
        machine.plug("1-1", aMouse());
        fs::remove(at("1-1", name));
        EXPECT_TRUE(look().devices.empty()) << name;
        machine.unplug("1-1");
    }
    // The link is there still, and leads nowhere.
    fs::create_directory_symlink("../../../devices/gone", sysfs.devices() / "1-2");
    fs::create_directory_symlink("../../../devices/gone", sysfs.devices() / "usb2");
    EXPECT_TRUE(look().devices.empty());
    EXPECT_EQ(look().rootHubs.size(), 1U);
}

TEST_F(SysfsUsbBusTest, DeviceWithoutItsRootHubIsNotThere) {
    machine.plug("1-1", aMouse());
    fs::remove(sysfs.devices() / "usb1");
    EXPECT_TRUE(look().devices.empty());
}

TEST_F(SysfsUsbBusTest, RootHubThatNobodyUnderstandsCountsAsOpen) {
    put(at("usb1", "authorized_default"), "maybe\n");
    EXPECT_EQ(look().rootHubs.at(0).authorizedDefault, kEverybody);
}

TEST_F(SysfsUsbBusTest, ReasonsWhyNothingCanBeGuarded) {
    const std::string parameter = sysfs.parameter().string();
    put(parameter, "maybe\n");
    EXPECT_EQ(problemOfLook(), parameter + ": cannot be read");
    fs::remove(parameter);
    EXPECT_EQ(problemOfLook(), parameter + ": cannot be read");
    fs::remove_all(sysfs.devices());
    std::string problem;
    const auto without = bus.look(problem);
    ASSERT_TRUE(without);
    EXPECT_FALSE(without->hasUsb);
    EXPECT_EQ(problem, sysfs.devices().string() + ": No such file or directory");
    put(sysfs.devices(), "no directory");
    EXPECT_EQ(problemOfLook(), sysfs.devices().string() + ": Not a directory");
    // The module is loaded, and has not made its bus yet.
    fs::remove(sysfs.devices());
    put(parameter, "-1\n");
    EXPECT_TRUE(look().hasUsb);
    EXPECT_EQ(look().parameter, kAsTheControllerHasIt);
}

TEST_F(SysfsUsbBusTest, SysfsThatCannotBeWrittenSaysSo) {
    const std::string path = (directory.path() / "sys").string();
    if (::unshare(CLONE_NEWNS) != 0 ||
        ::mount(nullptr, "/", nullptr, MS_REC | MS_PRIVATE, nullptr) != 0 ||
        ::mount(path.c_str(), path.c_str(), nullptr, MS_BIND, nullptr) != 0 ||
        ::mount(nullptr, path.c_str(), nullptr, MS_BIND | MS_REMOUNT | MS_RDONLY, nullptr) != 0) {
        GTEST_SKIP() << "a mount cannot be made here";
    }
    EXPECT_EQ(problemOfLook(),
              sysfs.parameter().string() + ": cannot be written: Read-only file system");
    ASSERT_EQ(::umount(path.c_str()), 0);
    EXPECT_EQ(look().rootHubs.size(), 1U);
}

TEST_F(SysfsUsbBusTest, ValueThatTheKernelDoesNotKnowIsReadBackAsAnother) {
    const GateOutcome outcome = bus.setRootHub(look().rootHubs.at(0), 5);
    EXPECT_EQ(outcome.kind, Kind::done);
    EXPECT_EQ(outcome.readBack, kEverybody);
}

TEST_F(SysfsUsbBusTest, FailedWritesSayWhyAndWhatIsThere) {
    machine.plug("1-1", aMouse());
    machine.setRootHubDefault(1, kHardWiredOnly);
    sysfs.show();
    const RootHub hub = look().rootHubs.at(0);
    const UsbDevice mouse = only();
    sysfs.failWrites(EROFS);
    GateOutcome outcome = bus.setRootHub(hub, kNobody);
    EXPECT_EQ(outcome.kind, Kind::failed);
    EXPECT_EQ(outcome.readBack, kHardWiredOnly);
    EXPECT_EQ(outcome.reason, "Read-only file system");
    outcome = bus.setParameter(kNobody);
    EXPECT_EQ(outcome.kind, Kind::failed);
    EXPECT_EQ(outcome.readBack, kAsTheControllerHasIt);
    EXPECT_EQ(bus.accept(mouse).reason, "Read-only file system");
    sysfs.failWrites(ENODEV);
    EXPECT_EQ(bus.setRootHub(hub, kNobody).kind, Kind::vanished);
    EXPECT_EQ(bus.refuse(mouse).kind, Kind::vanished);
    fs::remove_all(sysfs.parameter().parent_path());
    outcome = bus.setParameter(kNobody);
    EXPECT_EQ(outcome.kind, Kind::failed);
    EXPECT_EQ(outcome.readBack, kEverybody);
    EXPECT_EQ(outcome.reason, sysfs.parameter().parent_path().string() + ": is not there");
}

TEST_F(SysfsUsbBusTest, WriteThatDoesNothingIsNotDone) {
    machine.plug("1-1", aMouse());
    SysfsUsbBus deaf = busWith({.write = [](int, const char*, std::string_view) {
        return 0;
    }});
    const GateOutcome outcome = deaf.refuse(only());
    EXPECT_EQ(outcome.kind, Kind::failed);
    EXPECT_EQ(outcome.reason, "it reads 1 afterwards");
    EXPECT_EQ(deaf.accept(only()).kind, Kind::done);
}

TEST_F(SysfsUsbBusTest, WithoutTheKernelsHelpTheAttributeItselfIsWritten) {
    machine.plug("1-1", aMouse());
    SysfsUsbBus plain = busWith({});
    EXPECT_EQ(plain.refuse(only()).kind, Kind::done);
    EXPECT_FALSE(only().authorized);
    EXPECT_EQ(plain.setRootHub(look().rootHubs.at(0), kHardWiredOnly).readBack, kHardWiredOnly);
    EXPECT_EQ(plain.setParameter(kNobody).readBack, kNobody);
}

TEST_F(SysfsUsbBusTest, DiskIsHeldOpenUntilItsDeviceIsRefused) {
    machine.plug("1-1", aDisk());
    sysfs.addDisk("1-1", "sdb");
    sysfs.addDisk("1-1", "sdc");
    std::size_t heldAtTheWrite = 0;
    auto system = sysfs.system();
    system.write = [&, write = system.write](int at, const char* name, std::string_view text) {
        heldAtTheWrite = sysfs.disksHeld();
        return write(at, name, text);
    };
    EXPECT_EQ(busWith(system).refuse(only()).kind, Kind::done);
    EXPECT_EQ(heldAtTheWrite, 2U);
    EXPECT_EQ(sysfs.disksHeld(), 0U);
}

TEST_F(SysfsUsbBusTest, WhatUsesADeviceIsNamed) {
    machine.plug("1-1", aHub());
    machine.plug("1-1.1", aDisk());
    machine.plug("1-1.2", aMouse());
    machine.plug("1-1.3", aMouse());
    machine.plug("1-2", aDisk());
    sysfs.mountDisk("1-1.1");
    sysfs.addDisk("1-1.1", "sda");
    sysfs.takeInterface("1-1.2");
    sysfs.bringNetworkUp("1-1.3");
    std::map<std::string, std::string> users;
    for (const UsbDevice& device : look().devices) {
        const GateOutcome outcome = bus.refuse(device);
        users[device.port()] = outcome.kind == Kind::inUse ? outcome.reason : "";
    }
    EXPECT_EQ(users["1-1.1"], "the disk sdb is mounted or claimed");
    EXPECT_EQ(users["1-1.2"], "a program has taken the interface 1-1.2:1.0");
    EXPECT_EQ(users["1-1.3"], "the network interface usb0 is up");
    EXPECT_NE(users["1-1"], "");
    EXPECT_EQ(users["1-2"], "");
    EXPECT_EQ(sysfs.disksHeld(), 0U);
}

TEST_F(SysfsUsbBusTest, WhatIsThereWithoutBeingUsedIsTaken) {
    machine.plug("1-1", aMouse());
    sysfs.bringNetworkUp("1-1");
    put(at("1-1", "1-1:1.0/net/usb0/flags"), "0x1002\n");
    fs::create_directory_symlink("../../bus/usb/drivers/usbhid", at("1-1", "1-1:1.0/driver"));
    EXPECT_EQ(bus.refuse(only()).kind, Kind::done);
}

TEST_F(SysfsUsbBusTest, WhatCannotBeToldCountsAsInUse) {
    machine.plug("1-1", aMouse());
    sysfs.bringNetworkUp("1-1");
    put(at("1-1", "1-1:1.0/net/usb0/flags"), "up\n");
    EXPECT_EQ(bus.refuse(only()).reason, "the network interface usb0 has no flags");
    fs::remove_all(at("1-1", "1-1:1.0/net"));
    sysfs.addDisk("1-1", "sdb");
    for (const char* number : {"8", "8:", ":16", "8:16:1", "x:1", ""}) {
        put(at("1-1", "1-1:1.0/host0/target0:0:0/0:0:0:0/block/sdb/dev"), number);
        EXPECT_EQ(bus.refuse(only()).reason, "the disk sdb has no number") << number;
    }
}

TEST_F(SysfsUsbBusTest, DisksThatCannotBeOpened) {
    machine.plug("1-1", aDisk());
    sysfs.addDisk("1-1", "sdb");
    int error = 0;
    Lines asked;
    auto system = sysfs.system();
    system.openAlone = [&](const std::string& node, dev_t) {
        asked.push_back(fs::path(node).lexically_relative(directory.path()).string());
        errno = error;
        return base::FileDescriptor();
    };
    SysfsUsbBus without = busWith(system);
    const auto reasonWith = [&](int number) {
        error = number;
        return without.refuse(only()).reason;
    };
    EXPECT_EQ(reasonWith(EBUSY), "the disk sdb is mounted or claimed");
    EXPECT_EQ(reasonWith(EPERM), "the disk sdb cannot be opened: Operation not permitted");
    asked.clear();
    // No node of its name: the one of its number is tried.
    EXPECT_EQ(reasonWith(ENOENT), "the disk sdb cannot be opened: No such file or directory");
    EXPECT_EQ(asked, (Lines{"dev/sdb", "dev/block/8:16"}));
    EXPECT_TRUE(machine.isAuthorized("1-1"));
    // A reader without a card, a disk that goes.
    for (const int number : {ENOMEDIUM, ENXIO, ENODEV}) {
        EXPECT_EQ(reasonWith(number), "");
    }
    EXPECT_FALSE(machine.isAuthorized("1-1"));
}

TEST_F(SysfsUsbBusTest, FileThatIsNoDiskIsNotOpenedAlone) {
    put(directory.path() / "file", "");
    EXPECT_FALSE(openDiskAlone(directory.file("file"), 1).isOpen());
    EXPECT_EQ(errno, ENOTBLK);
    EXPECT_FALSE(openDiskAlone(directory.file("none"), 1).isOpen());
    EXPECT_EQ(errno, ENOENT);
    EXPECT_FALSE(openDiskAlone("/dev/null", 1).isOpen());
}

TEST_F(SysfsUsbBusTest, ManyEventsLeadToOneLook) {
    int told = 0;
    bus.watch([&] { ++told; });
    for (int port = 1; port <= 5; ++port) {
        machine.plug(base::concat("1-", port), aMouse());
    }
    turnAll(*loop);
    EXPECT_EQ(told, 1);
}

TEST_F(SysfsUsbBusTest, OnlyUsbThatComesOrGoesIsAnEvent) {
    EXPECT_TRUE(tellsOfUsb({"add@/x\0ACTION=add\0SUBSYSTEM=usb\0SEQNUM=1", 43}));
    int told = 0;
    bus.watch([&] { ++told; });
    const auto send = [&](const std::string& action, const std::string& subsystem) {
        std::string message = "x@/devices/x";
        message += '\0';
        message += "ACTION=" + action + '\0';
        message += "SUBSYSTEM=" + subsystem;
        sysfs.send(message);
        turnAll(*loop);
        return std::exchange(told, 0);
    };
    for (const char* action : {"add", "remove", "bind"}) {
        EXPECT_EQ(send(action, "usb"), 1) << action;
    }
    const std::string module("add@/module/x\0ACTION=add\0SUBSYSTEM=module\0DEVPATH=/module/", 58);
    EXPECT_TRUE(tellsOfUsb(module + "usbcore"));
    EXPECT_FALSE(tellsOfUsb(module + "usbcore_too"));
    EXPECT_EQ(send("change", "usb"), 0);
    EXPECT_EQ(send("unbind", "usb"), 0);
    EXPECT_EQ(send("add", "usbmisc"), 0);
    EXPECT_EQ(send("add", "block"), 0);
    sysfs.send("");
    sysfs.send("SUBSYSTEM=usb");
    turnAll(*loop);
    EXPECT_EQ(told, 0);
    // More than the kernel ever sends: whatever it said is lost.
    sysfs.send(std::string(9000, 'x'));
    turnAll(*loop);
    EXPECT_EQ(told, 1);
}

TEST_F(SysfsUsbBusTest, WatchMayEndWithinTheCall) {
    int told = 0;
    bus.watch([&] {
        ++told;
        bus.watch(nullptr);
    });
    machine.plug("1-1", aMouse());
    turnAll(*loop);
    machine.plug("1-2", aMouse());
    turnAll(*loop);
    EXPECT_EQ(told, 1);
    EXPECT_FALSE(sysfs.isHeard());
    bus.watch([&] { ++told; });
    EXPECT_TRUE(sysfs.isHeard());
}

TEST_F(SysfsUsbBusTest, EventsThatCannotBeHadAreSaid) {
    auto system = sysfs.system();
    system.openEvents = [](std::string& problem) {
        problem = "no such socket";
        return base::FileDescriptor();
    };
    SysfsUsbBus deaf = busWith(system);
    deaf.watch([] {});
    EXPECT_EQ(log.lines,
              Lines{"keystrand: what is plugged in is not noticed at once: no such socket"});
}

TEST_F(SysfsUsbBusTest, SocketWithAFileTakesTheSameMessages) {
    std::string problem;
    const std::string path = directory.file("events.sock");
    auto system = sysfs.system();
    system.openEvents = [&](std::string& why) {
        return openEventsAt(path, why);
    };
    SysfsUsbBus listening = busWith(system);
    int told = 0;
    listening.watch([&] { ++told; });
    EXPECT_EQ(fs::status(path).permissions(), fs::perms::owner_read | fs::perms::owner_write);
    const auto address = base::UnixAddress::of(path).value();
    const base::FileDescriptor sender(::socket(AF_UNIX, SOCK_DGRAM | SOCK_CLOEXEC, 0));
    constexpr std::string_view kMessage("add@/x\0ACTION=add\0SUBSYSTEM=usb", 31);
    ASSERT_EQ(
        ::sendto(sender.get(), kMessage.data(), kMessage.size(), 0, address.get(), address.size()),
        static_cast<ssize_t>(kMessage.size()));
    turnAll(*loop);
    EXPECT_EQ(told, 1);
    EXPECT_EQ(log.lines, Lines());
    EXPECT_FALSE(openEventsAt("", problem).isOpen());
    EXPECT_FALSE(openEventsAt(directory.file("none/events.sock"), problem).isOpen());
    EXPECT_EQ(problem, directory.file("none/events.sock") + ": No such file or directory");
}

/// The kernel's own socket, in a network that nobody else is in.
class KernelEventsTest : public SysfsUsbBusTest {
  protected:
    void SetUp() override {
        if (::unshare(CLONE_NEWNET) != 0) {
            GTEST_SKIP() << "a network of its own cannot be had here";
        }
        pretender = base::FileDescriptor(
            ::socket(AF_NETLINK, SOCK_RAW | SOCK_CLOEXEC | SOCK_NONBLOCK, NETLINK_KOBJECT_UEVENT));
        listening.watch([this] { ++told; });
        ASSERT_EQ(log.lines, Lines());
    }

    bool pretend(std::size_t size) const {
        std::string message("add@/x\0ACTION=add\0SUBSYSTEM=usb\0", 32);
        message.resize(size, 'x');
        sockaddr_nl address{};
        address.nl_family = AF_NETLINK;
        address.nl_groups = 1;
        return ::sendto(pretender.get(), message.data(), message.size(), 0,
                        reinterpret_cast<const sockaddr*>(&address),
                        sizeof address) == static_cast<ssize_t>(size);
    }

    base::FileDescriptor pretender;
    SysfsUsbBus listening = busWith({});
    int told = 0;
};

TEST_F(KernelEventsTest, WhoeverElseSendsIsNotHeard) {
    ASSERT_TRUE(pretend(100));
    turnAll(*loop);
    EXPECT_EQ(told, 0);
}

TEST_F(KernelEventsTest, LostEventsLeadToALook) {
    // More than the socket takes in, all from somebody who is not heard.
    for (int count = 0; count < 4000; ++count) {
        static_cast<void>(pretend(2048));
    }
    turnAll(*loop);
    EXPECT_GE(told, 1);
    EXPECT_EQ(log.lines, Lines());
}

/// The gate before this bus, as it stands in a machine.
TEST_F(SysfsUsbBusTest, GateRefusesWhatComesAndLetsItInAgain) {
    const StateFile record(directory.file("gate"), StateFile::Durability::none);
    const StateFile devices(directory.file("devices"), StateFile::Durability::none);
    BootTime now(1);
    UsbGate gate({.bus = bus,
                  .record = record,
                  .devices = devices,
                  .log = log,
                  .now = [&now] { return now; },
                  .rearm =
                      [] {
                      }},
                 GateRules());
    machine.plug("1-1", aKeyboard());
    machine.plug("1-4", aDisk());
    gate.setClosed(true);
    EXPECT_EQ(machine.writes(), (Lines{"parameter=2", "usb1=2"}));
    machine.plug("1-2", aMouse());
    machine.addRootHub(2);
    turnAll(*loop);
    EXPECT_TRUE(machine.isAuthorized("1-4"));
    EXPECT_FALSE(machine.isAuthorized("1-2"));
    EXPECT_EQ(machine.rootHubDefault(2), kHardWiredOnly);
    gate.setClosed(false);
    turnAll(*loop);
    now += GatePolicy::kLateTime;
    gate.look();
    EXPECT_TRUE(machine.isAuthorized("1-2"));
    EXPECT_EQ(machine.rootHubDefault(1), kEverybody);
    EXPECT_EQ(machine.parameter(), kAsTheControllerHasIt);
    EXPECT_FALSE(sysfs.isHeard());
    EXPECT_EQ(log.lines,
              (Lines{"keystrand: the gate is closed",
                     "keystrand: refused 1-2 (1111:2222 \"maker\" \"mouse\", classes 03/01/02)",
                     "keystrand: accepted 1-2 (1111:2222 \"maker\" \"mouse\", classes 03/01/02): "
                     "the gate is open again",
                     "keystrand: the gate is open"}));
}

} // namespace
} // namespace keystrand::usb
