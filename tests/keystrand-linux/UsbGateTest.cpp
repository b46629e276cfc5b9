// The gate on a bus: what it writes, in which order, what it says, and what the next service finds.

#include "keystrand-linux/UsbGate.h"

#include "tests/keystrand-linux/FakeUsbBus.h"
#include "tests/support/TemporaryDirectory.h"

#include <gtest/gtest.h>

#include <filesystem>
#include <map>

namespace keystrand::usb {
namespace {

using namespace std::chrono_literals;
using Lines = std::vector<std::string>;

class Log : public GateLog {
  public:
    void write(GateLine about, const std::string& text) override {
        lines.push_back(text);
        abouts.push_back(about);
    }
    Lines take() { return std::exchange(lines, {}); }

    Lines lines;
    std::vector<GateLine> abouts;
};

/// The end of the process at a write.
struct Killed {};

class UsbGateTest : public testing::Test {
  protected:
    UsbGateTest() {
        bus.addRootHub(1, "pci0");
        bus.addRootHub(2, "pci1");
        start();
    }

    std::optional<GateRecord> start(const GateRules& rules = {}) {
        gate.emplace(UsbGate::Parts{.bus = bus,
                                    .record = record,
                                    .devices = devices,
                                    .log = log,
                                    .now = [this] { return now; },
                                    .rearm =
                                        [this] {
                                            ++rearmed;
                                        }},
                     rules);
        return gate->resume();
    }

    /// Until nothing that was refused can come any more.
    void open() {
        gate->setClosed(false);
        now += GatePolicy::kLateTime;
        gate->look();
    }

    std::optional<GateRecord> recordOnDisk() {
        std::string problem;
        const auto text = record.read(problem);
        return text ? decodeGateRecord(*text) : std::nullopt;
    }
    std::set<std::string> pathsOnDisk() {
        std::string problem;
        const auto text = devices.read(problem);
        const auto known = text ? decodeKnownDevices(*text) : std::nullopt;
        std::set<std::string> paths;
        for (const KnownAcrossStarts& device : known.value_or(KnownDevices())) {
            paths.insert(device.controller + " " + device.path);
        }
        return paths;
    }

