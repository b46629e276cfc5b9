// What the gate relies on, of each bus that it may stand in front of: the one of the tests, and the
// one that reads and writes a directory like sysfs, with a small kernel behind it.

#include "base/Concat.h"
#include "base/NotCopied.h"
#include "keystrand-linux/SysfsUsbBus.h"
#include "tests/keystrand-linux/FakeSysfs.h"
#include "tests/keystrand/LoopTurns.h"
#include "tests/support/TemporaryDirectory.h"

#include <gtest/gtest.h>

#include <memory>

namespace keystrand::usb {
namespace {

using Kind = GateOutcome::Kind;

class NoLog : public GateLog {
  public:
    void write(GateLine /*about*/, const std::string& text) override { ADD_FAILURE() << text; }
};

/// A machine and the bus that shows it.
class Bench : private base::NotCopied {
  public:
    virtual ~Bench() = default;

    [[nodiscard]] virtual FakeUsbBus& machine() = 0;
    [[nodiscard]] virtual UsbBus& bus() = 0;
    /// What the machine did without telling can be seen now.
    virtual void show() {}
    /// What was told has arrived.
    virtual void turn() {}
    virtual void use(const std::string& port) = 0;
};

class BenchOfFake : public Bench {
  public:
    FakeUsbBus& machine() override { return machine_; }
    UsbBus& bus() override { return machine_; }
    void use(const std::string& port) override { machine_.use(port); }

  private:
    FakeUsbBus machine_;
};

class BenchOfSysfs : public Bench {
  public:
    FakeUsbBus& machine() override { return sysfs_.machine(); }
    UsbBus& bus() override { return bus_; }
    void show() override { sysfs_.show(); }
    void turn() override { turnAll(*loop_); }
    void use(const std::string& port) override { sysfs_.mountDisk(port); }

  private:
    const support::TemporaryDirectory directory_;
    std::unique_ptr<EventLoop> loop_ = EventLoop::create();
    NoLog log_;
    FakeSysfs sysfs_{directory_.path()};
    SysfsUsbBus bus_{*loop_, directory_.path().string(), log_, sysfs_.system()};
};

using MakeBench = std::unique_ptr<Bench> (*)();

template <typename Made>
std::unique_ptr<Bench> make() {
    return std::make_unique<Made>();
}

class UsbBusContract : public testing::TestWithParam<MakeBench> {
  protected:
    UsbBusContract() { machine.addRootHub(1, "pci0000:00/0000:00:14.0"); }

    BusView look() {
        std::string problem;
        const auto view = bench->bus().look(problem);
        EXPECT_TRUE(view) << problem;
        return view.value_or(BusView());
    }

    UsbDevice deviceAt(const std::string& port) {
        for (const UsbDevice& device : look().devices) {
            if (device.port() == port) {
                return device;
            }
        }
        ADD_FAILURE() << port << " is not there";
        return {};
    }

    std::vector<std::string> ports() {
        std::vector<std::string> ports;
        for (const UsbDevice& device : look().devices) {
            ports.push_back(device.port() + (device.authorized ? "" : " refused"));
        }
        return ports;
    }

