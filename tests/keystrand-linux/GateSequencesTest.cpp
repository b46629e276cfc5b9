// Whatever happens in whatever order: nothing that came while the gate was closed is in but by a
// rule, and everything is as it was when the gate is open again.

#include "tests/keystrand-linux/GateOnBus.h"

#include <gtest/gtest.h>

#include <array>
#include <random>
#include <set>

namespace keystrand::usb {
namespace {

using namespace std::chrono_literals;

/// What is held of the bus without looking at the policy.
class Sequence {
  public:
    explicit Sequence(std::uint32_t seed) : random_(seed), rules_(someRules()) {
        bus_.addRootHub(1);
        bus_.addRootHub(2);
        gate_.emplace(bus_, rules_);
    }

    void run() {
        const int steps = number(5, 30);
        for (int step = 0; step < steps && !testing::Test::HasFailure(); ++step) {
            happen();
        }
        if (closed_) {
            open();
        }
        checkOpen();
    }

    [[nodiscard]] const std::string& story() const { return story_; }

  private:
    static constexpr std::array<const char*, 8> kPorts = {"1-1",   "1-2", "1-1.1",   "1-1.2",
                                                          "1-2.1", "2-1", "1-1.1.1", "2-1.1"};

    int number(int least, int most) { return std::uniform_int_distribution(least, most)(random_); }
    bool chance(int oneIn) { return number(1, oneIn) == 1; }
    const char* port() { return kPorts[static_cast<std::size_t>(number(0, kPorts.size() - 1))]; }

    GateRules someRules() {
        GateRules rules;
        rules.internal = !chance(3);
        rules.keyboards = static_cast<KeyboardRule>(number(0, 2));
        rules.keyboardBuiltIn = chance(4);
        return rules;
    }

    void happen() {
        switch (number(1, 9)) {
        case 1:
        case 2:
        case 3:
            plug(port());
            break;
        case 4:
            unplug(port());
            break;
        case 5:
            tell("pass");
            gate_->pass(number(0, 1) == 0 ? 1s : 5s);
            break;
        case 6:
            closed_ ? open() : close();
            break;
        case 7:
            letIn(port());
            break;
        case 8:
            nextService();
            break;
        case 9:
            rootHub();
            break;
        }
        settleUnlessMore();
    }

    /// Several things may happen between two looks.
    void settleUnlessMore() {
        if (chance(3)) {
            return;
        }
        gate_->settle();
        if (closed_) {
            checkClosed();
        }
    }

    bool isFree(const std::string& port) {
        const std::size_t point = port.rfind('.');
        return !bus_.isPlugged(port) && hasRoot(port) &&
               (point == std::string::npos || hubs_.contains(port.substr(0, point)));
    }

    void plug(const std::string& port) {
        if (!isFree(port)) {
            return;
        }
        Plug what;
        switch (number(0, 4)) {
        case 0:
            what = aKeyboard();
            break;
        case 1:
            what = aKeyboardWithDisk();
            break;
        case 2:
        case 3:
            what = aHub();
            hubs_.insert(port);
            break;
        default:
            what = aDisk();
        }
        what.hardWired = chance(8);
        tell("plug " + port + " " + what.name + (what.hardWired ? " inside" : ""));
        bus_.plug(port, what);
    }

    void unplug(const std::string& port) {
        if (bus_.isPlugged(port)) {
            tell("unplug " + port);
            bus_.unplug(port);
            std::erase_if(
                hubs_, [&](const std::string& hub) { return hub == port || isBehind(hub, port); });
        }
    }

    void close() {
        tell("close");
        wasIn_.clear();
        for (const UsbDevice& device : look().devices) {
            if (device.authorized) {
                wasIn_.insert(device.attachment);
            }
        }
        // What comes after the look that counts: it must not be in.
        if (chance(3)) {
            gate_->meanwhile(static_cast<unsigned>(number(1, 3)), [this] { plug(port()); });
        }
        closed_ = true;
        gate_->close();
        checkClosed();
    }

    void open() {
        tell("open");
        closed_ = false;
        letIn_.clear();
        // What the kernel refuses before and shows afterwards.
        const std::string late = port();
        const bool isLate = chance(3) && late.find('.') == std::string::npos && isFree(late);
        if (isLate) {
            tell("late " + late);
            bus_.plugUnseen(late, aDisk());
        }
        gate_->open();
        if (isLate) {
            bus_.show(late);
        }
        checkOpen();
    }