    support::TemporaryDirectory directory;
    StateFile record{directory.file("gate"), StateFile::Durability::none};
    StateFile devices{directory.file("devices"), StateFile::Durability::synced};
    FakeUsbBus bus;
    Log log;
    BootTime now = 1000s;
    int rearmed = 0;
    std::optional<UsbGate> gate;
};

TEST_F(UsbGateTest, ClosesAndOpensWithALineEach) {
    gate->setClosed(true);
    EXPECT_EQ(log.take(), Lines{"keystrand: the gate is closed"});
    gate->setClosed(true);
    open();
    EXPECT_EQ(log.take(), Lines{"keystrand: the gate is open"});
    EXPECT_EQ(recordOnDisk(), GateRecord());
    gate->setClosed(false);
    EXPECT_EQ(log.take(), Lines());
}

TEST_F(UsbGateTest, EachRefusalAndEachAcceptanceHasALine) {
    gate->setClosed(true);
    log.take();
    Plug plug = aDisk();
    plug.name = "Stick \"\x01\xff\\";
    plug.serial = "A1";
    bus.plug("1-1", plug);
    Plug unknown = aDisk();
    unknown.descriptors.resize(7);
    bus.plug("2-3", unknown);
    EXPECT_EQ(
        log.take(),
        (Lines{R"(keystrand: refused 1-1 (1111:2222 "maker" "Stick \x22\x01\xff\x5c", serial )"
               R"("A1", classes 08/06/50))",
               R"(keystrand: refused 2-3 (1111:2222 "maker" "disk", unknown))"}));
    bus.plug("1-2", aKeyboard());
    EXPECT_EQ(log.take(),
              (Lines{R"(keystrand: accepted 1-2 (1111:2222 "maker" "keyboard", classes )"
                     R"(03/01/01 03/00/00): no other keyboard is attached)"}));
    gate->setClosed(false);
    EXPECT_EQ(
        log.take(),
        (Lines{R"(keystrand: accepted 1-1 (1111:2222 "maker" "Stick \x22\x01\xff\x5c", serial )"
               R"("A1", classes 08/06/50): the gate is open again)",
               R"(keystrand: accepted 2-3 (1111:2222 "maker" "disk", unknown): the gate is open )"
               R"(again)",
               "keystrand: the gate is open"}));
}

TEST_F(UsbGateTest, RecordIsThereBeforeEachWrite) {
    int writes = 0;
    const std::function<void()> check = [&] {
        const auto kept = recordOnDisk();
        // The look comes first; from the second on something is to be written.
        if (++writes > 2) {
            ASSERT_TRUE(kept);
            EXPECT_EQ(kept->gate.phase, GateState::Phase::closed);
            EXPECT_TRUE(kept->gate.parameter);
            EXPECT_EQ(kept->gate.hubs.size(), 2U);
        }
        if (writes < 8) {
            bus.setMeanwhile(check);
        }
    };
    bus.setMeanwhile(check);
    gate->setClosed(true);
    EXPECT_GE(writes, 5);
}

TEST_F(UsbGateTest, KilledAtEachMomentTheNextServiceGoesOn) {
    int moment = 1;
    for (bool reached = true; reached; ++moment) {
        ASSERT_LT(moment, 60);
        bus.plug("1-1", aMouse());
        int left = moment;
        const std::function<void()> kill = [&] {
            if (--left == 0) {
                throw Killed();
            }
            bus.setMeanwhile(kill);
        };
        bus.setMeanwhile(kill);
        bool wasClosing = false;
        try {
            gate->setClosed(true);
            bus.plug("1-2", aDisk());
            bus.plug("1-3", aHub());
            wasClosing = true;
            gate->setClosed(false);
        } catch (const Killed&) {
        }
        reached = left <= 0;
        bus.setMeanwhile(nullptr);
        // What it was to do, the next one does: close in the first half, open in the second.
        const auto kept = start();
        gate->setClosed(!wasClosing);
        gate->look();
        const AuthorizedDefault wanted = wasClosing ? kEverybody : kHardWiredOnly;
        EXPECT_EQ(bus.rootHubDefault(1), wanted) << moment;
        EXPECT_EQ(bus.rootHubDefault(2), wanted) << moment;
        EXPECT_TRUE(bus.isAuthorized("1-1")) << moment;
        open();
        EXPECT_EQ(bus.parameter(), kAsTheControllerHasIt) << moment;
        EXPECT_EQ(bus.rootHubDefault(1), kEverybody) << moment;
        for (const char* port : {"1-2", "1-3"}) {
            EXPECT_EQ(bus.isAuthorized(port), bus.isPlugged(port)) << moment;
            bus.unplug(port);
        }
        bus.unplug("1-1");
        EXPECT_EQ(recordOnDisk(), GateRecord()) << moment;
    }
    EXPECT_GT(moment, 15);
}

TEST_F(UsbGateTest, RecordThatCannotBeUnderstoodIsTold) {
    std::string problem;
    ASSERT_TRUE(record.replace("nonsense\n", problem));
    log.take();
    EXPECT_EQ(start(), std::nullopt);
    EXPECT_EQ(log.take(), Lines{"keystrand: " + record.path() +
                                ": not a record of the gate; what is attached counts as accepted, "
                                "and what reads closed stays so: keystrand --restore --all opens "
                                "it"});
}

TEST_F(UsbGateTest, RecordThatCannotBeReadIsTold) {
    std::filesystem::create_directory(record.path());
    EXPECT_EQ(start(), std::nullopt);
    EXPECT_EQ(log.take(), Lines{"keystrand: " + record.path() +
                                ": not a regular file; what is attached counts as accepted, and "
                                "what reads closed stays so: keystrand --restore --all opens it"});
}

/// A service that closed has died, and nobody can read what it has noted.
class LostRecordTest : public UsbGateTest {
  protected:
    LostRecordTest() {
        start({.keyboards = KeyboardRule::never});
        gate->setClosed(true);
        bus.plug("1-1", aHub());
        bus.plug("1-1.2", aDisk());
        std::string problem;
        EXPECT_TRUE(record.replace("nonsense\n", problem));
        start({.keyboards = KeyboardRule::never});
        log.take();
    }
};

TEST_F(LostRecordTest, WhatItClosedStaysClosedAndIsNamedAsLongAsTheGateIsOpen) {
    gate->setClosed(true);
    EXPECT_EQ(gate->closedByNobodyKnows(), "");
    open();
    const std::string all = "the parameter authorized_default, root hub usb1, root hub usb2";
    EXPECT_EQ(gate->closedByNobodyKnows(), all);
    // The next service and the one after that know it as well.
    start();
    EXPECT_EQ(gate->closedByNobodyKnows(), all);
    gate->setClosed(true);
    open();
    start();
    EXPECT_EQ(gate->closedByNobodyKnows(), all);
    bus.setRootHubDefault(1, kEverybody);
    bus.setParameterDefault(kAsTheControllerHasIt);
    EXPECT_EQ(gate->closedByNobodyKnows(), "root hub usb2");
    EXPECT_FALSE(bus.isAuthorized("1-1"));
}

TEST_F(LostRecordTest, WhoTakesOverOpensAll) {
    bus.setRootHubDefault(2, kNobody);
    gate->takeOver();
    EXPECT_TRUE(gate->restore([this](BootTime until) { now = until; }));
    EXPECT_EQ(bus.parameter(), kAsTheControllerHasIt);
    EXPECT_EQ(bus.rootHubDefault(1), kEverybody);
    EXPECT_EQ(bus.rootHubDefault(2), kEverybody);
    EXPECT_TRUE(bus.isAuthorized("1-1.2"));
    EXPECT_EQ(gate->closedByNobodyKnows(), "");
}

TEST_F(UsbGateTest, WhatOthersHaveClosedIsNotLost) {
    bus.setRootHubDefault(1, kNobody);
    gate->setClosed(true);
    open();
    EXPECT_EQ(gate->closedByNobodyKnows(), "");
}

class RestoreTest : public UsbGateTest {
  protected:
    RestoreTest() {
        start({.keyboards = KeyboardRule::never});
        gate->setClosed(true);
        bus.plug("1-1", aHub());
        start();
        log.take();
        bus.forgetWrites();
    }

