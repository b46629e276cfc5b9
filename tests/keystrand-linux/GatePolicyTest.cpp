// Who may come in, on a bus that behaves like the kernel's.

#include "tests/keystrand-linux/GateOnBus.h"

#include <gtest/gtest.h>

namespace keystrand::usb {
namespace {

using namespace std::chrono_literals;
using Writes = std::vector<std::string>;

class GatePolicyTest : public testing::Test {
  protected:
    GatePolicyTest() {
        bus.addRootHub(1);
        bus.addRootHub(2);
    }

    void with(const GateRules& rules) { gate.emplace(bus, rules); }

    /// And nothing is remembered any more when nothing can come late.
    void expectOpen() {
        EXPECT_TRUE(gate->policy.isPutBack());
        gate->pass(GatePolicy::kLateTime);
        EXPECT_EQ(gate->policy.state(), GateState());
        EXPECT_EQ(gate->policy.nextLook(), std::nullopt);
    }

    FakeUsbBus bus;
    std::optional<GateOnBus> gate{std::in_place, bus, GateRules{}};
};

TEST_F(GatePolicyTest, ParameterFirstThenEachRootHub) {
    gate->close();
    EXPECT_EQ(bus.writes(), (Writes{"parameter=2", "usb1=2", "usb2=2"}));
    bus.forgetWrites();
    gate->settle();
    EXPECT_EQ(bus.writes(), Writes());
    gate->open();
    EXPECT_EQ(bus.writes(), (Writes{"parameter=-1", "usb1=1", "usb2=1"}));
    expectOpen();
}

TEST_F(GatePolicyTest, HardWiredPortsAreClosedTooWhenTheRulesSaySo) {
    with({.internal = false});
    gate->close();
    EXPECT_EQ(bus.writes(), (Writes{"parameter=0", "usb1=0", "usb2=0"}));
    Plug plug = aMouse();
    plug.hardWired = true;
    bus.plug("1-1", plug);
    gate->settle();
    EXPECT_FALSE(bus.isAuthorized("1-1"));
}

TEST_F(GatePolicyTest, HardWiredPortsStayOpen) {
    gate->close();
    Plug plug = aMouse();
    plug.hardWired = true;
    bus.plug("1-1", plug);
    gate->settle();
    EXPECT_TRUE(bus.isAuthorized("1-1"));
    EXPECT_EQ(gate->standingAt("1-1"), Standing::hardWired);
}

TEST_F(GatePolicyTest, KernelThatKnowsTwoValuesGetsTheStricterOne) {
    bus.knowOnlyTwoValues();
    gate->close();
    EXPECT_EQ(bus.parameter(), kNobody);
    EXPECT_EQ(bus.rootHubDefault(1), kNobody);
    EXPECT_EQ(bus.rootHubDefault(2), kNobody);
    // What is known of one root hub is known of all.
    bus.addRootHub(3);
    bus.setRootHubDefault(3, kEverybody);
    bus.forgetWrites();
    gate->settle();
    EXPECT_EQ(bus.writes(), Writes{"usb3=0"});
    gate->open();
    EXPECT_EQ(bus.parameter(), kAsTheControllerHasIt);
    EXPECT_EQ(bus.rootHubDefault(1), kEverybody);
}

TEST_F(GatePolicyTest, WhatOthersLeftToHardWiredPortsIsLeftToThemAgain) {
    with({.internal = false});
    bus.setParameterDefault(kHardWiredOnly);
    bus.setRootHubDefault(1, kHardWiredOnly);
    gate->close();
    EXPECT_EQ(bus.rootHubDefault(1), kNobody);
    bus.addRootHub(3);
    bus.plug("1-1", aDisk());
    gate->settle();
    gate->open();
    EXPECT_EQ(bus.parameter(), kHardWiredOnly);
    EXPECT_EQ(bus.rootHubDefault(1), kHardWiredOnly);
    EXPECT_EQ(bus.rootHubDefault(3), kHardWiredOnly);
    EXPECT_FALSE(bus.isAuthorized("1-1"));
}

TEST_F(GatePolicyTest, HardWiredPortThatIsClosedTooGetsNothing) {
    with({.internal = false});
    Plug inside = aMouse();
    inside.hardWired = true;
    gate->meanwhile(1, [&] { bus.plug("1-1", inside); });
    gate->close();
    EXPECT_FALSE(bus.isAuthorized("1-1"));
}

TEST_F(GatePolicyTest, DefaultsThatCannotBeWrittenAreTriedAgain) {
    bus.failDefaults();
    gate->close();
    bus.plug("1-1", aDisk());
    gate->settle();
    // It came in, and is taken back.
    EXPECT_FALSE(bus.isAuthorized("1-1"));
    EXPECT_EQ(gate->policy.nextLook(), gate->now() + 10s);
    bus.failDefaults(false);
    gate->pass(10s - 1us);
    EXPECT_EQ(bus.rootHubDefault(1), kEverybody);
    gate->pass(1us);
    EXPECT_EQ(bus.parameter(), kHardWiredOnly);
    EXPECT_EQ(bus.rootHubDefault(1), kHardWiredOnly);
    EXPECT_EQ(gate->policy.nextLook(), std::nullopt);
    gate->open();
    EXPECT_TRUE(bus.isAuthorized("1-1"));
    expectOpen();
}

TEST_F(GatePolicyTest, DefaultsThatCannotBePutBackAreTriedAgain) {
    gate->close();
    bus.plug("1-1", aDisk());
    gate->settle();
    bus.failDefaults();
    gate->open();
    bus.addRootHub(3);
    gate->settle();
    EXPECT_EQ(bus.rootHubDefault(1), kHardWiredOnly);
    EXPECT_EQ(gate->policy.gaps(),
              (std::vector<std::string>{"the parameter authorized_default", "root hub usb1",
                                        "root hub usb2", "root hub usb3"}));
    // The first of them failed when it was opened.
    EXPECT_EQ(gate->policy.nextLook(), gate->now() + 10s);
    EXPECT_FALSE(gate->policy.isPutBack());
    bus.failDefaults(false);
    gate->pass(10s);
    EXPECT_EQ(bus.parameter(), kAsTheControllerHasIt);
    EXPECT_EQ(bus.rootHubDefault(1), kEverybody);
    EXPECT_EQ(bus.rootHubDefault(3), kEverybody);
    EXPECT_TRUE(bus.isAuthorized("1-1"));
    EXPECT_TRUE(gate->policy.isPutBack());
    gate->pass(GatePolicy::kLateTime);
    expectOpen();
    EXPECT_EQ(gate->policy.nextLook(), std::nullopt);
}

TEST_F(GatePolicyTest, DefaultsThatReadWhatTheyLikeAreNotWrittenWithoutEnd) {
    bus.ignoreDefaults();
    gate->close();
    EXPECT_EQ(bus.writes(),
              (Writes{"parameter=2", "usb1=2", "usb2=2", "parameter=0", "usb1=0", "usb2=0"}));
    gate->open();
    expectOpen();
}

TEST_F(GatePolicyTest, WhatIsAttachedStays) {
    bus.plug("1-1", aDisk());
    bus.plug("1-2", aHub());
    bus.plug("1-2.1", aMouse());
    gate->close();
    EXPECT_TRUE(bus.isAuthorized("1-1"));
    EXPECT_TRUE(bus.isAuthorized("1-2.1"));
    EXPECT_EQ(gate->standingAt("1-2.1"), Standing::attached);
}

TEST_F(GatePolicyTest, WhatComesIsRefusedAndTold) {
    gate->close();
    bus.plug("1-1", aDisk());
    bus.plug("1-2", aMouse());
    gate->settle();
    EXPECT_FALSE(bus.isAuthorized("1-1"));
    EXPECT_EQ(gate->standingAt("1-1"), Standing::refused);
    EXPECT_EQ(gate->told, (Writes{"1-1 stays out", "1-2 stays out"}));
    gate->settle();
    EXPECT_EQ(gate->told.size(), 2U);
}

TEST_F(GatePolicyTest, WhatComesWhileTheGateClosesIsTakenBack) {
    bus.plug("1-1", aMouse());
    // After the first look: at the parameter's write, and once more at the first hub's.
    gate->meanwhile(1, [&] { bus.plug("1-2", aDisk()); });
    gate->meanwhile(2, [&] { bus.plug("2-2", aHub()); });
    gate->close();
    EXPECT_TRUE(bus.isAuthorized("1-1"));
    EXPECT_FALSE(bus.isAuthorized("1-2"));
    EXPECT_EQ(gate->standingAt("1-2"), Standing::refused);
    EXPECT_EQ(gate->standingAt("2-2"), Standing::probe);
    gate->pass(5s);
    EXPECT_FALSE(bus.isAuthorized("2-2"));
}

TEST_F(GatePolicyTest, DeviceThatReturnsIsNew) {
    bus.plug("1-1", aDisk());
    gate->close();
    bus.replug("1-1");
    gate->settle();
    EXPECT_FALSE(bus.isAuthorized("1-1"));
    EXPECT_EQ(gate->standingAt("1-1"), Standing::refused);
}

TEST_F(GatePolicyTest, DeviceWithTheNumberOfAnAttachedOneIsNew) {
    bus.plug("1-1", aDisk());
    gate->close();
    for (int again = 0; again < 127; ++again) {
        bus.replug("1-1");
    }
    const auto first = gate->policy.state().devices.front().attachment;
    ASSERT_EQ(bus.attachmentAt("1-1").number, first.number);
    gate->settle();
    EXPECT_EQ(gate->standingAt("1-1"), Standing::refused);
}

TEST_F(GatePolicyTest, NewRootHubsAreClosed) {
    gate->close();
    // Its devices were decided by the parameter.
    bus.addRootHub(3);
    bus.plug("3-1", aDisk());
    gate->settle();
    EXPECT_FALSE(bus.isAuthorized("3-1"));
    EXPECT_EQ(bus.rootHubDefault(3), kHardWiredOnly);
    // A hub that comes open all the same.
    bus.addRootHub(4);
    bus.setRootHubDefault(4, kEverybody);
    bus.plug("4-1", aDisk());
    gate->settle();
    EXPECT_EQ(bus.rootHubDefault(4), kHardWiredOnly);
    EXPECT_FALSE(bus.isAuthorized("4-1"));
    gate->open();
    EXPECT_EQ(bus.rootHubDefault(3), kEverybody);
    EXPECT_EQ(bus.rootHubDefault(4), kEverybody);
    EXPECT_TRUE(bus.isAuthorized("3-1"));
    EXPECT_TRUE(bus.isAuthorized("4-1"));
}

TEST_F(GatePolicyTest, RootHubThatGoesIsForgotten) {
    gate->close();
    bus.removeRootHub(2);
    gate->settle();
    EXPECT_EQ(gate->policy.state().hubs.size(), 1U);
    gate->open();
    expectOpen();
}

TEST_F(GatePolicyTest, RefusedAreLetInWhenItOpensHubsFirst) {
    bus.plug("1-9", aKeyboard());
    gate->close();
    bus.plug("1-1", aDisk());
    bus.plug("1-2", aHub());
    bus.plug("1-2.1", aDisk());
    gate->settle();
    bus.forgetWrites();
    gate->open();
    EXPECT_EQ(bus.writes(), (Writes{"parameter=-1", "usb1=1", "usb2=1", "1-2=1", "1-1=1"}));
    EXPECT_TRUE(bus.isAuthorized("1-2.1"));
}

TEST_F(GatePolicyTest, RefusedStayOutWhenTheyAreToBePluggedAgain) {
    with({.onUnlock = OnUnlock::replug});
    gate->close();
    bus.plug("1-1", aDisk());
    gate->settle();
    gate->open();
    EXPECT_FALSE(bus.isAuthorized("1-1"));
    bus.replug("1-1");
    EXPECT_TRUE(bus.isAuthorized("1-1"));
}

TEST_F(GatePolicyTest, WhatIsRefusedBetweenTheLookAndTheWriteIsLetIn) {
    gate->close();
    gate->meanwhile(1, [&] { bus.plug("1-1", aDisk()); });
    gate->open();
    EXPECT_TRUE(bus.isAuthorized("1-1"));
    expectOpen();
}

TEST_F(GatePolicyTest, WhatOthersRefuseWhenItOpensIsTheirs) {
    bus.setRootHubDefault(1, kNobody);
    gate->close();
    gate->policy.open();
    gate->settle();
    bus.plug("1-1", aDisk());
    gate->settle();
    EXPECT_FALSE(bus.isAuthorized("1-1"));
}

TEST_F(GatePolicyTest, WhatSomebodyElseOpenedIsClosedWhenItClosesAgain) {
    gate->close();
    gate->policy.open();
    bus.setRootHubDefault(1, kEverybody);
    gate->close();
    EXPECT_EQ(bus.rootHubDefault(1), kHardWiredOnly);
    EXPECT_EQ(bus.parameter(), kHardWiredOnly);
}

TEST_F(GatePolicyTest, KeyboardThatCouldNotBeAcceptedIsLetInWhenItOpens) {
    gate->close();
    bus.failWrites(1);
    bus.plug("1-1", aKeyboard());
    gate->settle();
    EXPECT_FALSE(bus.isAuthorized("1-1"));
    gate->open();
    EXPECT_TRUE(bus.isAuthorized("1-1"));
}

TEST_F(GatePolicyTest, OnlyWhatItRefusedItselfIsLetIn) {
    bus.plug("1-1", aDisk());
    bus.setAuthorized("1-1", false);
    gate->close();
    gate->settle();
    EXPECT_EQ(gate->standingAt("1-1"), Standing::refusedByOthers);
    gate->open();
    EXPECT_FALSE(bus.isAuthorized("1-1"));
}

TEST_F(GatePolicyTest, HubsThatOthersClosedStayAsTheyAre) {
    bus.setRootHubDefault(1, kNobody);
    bus.setParameterDefault(kNobody);
    gate->close();
    EXPECT_EQ(bus.writes(), (Writes{"usb2=2"}));
    bus.plug("1-1", aDisk());
    bus.plug("1-2", aKeyboard());
    bus.plug("1-3", aHub());
    bus.plug("2-1", aDisk());
    Plug inside = aDisk();
    inside.hardWired = true;
    bus.plug("1-4", inside);
    gate->settle();
    // Not even a keyboard in somebody else's place, nor a hub to look for one.
    EXPECT_FALSE(bus.isAuthorized("1-2"));
    EXPECT_FALSE(bus.isAuthorized("1-3"));
    gate->open();
    EXPECT_FALSE(bus.isAuthorized("1-4"));
    EXPECT_EQ(bus.rootHubDefault(1), kNobody);
    EXPECT_EQ(bus.parameter(), kNobody);
    EXPECT_FALSE(bus.isAuthorized("1-1"));
    EXPECT_TRUE(bus.isAuthorized("2-1"));
}

TEST_F(GatePolicyTest, HubsThatOthersClosedInTheSameWayStayAsTheyAre) {
    for (const bool internal : {true, false}) {
        with({.internal = internal});
        const AuthorizedDefault closed = internal ? kHardWiredOnly : kNobody;
        bus.setRootHubDefault(1, closed);
        gate->close();
        bus.plug("1-1", aDisk());
        gate->settle();
        gate->open();
        EXPECT_EQ(bus.rootHubDefault(1), closed);
        EXPECT_EQ(bus.rootHubDefault(2), kEverybody);
        EXPECT_FALSE(bus.isAuthorized("1-1"));
        bus.unplug("1-1");
    }
}

TEST_F(GatePolicyTest, WhatSomebodyElseWroteMeanwhileStays) {
    gate->close();
    bus.setRootHubDefault(1, kNobody);
    bus.setParameterDefault(kNobody);
    gate->settle();
    gate->open();
    EXPECT_EQ(bus.rootHubDefault(1), kNobody);
    EXPECT_EQ(bus.parameter(), kNobody);
    EXPECT_EQ(bus.rootHubDefault(2), kEverybody);
}

TEST_F(GatePolicyTest, WhatSomebodyElseLetInStays) {
    gate->close();
    bus.plug("1-1", aDisk());
    gate->settle();
    bus.setAuthorized("1-1", true);
    gate->settle();
    EXPECT_TRUE(bus.isAuthorized("1-1"));
    EXPECT_EQ(gate->standingAt("1-1"), Standing::letInByOthers);
}

TEST_F(GatePolicyTest, OneKeyboardWhileThereIsNone) {
    gate->close();
    bus.plug("1-1", aKeyboardWithDisk());
    bus.plug("1-2", aKeyboard());
    bus.plug("1-3", aKeyboard());
    gate->settle();
    EXPECT_FALSE(bus.isAuthorized("1-1"));
    EXPECT_TRUE(bus.isAuthorized("1-2"));
    EXPECT_EQ(gate->standingAt("1-2"), Standing::keyboard);
    EXPECT_FALSE(bus.isAuthorized("1-3"));
    // It goes, and the other one may come in.
    bus.unplug("1-2");
    gate->settle();
    EXPECT_TRUE(bus.isAuthorized("1-3"));
}

TEST_F(GatePolicyTest, NoKeyboardBesideAnAttachedOne) {
    // Whatever else it can do, somebody can type on it.
    bus.plug("1-1", aKeyboardWithDisk());
    gate->close();
    bus.plug("1-2", aKeyboard());
    bus.plug("1-3", aHub());
    gate->settle();
    EXPECT_FALSE(bus.isAuthorized("1-2"));
    EXPECT_FALSE(bus.isAuthorized("1-3"));
}

TEST_F(GatePolicyTest, KeyboardThatSomebodyTookAwayIsNone) {
    bus.plug("1-1", aKeyboard());
    gate->close();
    bus.setAuthorized("1-1", false);
    bus.plug("1-2", aKeyboard());
    gate->settle();
    EXPECT_FALSE(bus.isAuthorized("1-1"));
    EXPECT_TRUE(bus.isAuthorized("1-2"));
}

TEST_F(GatePolicyTest, KeyboardThatIsToGoIsNone) {
    gate->meanwhile(1, [&] { bus.plug("1-1", aKeyboardWithDisk()); });
    bus.failWrites(1);
    gate->close();
    ASSERT_TRUE(bus.isAuthorized("1-1"));
    bus.plug("1-2", aKeyboard());
    gate->settle();
    EXPECT_TRUE(bus.isAuthorized("1-2"));
}

TEST_F(GatePolicyTest, KeyboardThatCannotBeAcceptedIsGivenUp) {
    gate->close();
    bus.failWrites(1000);
    bus.plug("1-1", aKeyboard());
    gate->settle();
    EXPECT_FALSE(bus.isAuthorized("1-1"));
    // The next one has its chance.
    bus.failWrites(0);
    bus.plug("1-2", aKeyboard());
    gate->settle();
    EXPECT_TRUE(bus.isAuthorized("1-2"));
    EXPECT_FALSE(bus.isAuthorized("1-1"));
}

TEST_F(GatePolicyTest, NoKeyboardForAPortableMachine) {
    with({.keyboardBuiltIn = true});
    gate->close();
    bus.plug("1-2", aKeyboard());
    gate->settle();
    EXPECT_FALSE(bus.isAuthorized("1-2"));
}

TEST_F(GatePolicyTest, NoKeyboardEver) {
    with({.keyboards = KeyboardRule::never});
    gate->close();
    bus.plug("1-2", aKeyboard());
    bus.plug("1-3", aHub());
    gate->settle();
    EXPECT_FALSE(bus.isAuthorized("1-2"));
    EXPECT_FALSE(bus.isAuthorized("1-3"));
}

TEST_F(GatePolicyTest, EveryKeyboard) {
    with({.keyboards = KeyboardRule::always, .keyboardBuiltIn = true});
    gate->close();
    bus.plug("1-2", aKeyboard());
    bus.plug("1-3", aKeyboard());
    gate->settle();
    EXPECT_TRUE(bus.isAuthorized("1-2"));
    EXPECT_TRUE(bus.isAuthorized("1-3"));
}

TEST_F(GatePolicyTest, WhatOnlyLooksLikeAKeyboardIsNone) {
    with({.notKeyboards = {{0x1111, 0x2222}}});
    bus.plug("1-1", aKeyboard());
    gate->close();
    bus.plug("1-2", aKeyboard());
    Plug other = aKeyboard();
    other.product = 0x2223;
    bus.plug("1-3", other);
    gate->settle();
    EXPECT_FALSE(bus.isAuthorized("1-2"));
    EXPECT_TRUE(bus.isAuthorized("1-3"));
}

TEST_F(GatePolicyTest, HubIsLetInToLookForAKeyboard) {
    gate->close();
    bus.plug("1-1", aHub());
    bus.plug("1-1.1", aDisk());
    gate->settle();
    EXPECT_TRUE(bus.isAuthorized("1-1"));
    EXPECT_FALSE(bus.isAuthorized("1-1.1"));
    EXPECT_EQ(gate->policy.nextLook(), gate->now() + 5s);
    gate->pass(5s - 1us);
    EXPECT_TRUE(bus.isAuthorized("1-1"));
    gate->pass(1us);
    EXPECT_FALSE(bus.isAuthorized("1-1"));
    EXPECT_EQ(gate->standingAt("1-1"), Standing::refused);
    // Once.
    gate->pass(10s);
    EXPECT_FALSE(bus.isAuthorized("1-1"));
    EXPECT_EQ(gate->policy.nextLook(), std::nullopt);
}

TEST_F(GatePolicyTest, KeyboardKeepsTheHubsAboveIt) {
    gate->close();
    bus.plug("1-1", aHub());
    bus.plug("1-1.2", aHub());
    gate->settle();
    gate->pass(4s);
    bus.plug("1-1.2.3", aKeyboard());
    gate->settle();
    gate->pass(10s);
    EXPECT_TRUE(bus.isAuthorized("1-1.2.3"));
    EXPECT_EQ(gate->standingAt("1-1"), Standing::keyboardHub);
    EXPECT_EQ(gate->standingAt("1-1.2"), Standing::keyboardHub);
    // Not longer than it is there.
    bus.unplug("1-1.2.3");
    gate->settle();
    EXPECT_TRUE(bus.isAuthorized("1-1"));
    gate->pass(5s);
    EXPECT_FALSE(bus.isAuthorized("1-1"));
}

TEST_F(GatePolicyTest, WhatTheMachineWorksWithIsNeverTaken) {
    with({.keyboards = KeyboardRule::never});
    // It came in while the gate was closing, and was mounted at once.
    gate->meanwhile(1, [&] {
        bus.plug("1-1", aHub());
        bus.plug("1-1.1", aDisk());
        bus.use("1-1.1");
    });
    gate->close();
    EXPECT_TRUE(bus.isAuthorized("1-1.1"));
    EXPECT_EQ(gate->standingAt("1-1"), Standing::inUse);
    EXPECT_EQ(gate->standingAt("1-1.1"), Standing::inUse);
}

TEST_F(GatePolicyTest, RefusalThatFailedIsTriedAgain) {
    gate->meanwhile(1, [&] { bus.plug("1-1", aDisk()); });
    bus.failWrites(2);
    gate->close();
    EXPECT_TRUE(bus.isAuthorized("1-1"));
    EXPECT_EQ(gate->policy.nextLook(), gate->now() + GatePolicy::kRetryTime);
    gate->pass(GatePolicy::kRetryTime - 1us);
    EXPECT_TRUE(bus.isAuthorized("1-1"));
    gate->pass(1us);
    EXPECT_TRUE(bus.isAuthorized("1-1"));
    gate->pass(GatePolicy::kRetryTime);
    EXPECT_FALSE(bus.isAuthorized("1-1"));
    EXPECT_EQ(gate->standingAt("1-1"), Standing::refused);
}

TEST_F(GatePolicyTest, DeviceThatVanishesInTheMiddleIsNoError) {
    gate->close();
    bus.plug("1-1", aKeyboard());
    gate->meanwhile(1, [&] { bus.unplug("1-1"); });
    gate->settle();
    EXPECT_EQ(gate->policy.state().devices, std::vector<KnownDevice>());
}

TEST_F(GatePolicyTest, AdministratorsWord) {
    gate->close();
    bus.plug("1-1", aDisk());
    gate->settle();
    const Attachment seen = bus.attachmentAt("1-1");
    EXPECT_TRUE(gate->policy.accept(seen, gate->now()));
    gate->settle();
    EXPECT_TRUE(bus.isAuthorized("1-1"));
    EXPECT_EQ(gate->standingAt("1-1"), Standing::administrator);
    EXPECT_FALSE(gate->policy.accept(seen, gate->now()));
    // The device that was seen, not its port.
    bus.replug("1-1");
    gate->settle();
    EXPECT_FALSE(gate->policy.accept(seen, gate->now()));
    EXPECT_FALSE(bus.isAuthorized("1-1"));
}

TEST_F(GatePolicyTest, OnlyWhatIsKnownStays) {
    bus.plug("1-1", aDisk());
    bus.plug("1-2", aDisk());
    bus.plug("1-3", aKeyboard());
    Plug inside = aMouse();
    inside.hardWired = true;
    bus.plug("1-4", inside);
    bus.plug("1-5", aKeyboardWithDisk());
    bus.plug("1-6", aDisk());
    bus.use("1-6");
    gate->close();
    gate->keepOnly([](const UsbDevice& device) { return device.port() == "1-2"; });
    EXPECT_FALSE(bus.isAuthorized("1-1"));
    EXPECT_TRUE(bus.isAuthorized("1-2"));
    EXPECT_TRUE(bus.isAuthorized("1-3"));
    EXPECT_TRUE(bus.isAuthorized("1-4"));
    EXPECT_FALSE(bus.isAuthorized("1-5"));
    EXPECT_TRUE(bus.isAuthorized("1-6"));
    EXPECT_EQ(gate->standingAt("1-6"), Standing::inUse);
    gate->open();
    EXPECT_TRUE(bus.isAuthorized("1-1"));
}

TEST_F(GatePolicyTest, OnlyWhatWasAttachedIsHeldAgainstWhatIsKnown) {
    with({.notKeyboards = {{0x1111, 0x2222}}});
    bus.plug("1-1", aKeyboard());
    gate->close();
    bus.plug("1-2", aDisk());
    gate->settle();
    ASSERT_TRUE(gate->policy.accept(bus.attachmentAt("1-2"), gate->now()));
    gate->settle();
    gate->keepOnly([](const UsbDevice&) { return false; });
    // It only looks like a keyboard.
    EXPECT_FALSE(bus.isAuthorized("1-1"));
    EXPECT_EQ(gate->standingAt("1-2"), Standing::administrator);
    EXPECT_TRUE(bus.isAuthorized("1-2"));
}

TEST_F(GatePolicyTest, UnknownHubStaysForTheKeyboardBehindIt) {
    bus.plug("1-1", aHub());
    bus.plug("1-1.1", aKeyboard());
    bus.plug("1-2", aHub());
    gate->close();
    gate->keepOnly([](const UsbDevice&) { return false; });
    EXPECT_TRUE(bus.isAuthorized("1-1.1"));
    EXPECT_EQ(gate->standingAt("1-1"), Standing::keyboardHub);
    EXPECT_FALSE(bus.isAuthorized("1-2"));
}

TEST_F(GatePolicyTest, WhatIsKnownComesInALittleLate) {
    gate->close();
    bus.plug("1-1", aDisk());
    bus.plug("1-2", aDisk());
    gate->settle();
    EXPECT_EQ(gate->standingAt("1-1"), Standing::refused);
    gate->keepOnly([](const UsbDevice& device) { return device.port() != "1-2"; });
    EXPECT_EQ(gate->standingAt("1-1"), Standing::returned);
    EXPECT_TRUE(bus.isAuthorized("1-1"));
    EXPECT_FALSE(bus.isAuthorized("1-2"));
    gate->pass(GatePolicy::kReturnTime - BootTime(1));
    bus.plug("1-3", aHub());
    bus.plug("1-3.1", aDisk());
    gate->settle();
    EXPECT_EQ(gate->standingAt("1-3.1"), Standing::returned);
    EXPECT_TRUE(bus.isAuthorized("1-3.1"));
    gate->pass(BootTime(1));
    bus.plug("1-4", aDisk());
    gate->settle();
    EXPECT_EQ(gate->standingAt("1-4"), Standing::refused);
    EXPECT_FALSE(bus.isAuthorized("1-4"));
    EXPECT_FALSE(bus.isAuthorized("1-2"));
}

TEST_F(GatePolicyTest, WhatOthersKeepOutIsNotLetInForBeingKnown) {
    bus.setRootHubDefault(1, kNobody);
    gate->close();
    gate->keepOnly([](const UsbDevice&) { return true; });
    bus.plug("1-1", aDisk());
    gate->settle();
    EXPECT_FALSE(bus.isAuthorized("1-1"));
}

TEST_F(GatePolicyTest, NextServiceRefusesAtOnceWhatWasToBeRefused) {
    gate->meanwhile(1, [&] { bus.plug("1-1", aDisk()); });
    bus.failWrites(1);
    gate->close();
    ASSERT_TRUE(bus.isAuthorized("1-1"));
    const GateState left = gate->policy.state();
    with({});
    gate->policy.resume(left);
    gate->settle();
    EXPECT_FALSE(bus.isAuthorized("1-1"));
}

TEST_F(GatePolicyTest, NextServiceGoesOn) {
    bus.plug("1-1", aMouse());
    gate->close();
    bus.plug("1-2", aDisk());
    gate->settle();
    const GateState left = gate->policy.state();
    // What comes in between stays out by itself; somebody who lets one in has had the chance.
    bus.plug("1-3", aDisk());
    with({});
    gate->policy.resume(left);
    gate->settle();
    EXPECT_EQ(gate->standingAt("1-1"), Standing::attached);
    EXPECT_EQ(gate->standingAt("1-2"), Standing::refused);
    EXPECT_EQ(gate->standingAt("1-3"), Standing::refused);
    gate->open();
    EXPECT_TRUE(bus.isAuthorized("1-2"));
    EXPECT_TRUE(bus.isAuthorized("1-3"));
    EXPECT_EQ(bus.rootHubDefault(1), kEverybody);
    EXPECT_EQ(bus.parameter(), kAsTheControllerHasIt);
}

TEST_F(GatePolicyTest, NextServiceCarriesOutWhatWasOnlyDecided) {
    std::string problem;
    gate->policy.close(*bus.look(problem), gate->now());
    // The end came between the decision and the first write.
    static_cast<void>(gate->policy.decide(*bus.look(problem), gate->now()));
    const GateState left = gate->policy.state();
    bus.plug("1-1", aDisk());
    with({});
    gate->policy.resume(left);
    gate->settle();
    EXPECT_EQ(bus.rootHubDefault(1), kHardWiredOnly);
    EXPECT_FALSE(bus.isAuthorized("1-1"));
    gate->open();
    EXPECT_EQ(bus.rootHubDefault(1), kEverybody);
}

TEST_F(GatePolicyTest, NextServiceLetsInWhatWasStillToBeLetIn) {
    gate->close();
    bus.plug("1-1", aDisk());
    bus.plug("1-2", aMouse());
    gate->settle();
    gate->policy.open();
    // Each step in turn is the last one.
    int step = 0;
    for (bool goesOn = true; goesOn; ++step) {
        ASSERT_LT(step, 5);
        const GateState left = gate->policy.state();
        goesOn = gate->step();
        if (step == 1) {
            with({});
            gate->policy.resume(left);
        }
    }
    EXPECT_GT(step, 2);
    EXPECT_TRUE(gate->policy.isPutBack());
    EXPECT_TRUE(bus.isAuthorized("1-1"));
    EXPECT_TRUE(bus.isAuthorized("1-2"));
}

TEST_F(GatePolicyTest, NextServiceLetsInWhatWasRefusedBeforeAWriteThatIsNotNoted) {
    gate->close();
    // The service that went did not see them, nor the root hub.
    bus.plugUnseen("1-1", aDisk());
    bus.addRootHub(3);
    bus.plugUnseen("3-1", aDisk());
    gate->policy.open();
    std::string problem;
    for (const GateAction& action : gate->policy.decide(*bus.look(problem), gate->now())) {
        if (action.kind == GateAction::Kind::setRootHub) {
            static_cast<void>(bus.setRootHub(action.hub, action.value));
        } else {
            static_cast<void>(bus.setParameter(action.value));
        }
    }
    const GateState left = gate->policy.state();
    bus.show("1-1");
    bus.show("3-1");
    ASSERT_FALSE(bus.isAuthorized("1-1"));
    ASSERT_FALSE(bus.isAuthorized("3-1"));
    with({});
    gate->policy.resume(left);
    gate->settle();
    EXPECT_TRUE(bus.isAuthorized("1-1"));
    EXPECT_TRUE(bus.isAuthorized("3-1"));
}

TEST_F(GatePolicyTest, RefusedBeforeTheGateIsClosedAgainComesInWhenItOpens) {
    gate->close();
    bus.plugUnseen("1-1", aDisk());
    gate->policy.open();
    bus.show("1-1");
    gate->close();
    EXPECT_EQ(gate->standingAt("1-1"), Standing::refused);
    gate->open();
    EXPECT_TRUE(bus.isAuthorized("1-1"));
}

TEST_F(GatePolicyTest, ClosedAgainWhileItOpens) {
    gate->close();
    bus.plug("1-1", aDisk());
    gate->settle();
    gate->policy.open();
    gate->step();
    ASSERT_EQ(bus.parameter(), kAsTheControllerHasIt);
    gate->close();
    EXPECT_EQ(bus.parameter(), kHardWiredOnly);
    EXPECT_EQ(bus.rootHubDefault(1), kHardWiredOnly);
    EXPECT_FALSE(bus.isAuthorized("1-1"));
    gate->open();
    EXPECT_TRUE(bus.isAuthorized("1-1"));
    EXPECT_EQ(bus.rootHubDefault(1), kEverybody);
    EXPECT_EQ(bus.parameter(), kAsTheControllerHasIt);
}

TEST_F(GatePolicyTest, RefusedBeforeItOpensAndSeenAfterwards) {
    gate->close();
    bus.plugUnseen("1-1", aDisk());
    bus.plugUnseen("1-2", aHub());
    gate->open();
    EXPECT_TRUE(gate->policy.isPutBack());
    bus.show("1-1");
    ASSERT_FALSE(bus.isAuthorized("1-1"));
    gate->pass(GatePolicy::kLateTime - 1us);
    EXPECT_TRUE(bus.isAuthorized("1-1"));
    bus.show("1-2");
    gate->pass(1us);
    EXPECT_FALSE(bus.isAuthorized("1-2"));
    EXPECT_EQ(gate->policy.nextLook(), std::nullopt);
}

TEST_F(GatePolicyTest, SeenWhileItOpens) {
    gate->close();
    bus.plugUnseen("1-1", aDisk());
    gate->policy.open();
    ASSERT_TRUE(gate->step());
    ASSERT_EQ(bus.rootHubDefault(1), kEverybody);
    bus.show("1-1");
    gate->settle();
    EXPECT_TRUE(bus.isAuthorized("1-1"));
}

TEST_F(GatePolicyTest, WhatSomebodyElseRefusesAfterItOpenedStaysOut) {
    bus.setRootHubDefault(2, kNobody);
    gate->close();
    bus.plugUnseen("1-3", aDisk());
    gate->open();
    EXPECT_EQ(gate->policy.nextLook(), gate->now() + GatePolicy::kLateTime);
    bus.plug("1-1", aDisk());
    gate->settle();
    bus.setAuthorized("1-1", false);
    bus.plug("2-1", aDisk());
    // Closed by somebody else in between.
    bus.setRootHubDefault(1, kHardWiredOnly);
    bus.show("1-3");
    gate->settle();
    EXPECT_FALSE(bus.isAuthorized("1-1"));
    EXPECT_FALSE(bus.isAuthorized("2-1"));
    EXPECT_FALSE(bus.isAuthorized("1-3"));
    EXPECT_EQ(bus.rootHubDefault(1), kHardWiredOnly);
}

TEST_F(GatePolicyTest, RefusedLateStayOutWhenTheyAreToBePluggedAgain) {
    with({.onUnlock = OnUnlock::replug});
    gate->close();
    bus.plugUnseen("1-1", aDisk());
    gate->open();
    bus.show("1-1");
    gate->settle();
    EXPECT_FALSE(bus.isAuthorized("1-1"));
}

TEST_F(GatePolicyTest, RootHubThatCameClosedIsOpenedWithWhatIsBehindIt) {
    bus.setRootHubDefault(2, kHardWiredOnly);
    gate->close();
    gate->open();
    // It has read the parameter before that was put back.
    bus.setParameterDefault(kHardWiredOnly);
    bus.addRootHub(3);
    bus.plug("3-1", aDisk());
    bus.setParameterDefault(kAsTheControllerHasIt);
    gate->settle();
    EXPECT_EQ(bus.rootHubDefault(3), kEverybody);
    EXPECT_TRUE(bus.isAuthorized("3-1"));
    // This one was closed before.
    EXPECT_EQ(bus.rootHubDefault(2), kHardWiredOnly);
}

TEST_F(GatePolicyTest, RootHubThatCameClosedIsOpenedAlsoAfterTheGateWasClosedOnceMore) {
    gate->close();
    gate->open();
    bus.setParameterDefault(kHardWiredOnly);
    bus.addRootHub(3);
    bus.setParameterDefault(kAsTheControllerHasIt);
    bus.setRootHubDefault(1, kHardWiredOnly);
    gate->close();
    gate->open();
    EXPECT_EQ(bus.rootHubDefault(3), kEverybody);
    // Somebody else has closed this one in between.
    EXPECT_EQ(bus.rootHubDefault(1), kHardWiredOnly);
}

TEST_F(GatePolicyTest, RootHubThatCannotBeOpenedIsNotTriedWithoutEnd) {
    gate->close();
    gate->open();
    bus.setParameterDefault(kHardWiredOnly);
    bus.addRootHub(3);
    bus.failDefaults();
    bus.forgetWrites();
    gate->settle();
    EXPECT_EQ(bus.writes(), Writes{"usb3=1"});
}

TEST_F(GatePolicyTest, ClosedAgainWhatIsSeenLateStaysOut) {
    gate->close();
    bus.plugUnseen("1-1", aDisk());
    gate->open();
    gate->close();
    bus.show("1-1");
    gate->pass(1s);
    EXPECT_FALSE(bus.isAuthorized("1-1"));
    EXPECT_EQ(gate->standingAt("1-1"), Standing::refused);
}

} // namespace
} // namespace keystrand::usb