    void letIn(const std::string& port) {
        gate_->settle();
        const auto device = find(port);
        if (closed_ && device && !device->authorized) {
            tell("let in " + port);
            letIn_.insert(device->attachment);
            EXPECT_TRUE(gate_->policy.accept(device->attachment, gate_->now()));
        }
    }

    void nextService() {
        tell("next service");
        const GateState left = gate_->policy.state();
        const BootTime now = gate_->now();
        gate_.emplace(bus_, rules_, now);
        gate_->policy.resume(left);
    }

    void rootHub() {
        if (hasRoot("3-1")) {
            return;
        }
        tell("root hub");
        bus_.addRootHub(3);
        bus_.plug("3-1", aDisk());
    }

    bool hasRoot(const std::string& port) { return busOf(port) < 3 || bus_.isPlugged("3-1"); }

    BusView look() {
        std::string problem;
        return bus_.look(problem).value();
    }
    std::optional<UsbDevice> find(const std::string& port) {
        for (const UsbDevice& device : look().devices) {
            if (device.port() == port) {
                return device;
            }
        }
        return std::nullopt;
    }

    void checkClosed() {
        const BusView view = look();
        int keyboardsThatCame = 0;
        for (const UsbDevice& device : view.devices) {
            if (!device.authorized || wasIn_.contains(device.attachment) ||
                letIn_.contains(device.attachment) || (rules_.internal && device.hardWired)) {
                continue;
            }
            if (device.functions.isOnlyKeyboard && keyboardsAllowed()) {
                ++keyboardsThatCame;
                continue;
            }
            if (device.functions.isHub && keyboardsAllowed()) {
                hubsFollow(device, view);
                continue;
            }
            ADD_FAILURE() << device.port() << " is in by no rule\n" << story_;
        }
        if (rules_.keyboards == KeyboardRule::whenNone) {
            EXPECT_LE(keyboardsThatCame, 1) << story_;
        }
        const AuthorizedDefault wanted = rules_.internal ? kHardWiredOnly : kNobody;
        EXPECT_EQ(view.parameter, wanted) << story_;
        for (const RootHub& hub : view.rootHubs) {
            EXPECT_EQ(hub.authorizedDefault, wanted) << story_;
        }
    }

    bool keyboardsAllowed() const {
        return rules_.keyboards == KeyboardRule::always ||
               (rules_.keyboards == KeyboardRule::whenNone && !rules_.keyboardBuiltIn);
    }

    /// A hub is in for five seconds, or because of a keyboard.
    void hubsFollow(const UsbDevice& hub, const BusView& view) {
        for (const UsbDevice& device : view.devices) {
            if (isBehind(device.port(), hub.port()) && device.authorized &&
                device.functions.isKeyboard) {
                return;
            }
        }
        const KnownDevice* const known = gate_->policy.find(hub.attachment);
        ASSERT_NE(known, nullptr);
        EXPECT_LT(gate_->now() - known->since, GatePolicy::kProbeTime) << story_;
    }

    void checkOpen() {
        gate_->settle();
        const BusView view = look();
        EXPECT_EQ(view.parameter, kAsTheControllerHasIt) << story_;
        for (const RootHub& hub : view.rootHubs) {
            EXPECT_EQ(hub.authorizedDefault, kEverybody) << story_;
        }
        for (const UsbDevice& device : view.devices) {
            EXPECT_TRUE(device.authorized) << device.port() << '\n' << story_;
        }
        EXPECT_EQ(gate_->policy.state(), GateState()) << story_;
    }

    void tell(const std::string& what) { story_ += what + '\n'; }

    std::mt19937 random_;
    GateRules rules_;
    FakeUsbBus bus_;
    std::optional<GateOnBus> gate_;
    std::set<std::string> hubs_;
    std::set<Attachment> wasIn_;
    std::set<Attachment> letIn_;
    bool closed_ = false;
    std::string story_;
};

TEST(GateSequencesTest, NothingIsInButByARule) {
    for (std::uint32_t seed = 1; seed <= GATE_SEQUENCES; ++seed) {
        Sequence sequence(seed);
        sequence.run();
        ASSERT_FALSE(HasFailure()) << "sequence " << seed << '\n' << sequence.story();
    }
}

} // namespace
} // namespace keystrand::usb