    const std::unique_ptr<Bench> bench = GetParam()();
    FakeUsbBus& machine = bench->machine();
    UsbBus& bus = bench->bus();
};

using Ports = std::vector<std::string>;

TEST_P(UsbBusContract, RootHubsAndTheParameter) {
    machine.addRootHub(2, "pci0000:00/0000:00:1d.0");
    machine.setParameterDefault(kNobody);
    machine.setRootHubDefault(2, kHardWiredOnly);
    bench->show();
    const BusView view = look();
    EXPECT_EQ(view.parameter, kNobody);
    ASSERT_EQ(view.rootHubs.size(), 2U);
    EXPECT_EQ(view.rootHubs[0].bus, 1U);
    EXPECT_EQ(view.rootHubs[0].controller, "pci0000:00/0000:00:14.0");
    EXPECT_EQ(view.rootHubs[0].authorizedDefault, kEverybody);
    EXPECT_EQ(view.rootHubs[1].controller, "pci0000:00/0000:00:1d.0");
    EXPECT_EQ(view.rootHubs[1].authorizedDefault, kHardWiredOnly);
    EXPECT_NE(view.rootHubs[0].inode, view.rootHubs[1].inode);
    EXPECT_TRUE(view.devices.empty());
}

TEST_P(UsbBusContract, DeviceAsItDescribesItself) {
    Plug plug = aKeyboardWithDisk();
    plug.vendor = 0x04F2;
    plug.product = 0xABCD;
    plug.serial = "00 11\n\xFF";
    plug.hardWired = true;
    machine.plug("1-12.3", aMouse()); // behind nothing: not seen
    machine.plug("1-2", plug);
    const BusView view = look();
    ASSERT_EQ(view.devices.size(), 1U);
    const UsbDevice& device = view.devices[0];
    EXPECT_EQ(device.port(), "1-2");
    EXPECT_EQ(device.attachment.number, machine.attachmentAt("1-2").number);
    EXPECT_EQ(device.controller, "pci0000:00/0000:00:14.0");
    EXPECT_EQ(device.vendor, 0x04F2);
    EXPECT_EQ(device.product, 0xABCD);
    EXPECT_EQ(device.manufacturer, "maker");
    EXPECT_EQ(device.name, "both");
    EXPECT_EQ(device.serial, "00 11\n\xFF");
    EXPECT_EQ(device.descriptorsHash, hashOfDescriptors(plug.descriptors));
    EXPECT_EQ(device.functions, readDescriptors(plug.descriptors));
    EXPECT_TRUE(device.authorized);
    EXPECT_TRUE(device.hardWired);
    EXPECT_EQ(view.find(device.attachment), &device);
}

TEST_P(UsbBusContract, OnlyTheFirmwareSaysThatAPortIsInside) {
    Plug inside = aMouse();
    inside.hardWired = true;
    machine.plug("1-1", aHub());
    machine.plug("1-1.1", inside);
    machine.plug("1-1.2", aMouse());
    EXPECT_FALSE(deviceAt("1-1").hardWired);
    EXPECT_TRUE(deviceAt("1-1.1").hardWired);
    EXPECT_FALSE(deviceAt("1-1.2").hardWired);
}

TEST_P(UsbBusContract, HubBeforeWhatIsBehindIt) {
    machine.plug("1-10", aHub());
    machine.plug("1-1", aHub());
    machine.plug("1-10.2", aMouse());
    machine.plug("1-1.4", aHub());
    machine.plug("1-1.4.1", aMouse());
    EXPECT_EQ(ports(), (Ports{"1-1", "1-1.4", "1-1.4.1", "1-10", "1-10.2"}));
}

TEST_P(UsbBusContract, EachDescriptionCountsAlsoOneThatNobodyUnderstands) {
    machine.plug("1-1", {.descriptors = {}});
    machine.plug("1-2", {.descriptors = {18, 1}});
    EXPECT_EQ(deviceAt("1-1").functions, UsbFunctions());
    EXPECT_EQ(deviceAt("1-2").functions, UsbFunctions());
    EXPECT_EQ(deviceAt("1-2").descriptorsHash, hashOfDescriptors(std::vector<std::uint8_t>{18, 1}));
}

TEST_P(UsbBusContract, WrittenDefaultsAreReadBackAndDecideWhatComes) {
    const GateOutcome parameter = bus.setParameter(kHardWiredOnly);
    EXPECT_EQ(parameter.kind, Kind::done);
    EXPECT_EQ(parameter.readBack, kHardWiredOnly);
    const GateOutcome hub = bus.setRootHub(look().rootHubs.at(0), kNobody);
    EXPECT_EQ(hub.kind, Kind::done);
    EXPECT_EQ(hub.readBack, kNobody);
    machine.plug("1-1", aMouse());
    EXPECT_EQ(ports(), Ports{"1-1 refused"});
    machine.addRootHub(7);
    EXPECT_EQ(look().rootHubs.at(1).authorizedDefault, kHardWiredOnly);
    EXPECT_EQ(bus.setParameter(kAsTheControllerHasIt).readBack, kAsTheControllerHasIt);
}

TEST_P(UsbBusContract, KernelThatKnowsTwoValuesSaysSoWithoutAnError) {
    machine.knowOnlyTwoValues();
    EXPECT_EQ(bus.setParameter(kHardWiredOnly).readBack, kEverybody);
    const GateOutcome hub = bus.setRootHub(look().rootHubs.at(0), kHardWiredOnly);
    EXPECT_EQ(hub.kind, Kind::done);
    EXPECT_EQ(hub.readBack, kEverybody);
}

TEST_P(UsbBusContract, RootHubThatWentOrIsAnotherOneByNow) {
    const RootHub hub = look().rootHubs.at(0);
    machine.removeRootHub(1);
    EXPECT_EQ(bus.setRootHub(hub, kNobody).kind, Kind::vanished);
    machine.addRootHub(1);
    EXPECT_EQ(bus.setRootHub(hub, kNobody).kind, Kind::vanished);
    EXPECT_EQ(machine.rootHubDefault(1), kEverybody);
    EXPECT_NE(look().rootHubs.at(0).inode, hub.inode);
}

TEST_P(UsbBusContract, RefusedAndAccepted) {
    machine.plug("1-1", aMouse());
    const UsbDevice mouse = deviceAt("1-1");
    EXPECT_EQ(bus.refuse(mouse).kind, Kind::done);
    EXPECT_FALSE(machine.isAuthorized("1-1"));
    EXPECT_EQ(ports(), Ports{"1-1 refused"});
    EXPECT_EQ(deviceAt("1-1").attachment, mouse.attachment);
    EXPECT_EQ(bus.refuse(mouse).kind, Kind::done);
    EXPECT_EQ(bus.accept(mouse).kind, Kind::done);
    EXPECT_TRUE(machine.isAuthorized("1-1"));
    EXPECT_EQ(bus.accept(mouse).kind, Kind::done);
}

TEST_P(UsbBusContract, WhatIsBehindARefusedHubIsSeenWhenTheHubIsAccepted) {
    machine.setRootHubDefault(1, kNobody);
    machine.plug("1-1", aHub());
    machine.plug("1-1.2", aMouse());
    bench->show();
    EXPECT_EQ(ports(), Ports{"1-1 refused"});
    EXPECT_EQ(bus.accept(deviceAt("1-1")).kind, Kind::done);
    EXPECT_EQ(ports(), (Ports{"1-1", "1-1.2 refused"}));
    const UsbDevice behind = deviceAt("1-1.2");
    EXPECT_EQ(bus.refuse(deviceAt("1-1")).kind, Kind::done);
    EXPECT_EQ(ports(), Ports{"1-1 refused"});
    EXPECT_EQ(bus.accept(behind).kind, Kind::vanished);
}

TEST_P(UsbBusContract, DeviceThatWentBeforeTheWrite) {
    machine.plug("1-1", aMouse());
    const UsbDevice mouse = deviceAt("1-1");
    machine.unplug("1-1");
    EXPECT_EQ(bus.refuse(mouse).kind, Kind::vanished);
    EXPECT_EQ(bus.accept(mouse).kind, Kind::vanished);
}

TEST_P(UsbBusContract, AnotherDeviceAtThePortIsLeftAlone) {
    machine.plug("1-1", aMouse());
    const UsbDevice mouse = deviceAt("1-1");
    machine.unplug("1-1");
    machine.plug("1-1", aDisk());
    EXPECT_EQ(bus.refuse(mouse).kind, Kind::vanished);
    EXPECT_TRUE(machine.isAuthorized("1-1"));
    machine.setAuthorized("1-1", false);
    bench->show();
    EXPECT_EQ(bus.accept(mouse).kind, Kind::vanished);
    EXPECT_FALSE(machine.isAuthorized("1-1"));
}

TEST_P(UsbBusContract, DeviceThatReturnsWithItsNumberIsAnotherOne) {
    machine.plug("1-1", aMouse());
    const UsbDevice mouse = deviceAt("1-1");
    for (int again = 0; again < 127; ++again) {
        machine.replug("1-1");
    }
    const UsbDevice now = deviceAt("1-1");
    EXPECT_EQ(now.attachment.number, mouse.attachment.number);
    EXPECT_NE(now.attachment, mouse.attachment);
    EXPECT_EQ(bus.refuse(mouse).kind, Kind::vanished);
    EXPECT_TRUE(machine.isAuthorized("1-1"));
}

TEST_P(UsbBusContract, DeviceThatGoesAtTheVeryWrite) {
    machine.plug("1-1", aMouse());
    const UsbDevice mouse = deviceAt("1-1");
    machine.setMeanwhile([&] { machine.unplug("1-1"); });
    EXPECT_EQ(bus.refuse(mouse).kind, Kind::vanished);
    machine.plug("1-1", aMouse());
    const UsbDevice next = deviceAt("1-1");
    machine.setMeanwhile([&] { machine.replug("1-1"); });
    EXPECT_EQ(bus.refuse(next).kind, Kind::vanished);
    EXPECT_TRUE(machine.isAuthorized("1-1"));
}

TEST_P(UsbBusContract, WhatTheMachineWorksWithIsNotTaken) {
    machine.plug("1-1", aHub());
    machine.plug("1-1.1", aDisk());
    machine.plug("1-2", aMouse());
    bench->use("1-1.1");
    machine.forgetWrites();
    for (const std::string port : {"1-1.1", "1-1"}) {
        const GateOutcome outcome = bus.refuse(deviceAt(port));
        EXPECT_EQ(outcome.kind, Kind::inUse) << port;
        EXPECT_NE(outcome.reason, "");
    }
    EXPECT_EQ(machine.writes(), Ports());
    EXPECT_EQ(bus.refuse(deviceAt("1-2")).kind, Kind::done);
    EXPECT_EQ(ports(), (Ports{"1-1", "1-1.1", "1-2 refused"}));
}

TEST_P(UsbBusContract, WriteThatFailsSaysWhy) {
    machine.plug("1-1", aMouse());
    machine.failWrites(1);
    const GateOutcome outcome = bus.refuse(deviceAt("1-1"));
    EXPECT_EQ(outcome.kind, Kind::failed);
    EXPECT_EQ(outcome.reason, "Input/output error");
    EXPECT_TRUE(machine.isAuthorized("1-1"));
    EXPECT_EQ(bus.refuse(deviceAt("1-1")).kind, Kind::done);
}

TEST_P(UsbBusContract, MachineWithoutUsbHasAReason) {
    machine.setMissing(true);
    bench->show();
    for (const auto look : {&UsbBus::look, &UsbBus::glance}) {
        std::string problem;
        const auto view = (bus.*look)(problem);
        ASSERT_TRUE(view);
        EXPECT_FALSE(view->hasUsb);
        EXPECT_TRUE(view->rootHubs.empty());
        EXPECT_NE(problem, "");
    }
    machine.setMissing(false);
    bench->show();
    EXPECT_TRUE(look().hasUsb);
    EXPECT_EQ(look().rootHubs.size(), 1U);
}

TEST_P(UsbBusContract, GlanceShowsWhatNoDeviceIsAskedFor) {
    machine.plug("1-1", aMouse());
    machine.setRootHubDefault(1, kNobody);
    machine.plug("1-2", aDisk());
    bench->show();
    std::string problem = "of the last one";
    const auto glance = bus.glance(problem);
    ASSERT_TRUE(glance);
    EXPECT_EQ(problem, "");
    const BusView whole = look();
    EXPECT_EQ(glance->parameter, whole.parameter);
    EXPECT_EQ(glance->rootHubs, whole.rootHubs);
    ASSERT_EQ(glance->devices.size(), 2U);
    for (std::size_t index = 0; index < 2; ++index) {
        EXPECT_EQ(glance->devices[index].attachment, whole.devices[index].attachment);
        EXPECT_EQ(glance->devices[index].authorized, whole.devices[index].authorized);
        EXPECT_EQ(glance->devices[index].vendor, 0);
        EXPECT_EQ(glance->devices[index].name, "");
        EXPECT_EQ(glance->devices[index].functions, UsbFunctions());
    }
}

TEST_P(UsbBusContract, ChangesAreToldUntilNobodyWatches) {
    int told = 0;
    bus.watch([&] { ++told; });
    machine.plug("1-1", aMouse());
    bench->turn();
    EXPECT_EQ(told, 1);
    machine.unplug("1-1");
    bench->turn();
    EXPECT_EQ(told, 2);
    machine.addRootHub(2);
    bench->turn();
    EXPECT_EQ(told, 3);
    bus.watch(nullptr);
    machine.plug("1-1", aMouse());
    bench->turn();
    EXPECT_EQ(told, 3);
}

INSTANTIATE_TEST_SUITE_P(Fake, UsbBusContract, testing::Values(&make<BenchOfFake>));
INSTANTIATE_TEST_SUITE_P(Sysfs, UsbBusContract, testing::Values(&make<BenchOfSysfs>));

} // namespace
} // namespace keystrand::usb