    /// What happens while the gate waits for the n-th time; then it is time.
    void meanwhile(std::size_t wait, std::function<void()> what) {
        happens[wait] = std::move(what);
    }
    bool restore() {
        return gate->restore([this](BootTime until) {
            EXPECT_GT(until, now);
            EXPECT_LE(until, began + 20s);
            if (const auto found = happens.find(waits++); found != happens.end()) {
                found->second();
            } else {
                now = until;
            }
        });
    }

    const BootTime began = now;
    std::size_t waits = 0;
    std::map<std::size_t, std::function<void()>> happens;
};

TEST_F(RestoreTest, WhatComesInLateIsAcceptedAsWell) {
    // The kernel has refused it for this service's root hub, and shows it seconds later.
    bus.plugUnseen("1-1.2", aHub());
    meanwhile(0, [&] {
        bus.watch(nullptr);
        now += 9s;
        bus.setRootHubDefault(1, kHardWiredOnly);
        bus.show("1-1.2");
        bus.setRootHubDefault(1, kEverybody);
        bus.plug("1-1.2.3", aDisk());
    });
    EXPECT_TRUE(restore());
    EXPECT_TRUE(bus.isAuthorized("1-1.2"));
    EXPECT_TRUE(bus.isAuthorized("1-1.2.3"));
    EXPECT_EQ(now, began + GatePolicy::kLateTime);
    EXPECT_EQ(recordOnDisk(), GateRecord());
}

TEST_F(RestoreTest, WhatTheKernelDoesNotTakeIsTriedOnceMore) {
    bus.failDefaults();
    meanwhile(0, [&] {
        now += GatePolicy::kRetryTime;
        bus.failDefaults(false);
    });
    EXPECT_TRUE(restore());
    EXPECT_EQ(now, began + 20s);
    EXPECT_EQ(bus.rootHubDefault(1), kEverybody);
    EXPECT_TRUE(bus.isAuthorized("1-1"));
    EXPECT_EQ(log.take().back(), "keystrand: the gate is open");
}

TEST_F(RestoreTest, WhatIsNotOpenInTheEndIsNamed) {
    bus.failDefaults();
    EXPECT_FALSE(restore());
    EXPECT_EQ(now, began + 20s);
    EXPECT_EQ(log.take().back(), "keystrand: the gate is open, but for the parameter "
                                 "authorized_default, root hub usb1, root hub usb2");
}

TEST_F(RestoreTest, DeviceThatIsNotTakenIsNamed) {
    bus.failWrites(1);
    EXPECT_FALSE(restore());
    EXPECT_EQ(log.take(),
              (Lines{R"(keystrand: cannot accept 1-1 (1111:2222 "maker" "hub", classes 09/00/00))"
                     ": Input/output error",
                     "keystrand: the gate is open",
                     "keystrand: the gate is open, but for device "
                     "1-1"}));
}

TEST_F(RestoreTest, DeviceThatIsNotTakenAndGoesIsNotMissed) {
    bus.failWrites(1);
    meanwhile(0, [&] { bus.unplug("1-1"); });
    EXPECT_TRUE(restore());
}

TEST_F(RestoreTest, UsbThatCannotBeSeenIsTold) {
    bus.setUnreadable(true);
    EXPECT_FALSE(restore());
    EXPECT_EQ(now, began + 20s);
    EXPECT_EQ(log.take(), (Lines{"keystrand: no port is guarded: it cannot be read",
                                 "keystrand: cannot open the gate: it cannot be read"}));
}

TEST_F(UsbGateTest, RecordThatCannotBeWrittenLeavesNothingOpen) {
    const StateFile nowhere(directory.file("none/gate"), StateFile::Durability::none);
    gate.emplace(UsbGate::Parts{.bus = bus,
                                .record = nowhere,
                                .devices = devices,
                                .log = log,
                                .now = [this] { return now; },
                                .rearm =
                                    [] {
                                    }},
                 GateRules{});
    gate->setClosed(true);
    EXPECT_EQ(bus.rootHubDefault(1), kHardWiredOnly);
    ASSERT_FALSE(log.lines.empty());
    EXPECT_EQ(log.lines.front(),
              "keystrand: " + nowhere.path() + ": cannot be written: No such file or directory");
}

TEST_F(UsbGateTest, WithoutUsbThatIsSaidOnce) {
    bus.setMissing(true);
    gate->setClosed(true);
    gate->setClosed(true);
    EXPECT_EQ(log.take(), Lines{"keystrand: no port is guarded: no USB here"});
    EXPECT_FALSE(gate->closed());
    EXPECT_EQ(gate->gap(), "no USB here");
    EXPECT_EQ(gate->nextLook(), std::nullopt);
}

TEST_F(UsbGateTest, UsbThatCannotBeLookedAtIsClosedWhenItCanAndWhatIsAttachedStays) {
    bus.plug("1-1", aDisk());
    bus.setUnreadable(true);
    gate->setClosed(true);
    EXPECT_EQ(log.take(), Lines{"keystrand: no port is guarded: it cannot be read"});
    EXPECT_FALSE(gate->closed());
    EXPECT_EQ(gate->gap(), "it cannot be read");
    EXPECT_EQ(gate->nextLook(), now + 60s);
    now += 60s;
    gate->look();
    EXPECT_EQ(gate->nextLook(), now + 60s);
    EXPECT_EQ(log.take(), Lines());
    bus.setUnreadable(false);
    now += 60s;
    gate->look();
    EXPECT_TRUE(gate->closed());
    EXPECT_EQ(gate->gap(), "");
    EXPECT_EQ(gate->nextLook(), std::nullopt);
    EXPECT_TRUE(bus.isAuthorized("1-1"));
    EXPECT_EQ(log.take(), Lines{"keystrand: the gate is closed"});
}

TEST_F(UsbGateTest, UsbThatComesLaterIsClosedWhenItComes) {
    bus.removeRootHub(1);
    bus.removeRootHub(2);
    bus.setMissing(true);
    gate->setClosed(true);
    EXPECT_TRUE(bus.isWatched());
    log.take();
    bus.setMissing(false);
    // A controller is faster than whoever tells of it, and so is what is plugged in there.
    gate->setLocked(true);
    bus.watch(nullptr);
    bus.addRootHub(2);
    bus.plug("2-1", aDisk());
    ASSERT_TRUE(bus.isAuthorized("2-1"));
    gate->look();
    EXPECT_TRUE(gate->closed());
    EXPECT_EQ(bus.writes(), (std::vector<std::string>{"parameter=2", "usb2=2", "2-1=0"}));
    EXPECT_EQ(log.take().back(), "keystrand: the gate is closed");
    gate->setClosed(false);
    EXPECT_TRUE(bus.isAuthorized("2-1"));
    EXPECT_EQ(bus.parameter(), kAsTheControllerHasIt);
}

TEST_F(UsbGateTest, UsbThatIsLoadedAnewIsClosedAnew) {
    gate->setClosed(true);
    ASSERT_EQ(bus.parameter(), kHardWiredOnly);
    bus.removeRootHub(1);
    bus.setMissing(true);
    bus.removeRootHub(2);
    EXPECT_FALSE(gate->closed());
    bus.setMissing(false);
    bus.addRootHub(1);
    EXPECT_EQ(bus.parameter(), kHardWiredOnly);
    EXPECT_EQ(bus.rootHubDefault(1), kHardWiredOnly);
    gate->setClosed(false);
    EXPECT_EQ(bus.parameter(), kAsTheControllerHasIt);
    EXPECT_EQ(bus.rootHubDefault(1), kEverybody);
}

TEST_F(UsbGateTest, DeviceThatHangsKeepsNothingOpen) {
    bus.plug("1-1", aMouse());
    int reads = 0;
    bus.setHanging([&] {
        ++reads;
        EXPECT_EQ(bus.parameter(), kHardWiredOnly);
        EXPECT_EQ(bus.rootHubDefault(1), kHardWiredOnly);
        EXPECT_EQ(bus.rootHubDefault(2), kHardWiredOnly);
    });
    gate->keepDevices();
    gate->setClosed(true);
    gate->setLocked(true);
    EXPECT_GT(reads, 0);
    // Nor one behind which there is a root hub that comes later.
    reads = 0;
    bus.watch(nullptr);
    bus.addRootHub(3);
    bus.setRootHubDefault(3, kEverybody);
    bus.setHanging([&] {
        ++reads;
        EXPECT_EQ(bus.rootHubDefault(3), kHardWiredOnly);
    });
    gate->look();
    EXPECT_GT(reads, 0);
    // How many are out is known without asking them.
    reads = 0;
    EXPECT_EQ(gate->countRefused(), 0U);
    EXPECT_EQ(reads, 0);
    EXPECT_EQ(pathsOnDisk(), std::set<std::string>{"pci0 1"});
}

TEST_F(UsbGateTest, DeviceThatHasNotSaidAllIsKeptWhenItHas) {
    bus.plug("1-1", aMouse());
    bus.plug("1-2", aDisk());
    bus.setBusy("1-1");
    gate->keepDevices();
    gate->setLocked(true);
    EXPECT_EQ(pathsOnDisk(), std::set<std::string>{"pci0 2"});
    EXPECT_EQ(gate->nextLook(), now + GatePolicy::kRetryTime);
    // Nothing that is tried again keeps the gate open.
    gate->setClosed(true);
    EXPECT_EQ(bus.rootHubDefault(1), kHardWiredOnly);
    bus.setBusy("1-1", false);
    now += GatePolicy::kRetryTime;
    gate->look();
    EXPECT_EQ(pathsOnDisk(), (std::set<std::string>{"pci0 1", "pci0 2"}));
    EXPECT_EQ(gate->nextLook(), std::nullopt);
    EXPECT_TRUE(bus.isAuthorized("1-1"));
}

TEST_F(UsbGateTest, DeviceThatHasNotSaidAllIsLookedAtAgainAlsoWhenItComesWhileTheGateIsOpen) {
    gate->keepDevices();
    gate->setLocked(true);
    const int before = rearmed;
    bus.setBusy("1-1");
    bus.plug("1-1", aMouse());
    EXPECT_EQ(gate->nextLook(), now + GatePolicy::kRetryTime);
    EXPECT_GT(rearmed, before);
    gate->setLocked(false);
    EXPECT_EQ(gate->nextLook(), std::nullopt);
}

TEST_F(UsbGateTest, RefusedDeviceThatHasNotSaidAllIsNamedByWhatIsKnown) {
    gate->setClosed(true);
    log.take();
    bus.setBusy("1-1");
    bus.plug("1-1", aDisk());
    EXPECT_EQ(log.take(), Lines{"keystrand: refused 1-1 (1111:2222 busy, classes 08/06/50)"});
}

TEST_F(UsbGateTest, RefusedDeviceIsWaitedForShortlyForItsNames) {
    gate->setClosed(true);
    log.take();
    int looks = 0;
    bus.setBusy("1-1");
    bus.setHanging([&] {
        now += 100ms;
        bus.setBusy("1-1", ++looks < 10);
    });
    bus.plug("1-1", aDisk());
    EXPECT_EQ(log.take(),
              Lines{R"(keystrand: refused 1-1 (1111:2222 "maker" "disk", classes 08/06/50))"});
    // Not for ever, and not again when that is told.
    bus.setBusy("1-2");
    bus.setHanging([&] { now += 100ms; });
    const BootTime began = now;
    bus.plug("1-2", aDisk());
    EXPECT_LE(now, began + 3s);
    EXPECT_EQ(log.take(), Lines{"keystrand: refused 1-2 (1111:2222 busy, classes 08/06/50)"});
    const BootTime told = now;
    gate->look();
    EXPECT_LE(now, told + 200ms);
}

TEST_F(UsbGateTest, NoNamesAreWaitedForWhileSomethingNewIsIn) {
    gate->setClosed(true);
    bus.watch(nullptr);
    bus.setRootHubDefault(1, kEverybody);
    bus.plug("1-1", aDisk());
    bus.setRootHubDefault(1, kHardWiredOnly);
    bus.setBusy("1-2");
    bus.plug("1-2", aDisk());
    int looks = 0;
    bus.setHanging([&] { looks += bus.isAuthorized("1-1") ? 1 : 0; });
    gate->look();
    EXPECT_FALSE(bus.isAuthorized("1-1"));
    EXPECT_EQ(looks, 1);
}

TEST_F(UsbGateTest, WhatCouldNotBeClosedIsNamedAndTriedAgain) {
    bus.plug("1-1", aMouse());
    bus.failDefaults();
    gate->setClosed(true);
    EXPECT_EQ(log.take(),
              (Lines{"keystrand: the parameter authorized_default cannot be set to 2: "
                     "Input/output error",
                     "keystrand: root hub usb1 cannot be set to 2: Input/output error",
                     "keystrand: root hub usb2 cannot be set to 2: Input/output error",
                     "keystrand: the gate is closed, but for the parameter authorized_default, "
                     "root hub usb1, root hub usb2"}));
    EXPECT_EQ(gate->gap(), "the parameter authorized_default, root hub usb1, root hub usb2");
    EXPECT_EQ(gate->nextLook(), now + 10s);
    now += 10s;
    gate->look();
    EXPECT_EQ(log.take(), Lines());
    bus.failDefaults(false);
    now += 10s;
    gate->look();
    EXPECT_EQ(log.take(), Lines{"keystrand: the gate is closed"});
    EXPECT_EQ(gate->gap(), "");
    EXPECT_EQ(bus.rootHubDefault(2), kHardWiredOnly);
    EXPECT_EQ(gate->nextLook(), std::nullopt);
}

TEST_F(UsbGateTest, DeviceThatCannotBeRefusedIsNamed) {
    gate->setClosed(true);
    bus.failWrites(1);
    log.take();
    bus.watch(nullptr);
    bus.setRootHubDefault(1, kEverybody);
    bus.plug("1-1", aDisk());
    gate->look();
    EXPECT_EQ(log.take(),
              (Lines{R"(keystrand: cannot refuse 1-1 (1111:2222 "maker" "disk", classes )"
                     R"(08/06/50): Input/output error)",
                     "keystrand: the gate is closed, but for device 1-1"}));
    now += 10s;
    gate->look();
    EXPECT_EQ(log.take(), (Lines{R"(keystrand: refused 1-1 (1111:2222 "maker" "disk", classes )"
                                 R"(08/06/50))",
                                 "keystrand: the gate is closed"}));
}

TEST_F(UsbGateTest, WhatCouldNotBePutBackIsNamed) {
    gate->setClosed(true);
    log.take();
    bus.failDefaults();
    gate->setClosed(false);
    EXPECT_EQ(log.take().back(),
              "keystrand: the gate is open, but for the parameter authorized_default, "
              "root hub usb1, root hub usb2");
    EXPECT_EQ(gate->gap(), "the parameter authorized_default, root hub usb1, root hub usb2");
    EXPECT_FALSE(gate->isOpen());
    EXPECT_TRUE(bus.isWatched());
    log.take();
    bus.failDefaults(false);
    now += 10s;
    gate->look();
    EXPECT_EQ(log.take(), Lines{"keystrand: the gate is open"});
    EXPECT_TRUE(gate->isOpen());
    open();
    EXPECT_FALSE(bus.isWatched());
    EXPECT_EQ(recordOnDisk(), GateRecord());
}

TEST_F(UsbGateTest, UsbThatComesWhenTheGateIsToBeOpenAgainIsLeftAlone) {
    bus.setMissing(true);
    gate->setClosed(true);
    gate->setClosed(false);
    EXPECT_FALSE(bus.isWatched());
    bus.setMissing(false);
    bus.addRootHub(2);
    gate->look();
    EXPECT_EQ(bus.writes(), std::vector<std::string>());
}

TEST_F(UsbGateTest, NothingIsWatchedWhileTheMachineIsUnlocked) {
    EXPECT_FALSE(bus.isWatched());
    gate->setLocked(true);
    EXPECT_TRUE(bus.isWatched());
    gate->setClosed(true);
    gate->setLocked(false);
    EXPECT_TRUE(bus.isWatched());
    open();
    EXPECT_FALSE(bus.isWatched());
    EXPECT_EQ(gate->nextLook(), std::nullopt);
}

TEST_F(UsbGateTest, WhatCameWithoutAServiceIsLookedAtByTheNextOne) {
    gate->setClosed(true);
    gate.reset();
    bus.plug("1-1", aDisk());
    bus.setAuthorized("1-1", true);
    bus.plug("1-2", aDisk());
    log.take();
    start();
    gate->setClosed(true);
    EXPECT_FALSE(bus.isAuthorized("1-1"));
    EXPECT_EQ(log.take(),
              (Lines{R"(keystrand: refused 1-1 (1111:2222 "maker" "disk", classes 08/06/50))",
                     R"(keystrand: refused 1-2 (1111:2222 "maker" "disk", classes 08/06/50))"}));
}

TEST_F(UsbGateTest, WhatAnEarlierServiceBeganToOpenIsOpened) {
    gate->setClosed(true);
    bus.plug("1-1", aDisk());
    int left = 4;
    const std::function<void()> kill = [&] {
        if (--left == 0) {
            throw Killed();
        }
        bus.setMeanwhile(kill);
    };
    bus.setMeanwhile(kill);
    EXPECT_THROW(gate->setClosed(false), Killed);
    bus.setMeanwhile(nullptr);
    const auto kept = start();
    ASSERT_TRUE(kept);
    ASSERT_EQ(kept->gate.phase, GateState::Phase::opening);
    open();
    EXPECT_EQ(bus.rootHubDefault(2), kEverybody);
    EXPECT_TRUE(bus.isAuthorized("1-1"));
    EXPECT_TRUE(gate->isOpen());
}

TEST_F(UsbGateTest, WhatWasRefusedBeforeItOpensAndIsSeenAfterwardsComesIn) {
    gate->setClosed(true);
    bus.plugUnseen("1-1", aDisk());
    gate->setClosed(false);
    log.take();
    bus.show("1-1");
    EXPECT_EQ(log.take(),
              Lines{"keystrand: accepted 1-1 (1111:2222 \"maker\" \"disk\", classes 08/06/50): "
                    "the gate is open again"});
    // The kernel lets in what comes from here on; an event that nobody wanted ends the watch, too.
    now += GatePolicy::kLateTime;
    bus.plug("1-2", aDisk());
    EXPECT_FALSE(bus.isWatched());
    EXPECT_EQ(log.take(), Lines());
}

TEST_F(UsbGateTest, UsbThatCannotBeSeenDoesNotKeepItBusy) {
    gate->setClosed(true);
    // Looked behind for a keyboard.
    bus.plug("1-1", aHub());
    now = gate->nextLook().value();
    bus.setUnreadable(true);
    gate->look();
    EXPECT_EQ(gate->nextLook(), now + GatePolicy::kRetryTime);
    bus.setUnreadable(false);
    gate->look();
    gate->setClosed(false);
    bus.setUnreadable(true);
    now = gate->nextLook().value();
    gate->look();
    EXPECT_EQ(gate->nextLook(), std::nullopt);
    EXPECT_FALSE(bus.isWatched());
}

TEST_F(UsbGateTest, DevicesThatAreInAreKeptWhileLocked) {
    bus.plug("1-1", aMouse());
    gate->setLocked(true);
    EXPECT_EQ(pathsOnDisk(), std::set<std::string>());
    gate->keepDevices();
    EXPECT_EQ(pathsOnDisk(), std::set<std::string>{"pci0 1"});
    bus.plug("2-1", aDisk());
    EXPECT_EQ(pathsOnDisk(), (std::set<std::string>{"pci0 1", "pci1 1"}));
    gate->setClosed(true);
    bus.plug("2-2", aDisk());
    bus.unplug("1-1");
    EXPECT_EQ(pathsOnDisk(), std::set<std::string>{"pci1 1"});
    gate->setClosed(false);
    gate->setLocked(false);
    bus.plug("1-1", aMouse());
    EXPECT_EQ(pathsOnDisk(), (std::set<std::string>{"pci1 1", "pci1 2"}));
}

TEST_F(UsbGateTest, AfterARestartOnlyWhatWasThereStays) {
    bus.plug("1-1", aMouse());
    bus.plug("2-1", aDisk());
    gate->setLocked(true);
    gate->keepDevices();
    gate->setClosed(true);
    // The machine is off: buses may be counted in another order, and a device is added.
    std::string problem;
    ASSERT_TRUE(record.remove(problem));
    FakeUsbBus next;
    next.addRootHub(1, "pci1");
    next.addRootHub(2, "pci0");
    next.plug("1-1", aDisk());
    next.plug("2-1", aMouse());
    next.plug("2-2", aDisk());
    Plug changed = aDisk();
    changed.serial = "other";
    next.plug("1-2", changed);
    UsbGate after(UsbGate::Parts{.bus = next,
                                 .record = record,
                                 .devices = devices,
                                 .log = log,
                                 .now = [this] { return now; },
                                 .rearm =
                                     [] {
                                     }},
                  GateRules{});
    EXPECT_EQ(after.resume(), std::nullopt);
    after.setClosed(true);
    EXPECT_TRUE(next.isAuthorized("2-2"));
    after.keepOnlyKnown();
    EXPECT_TRUE(next.isAuthorized("1-1"));
    EXPECT_TRUE(next.isAuthorized("2-1"));
    EXPECT_FALSE(next.isAuthorized("2-2"));
    EXPECT_FALSE(next.isAuthorized("1-2"));
    // The disk that was there takes its time.
    next.unplug("1-1");
    after.look();
    log.take();
    next.plug("1-1", aDisk());
    after.look();
    EXPECT_TRUE(next.isAuthorized("1-1"));
    EXPECT_EQ(log.take(), Lines{R"(keystrand: accepted 1-1 (1111:2222 "maker" "disk", classes )"
                                R"(08/06/50): it was attached when the machine went off)"});
}

TEST_F(UsbGateTest, AfterARestartWhatHasNotSaidAllIsWaitedForShortly) {
    bus.plug("1-1", aDisk());
    bus.plug("1-2", aDisk());
    gate->keepDevices();
    gate->setLocked(true);
    std::string problem;
    ASSERT_TRUE(record.remove(problem));
    start();
    gate->setClosed(true);
    bus.setBusy("1-1");
    bus.setBusy("1-2");
    int looks = 0;
    bus.setHanging([&] {
        now += 100ms;
        bus.setBusy("1-1", ++looks < 10);
    });
    const BootTime began = now;
    gate->keepOnlyKnown();
    EXPECT_TRUE(bus.isAuthorized("1-1"));
    EXPECT_FALSE(bus.isAuthorized("1-2"));
    EXPECT_LE(now, began + 6s);
    // It comes in as soon as it has.
    bus.setBusy("1-2", false);
    now = gate->nextLook().value();
    gate->look();
    EXPECT_TRUE(bus.isAuthorized("1-2"));
}

TEST_F(UsbGateTest, WithoutAListNothingIsTaken) {
    bus.plug("1-1", aDisk());
    gate->setClosed(true);
    log.take();
    gate->keepOnlyKnown();
    EXPECT_TRUE(bus.isAuthorized("1-1"));
    EXPECT_EQ(log.take(), Lines{"keystrand: " + devices.path() +
                                ": there is none; what is attached counts as accepted"});
}

TEST_F(UsbGateTest, AdministratorAcceptsWhatWasListed) {
    gate->setClosed(true);
    bus.plug("1-1", aDisk());
    const auto listed = gate->list();
    ASSERT_EQ(listed.size(), 1U);
    EXPECT_EQ(listed[0].standing, Standing::refused);
    EXPECT_EQ(listed[0].since, now);
    EXPECT_EQ(gate->accept(listed[0].device.attachment), std::nullopt);
    EXPECT_TRUE(bus.isAuthorized("1-1"));
    EXPECT_EQ(gate->accept(listed[0].device.attachment), "the device is accepted already");
    bus.replug("1-1");
    EXPECT_EQ(gate->accept(listed[0].device.attachment), "the device is not there any more");
    // With an open gate, too: somebody else may have refused it.
    gate->setClosed(false);
    bus.setAuthorized("1-1", false);
    EXPECT_EQ(gate->list()[0].standing, std::nullopt);
    EXPECT_EQ(gate->accept(bus.attachmentAt("1-1")), std::nullopt);
    EXPECT_TRUE(bus.isAuthorized("1-1"));
}

TEST_F(UsbGateTest, AcceptanceThatFailsIsTold) {
    gate->setClosed(true);
    bus.plug("1-1", aDisk());
    log.take();
    bus.failWrites(1);
    EXPECT_EQ(gate->accept(bus.attachmentAt("1-1")), "the device could not be accepted");
    EXPECT_EQ(log.take(),
              Lines{R"(keystrand: cannot accept 1-1 (1111:2222 "maker" "disk", classes )"
                    R"(08/06/50): Input/output error)"});
}

TEST_F(UsbGateTest, WhatIsRememberedIsInTheRecord) {
    gate->setClosed(true);
    gate->remember({.restricted = true, .openUntil = 1234us});
    const auto kept = start();
    ASSERT_TRUE(kept);
    EXPECT_TRUE(kept->service.restricted);
    EXPECT_EQ(kept->service.openUntil, 1234us);
    EXPECT_TRUE(gate->closed());
}

TEST_F(UsbGateTest, NextLookIsMadeKnown) {
    gate->setClosed(true);
    rearmed = 0;
    bus.plug("1-1", aHub());
    EXPECT_GE(rearmed, 1);
    EXPECT_EQ(gate->nextLook(), now + GatePolicy::kProbeTime);
    now += GatePolicy::kProbeTime;
    gate->look();
    EXPECT_FALSE(bus.isAuthorized("1-1"));
}

} // namespace
} // namespace keystrand::usb
