// Whatever happens in whatever order, to the bus, to the writes and to the service itself: nothing
// that came while the gate was closed is in but by a rule, what could not be closed is named, and
// everything is as it was when the gate is open again.

#include "keystrand-linux/UsbGate.h"
#include "tests/keystrand-linux/FakeUsbBus.h"
#include "tests/support/TemporaryDirectory.h"

#include <gtest/gtest.h>

#include <array>
#include <random>
#include <set>

namespace keystrand::usb {
namespace {

using namespace std::chrono_literals;

/// The end of the process.
struct Killed {};

/// A bus whose events come when the loop has its turn, or are lost, and at which something may
/// happen before and after each look and each write.
class EventfulBus : public UsbBus {
  public:
    explicit EventfulBus(FakeUsbBus& bus) : bus_(bus) {
        bus_.watch([this] { isTold_ = true; });
    }

    void setHappening(std::function<void()> happening) { happening_ = std::move(happening); }
    void setGlanced(std::function<void(const BusView&)> glanced) { glanced_ = std::move(glanced); }

    void turn() {
        if (std::exchange(isTold_, false) && changed_) {
            // Whoever is called may end it.
            const Changed changed = changed_;
            changed();
        }
    }
    void loseEvents() { isTold_ = false; }

    std::optional<BusView> look(std::string& problem) override {
        happening_();
        return bus_.look(problem);
    }
    std::optional<BusView> glance(std::string& problem) override {
        happening_();
        auto view = bus_.glance(problem);
        if (view) {
            glanced_(*view);
        }
        return view;
    }
    GateOutcome setParameter(AuthorizedDefault value) override {
        return between([&] { return bus_.setParameter(value); });
    }
    GateOutcome setRootHub(const RootHub& hub, AuthorizedDefault value) override {
        return between([&] { return bus_.setRootHub(hub, value); });
    }
    GateOutcome accept(const UsbDevice& device) override {
        return between([&] { return bus_.accept(device); });
    }
    GateOutcome refuse(const UsbDevice& device) override {
        return between([&] { return bus_.refuse(device); });
    }
    void watch(Changed changed) override { changed_ = std::move(changed); }

  private:
    template <typename Write>
    GateOutcome between(const Write& write) {
        happening_();
        GateOutcome outcome = write();
        happening_();
        return outcome;
    }

    FakeUsbBus& bus_;
    bool isTold_ = false;
    Changed changed_;
    std::function<void()> happening_;
    std::function<void(const BusView&)> glanced_;
};

class NoLog : public GateLog {
  public:
    void write(GateLine /*about*/, const std::string& /*text*/) override {}
};

/// What is held of the bus without looking at the policy.
class Sequence {
  public:
    Sequence(std::uint32_t seed, const StateFile& record, const StateFile& devices)
        : random_(seed), record_(record), devices_(devices), rules_(someRules()) {
        std::string problem;
        static_cast<void>(record_.remove(problem));
        machine_.addRootHub(1);
        machine_.addRootHub(2);
        if (twoValues_) {
            machine_.knowOnlyTwoValues();
        }
        bus_.setHappening([this] { inBetween(); });
        bus_.setGlanced([this](const BusView& view) { glanced(view); });
        nextService();
    }

    void run() {
        const int steps = number(5, 30);
        for (int step = 0; step < steps && !testing::Test::HasFailure(); ++step) {
            happen();
        }
        killIn_ = 0;
        isEventful_ = false;
        turnGate(false);
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
        twoValues_ = chance(6);
        return rules;
    }

    void happen() {
        switch (number(1, 13)) {
        case 1:
        case 2:
        case 3:
            plug(port());
            break;
        case 4:
            unplug(port());
            break;
        case 5:
            pass(number(0, 1) == 0 ? 1s : 5s);
            break;
        case 6:
        case 7:
            turnGate(!wish_);
            break;
        case 8:
            letIn(port());
            break;
        case 9:
            letInByOthers(port());
            break;
        case 10:
            die();
            break;
        case 11:
            rootHub();
            break;
        case 12:
            fail();
            break;
        case 13:
            isEventful_ = !isEventful_;
            tell(isEventful_ ? "eventful" : "quiet");
            break;
        }
        if (chance(4)) {
            bus_.loseEvents();
        }
        // Several things may happen between two looks.
        if (!chance(3)) {
            settle();
            check();
        }
    }

    /// Before and after each look and each write.
    void inBetween() {
        if (killIn_ > 0 && --killIn_ == 0) {
            tell("  killed");
            throw Killed();
        }
        if (!isEventful_ || !chance(5)) {
            return;
        }
        chance(3) ? unplug(port()) : plug(port());
    }

    /// The look from which on everything is new.
    void glanced(const BusView& view) {
        if (!wish_ || hasBaseline_) {
            return;
        }
        hasBaseline_ = true;
        wasIn_.clear();
        for (const UsbDevice& device : view.devices) {
            if (device.authorized) {
                wasIn_.insert(device.attachment);
            }
        }
    }

    /// Whatever the service does; it may not live to the end of it.
    void serve(const std::function<void()>& work) {
        try {
            work();
        } catch (const Killed&) {
            nextService();
            // The next one is told anew what is wished, and may be told something else.
            if (chance(3)) {
                wish_ = !wish_;
                tell(wish_ ? "  and to be closed" : "  and to be opened");
                if (wish_) {
                    hasBaseline_ = false;
                }
            }
            serve([this] { wishForIt(); });
        }
    }

    void nextService() {
        gate_.reset();
        // The one that went has told its file what it was about to do, and nobody else.
        if (const auto left = recordOnDisk();
            !left || left->gate.phase != GateState::Phase::closed) {
            hasBaseline_ = false;
        }
        gate_.emplace(UsbGate::Parts{.bus = bus_,
                                     .record = record_,
                                     .devices = devices_,
                                     .log = log_,
                                     .now = [this] { return now_; },
                                     .rearm =
                                         [] {
                                         }},
                      rules_);
        static_cast<void>(gate_->resume());
    }

    [[nodiscard]] std::optional<GateRecord> recordOnDisk() const {
        std::string problem;
        const auto text = record_.read(problem);
        return text ? decodeGateRecord(*text) : std::nullopt;
    }

    void wishForIt() {
        if (!wish_) {
            // A device that cannot be let in is told and stays out.
            machine_.failWrites(0);
            letIn_.clear();
            hasBaseline_ = false;
        }
        gate_->setClosed(wish_);
    }

    void turnGate(bool closed) {
        tell(closed ? "close" : "open");
        wish_ = closed;
        serve([this] { wishForIt(); });
        check();
    }

    void settle() {
        serve([this] {
            bus_.turn();
            gate_->look();
        });
    }

    void pass(BootTime time) {
        tell("pass");
        now_ += time;
        serve([this] {
            if (gate_->nextLook().value_or(BootTime::max()) <= now_) {
                gate_->look();
            }
        });
    }

    /// At some moment of what it does next.
    void die() {
        killIn_ = number(1, 12);
        tell("to be killed");
    }

    /// For a while, as long as the gate is to be closed.
    void fail() {
        if (!wish_) {
            return;
        }
        const int what = number(1, 3);
        tell("writes fail " + std::to_string(what));
        machine_.failDefaults(what == 1);
        machine_.failWrites(what == 2 ? 2 : 0);
        machine_.setUnreadable(what == 3);
        isFailing_ = true;
    }

    void repair() {
        if (std::exchange(isFailing_, false)) {
            tell("nothing fails any more");
            machine_.failDefaults(false);
            machine_.failWrites(0);
            machine_.setUnreadable(false);
        }
    }

    void plug(const std::string& port) {
        const std::size_t point = port.rfind('.');
        if (machine_.isPlugged(port) || !hasRoot(port) ||
            (point != std::string::npos && !hubs_.contains(port.substr(0, point)))) {
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
        if (point == std::string::npos && chance(4)) {
            tell("  seen later");
            machine_.plugUnseen(port, what);
            unseen_.insert(port);
        } else {
            machine_.plug(port, what);
        }
    }

    /// What the kernel has decided about before.
    void showAll() {
        for (const std::string& port : std::exchange(unseen_, {})) {
            if (machine_.isPlugged(port)) {
                machine_.show(port);
            }
        }
    }

    void unplug(const std::string& port) {
        if (machine_.isPlugged(port)) {
            tell("unplug " + port);
            machine_.unplug(port);
            unseen_.erase(port);
            std::erase_if(
                hubs_, [&](const std::string& hub) { return hub == port || isBehind(hub, port); });
        }
    }

    void letIn(const std::string& port) {
        const auto device = find(port);
        if (wish_ && device && !device->authorized) {
            tell("let in " + port);
            letIn_.insert(device->attachment);
            serve([&] { static_cast<void>(gate_->accept(device->attachment)); });
        }
    }

    void letInByOthers(const std::string& port) {
        const auto device = find(port);
        if (wish_ && device && !device->authorized) {
            tell("let in by others " + port);
            letIn_.insert(device->attachment);
            machine_.setAuthorized(port, true);
        }
    }

    void rootHub() {
        if (hasRoot("3-1")) {
            return;
        }
        tell("root hub");
        machine_.addRootHub(3);
        machine_.plug("3-1", aDisk());
    }

    bool hasRoot(const std::string& port) { return busOf(port) < 3 || machine_.isPlugged("3-1"); }

    std::optional<UsbDevice> find(const std::string& port) {
        for (const UsbDevice& device : machine_.present().devices) {
            if (device.port() == port) {
                return device;
            }
        }
        return std::nullopt;
    }

    /// When what was to fail has failed and all events were heard.
    void check() {
        const bool wasEventful = std::exchange(isEventful_, false);
        killIn_ = 0;
        showAll();
        if (wish_ && isFailing_) {
            serve([this] { gate_->look(); });
            checkGap();
            if (chance(2)) {
                isEventful_ = wasEventful;
                return;
            }
        }
        repair();
        serve([this] { gate_->look(); });
        // Until what failed is tried again, one after the other, and what was looked for is found.
        for (int turn = 0; turn < 6 && gate_->nextLook(); ++turn) {
            now_ = std::max(now_, isPatient_ ? *gate_->nextLook() : now_);
            serve([this] { gate_->look(); });
        }
        wish_ ? checkClosed() : checkOpen();
        isEventful_ = wasEventful;
    }

    /// Whatever is open is named.
    void checkGap() {
        const std::string gap = gate_->gap();
        const BusView view = machine_.present();
        if (!gate_->closed()) {
            EXPECT_NE(gap, "") << story_;
            return;
        }
        const auto isNamed = [&](const std::string& what) {
            return (gap + ',').find(what + ',') != std::string::npos;
        };
        EXPECT_TRUE(view.parameter == wanted() || isNamed("the parameter authorized_default"))
            << story_;
        for (const RootHub& hub : view.rootHubs) {
            EXPECT_TRUE(hub.authorizedDefault == wanted() ||
                        isNamed("root hub usb" + std::to_string(hub.bus)))
                << story_;
        }
        for (const UsbDevice& device : view.devices) {
            if (device.authorized && !mayBeIn(device)) {
                EXPECT_TRUE(device.functions.isHub || device.functions.isKeyboard ||
                            isNamed("device " + device.port()))
                    << device.port() << " is not named in " << gap << '\n'
                    << story_;
            }
        }
    }

    [[nodiscard]] AuthorizedDefault wanted() const {
        return rules_.internal && !twoValues_ ? kHardWiredOnly : kNobody;
    }

    [[nodiscard]] bool mayBeIn(const UsbDevice& device) const {
        return wasIn_.contains(device.attachment) || letIn_.contains(device.attachment) ||
               (wanted() == kHardWiredOnly && device.hardWired);
    }

    void checkClosed() {
        const BusView view = machine_.present();
        int keyboardsThatCame = 0;
        for (const UsbDevice& device : view.devices) {
            if (!device.authorized || mayBeIn(device)) {
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
        EXPECT_TRUE(gate_->closed()) << story_;
        EXPECT_EQ(gate_->gap(), "") << story_;
        EXPECT_EQ(view.parameter, wanted()) << story_;
        for (const RootHub& hub : view.rootHubs) {
            EXPECT_EQ(hub.authorizedDefault, wanted()) << story_;
        }
        for (const Attachment& attached : wasIn_) {
            const UsbDevice* const device = view.find(attached);
            EXPECT_TRUE(device == nullptr || device->authorized)
                << attached.port << " was taken away\n"
                << story_;
        }
    }

    [[nodiscard]] bool keyboardsAllowed() const {
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
        for (const UsbGate::Listed& listed : gate_->list()) {
            if (listed.device.attachment == hub.attachment) {
                EXPECT_EQ(listed.standing, Standing::probe) << story_;
                EXPECT_LT(now_ - listed.since, GatePolicy::kProbeTime) << story_;
            }
        }
    }

    void checkOpen() {
        const BusView view = machine_.present();
        // Killed between two values of which the kernel knows one, nobody knows what was there.
        EXPECT_TRUE(view.parameter == kAsTheControllerHasIt ||
                    (twoValues_ && view.parameter == kEverybody))
            << story_;
        for (const RootHub& hub : view.rootHubs) {
            EXPECT_EQ(hub.authorizedDefault, kEverybody) << story_;
        }
        for (const UsbDevice& device : view.devices) {
            EXPECT_TRUE(device.authorized) << device.port() << '\n' << story_;
        }
        EXPECT_TRUE(gate_->isOpen()) << story_;
        EXPECT_EQ(recordOnDisk().value_or(GateRecord()), GateRecord()) << story_;
    }

    void tell(const std::string& what) { story_ += what + '\n'; }

    std::mt19937 random_;
    const StateFile& record_;
    const StateFile& devices_;
    bool twoValues_ = false;
    GateRules rules_;
    FakeUsbBus machine_;
    EventfulBus bus_{machine_};
    NoLog log_;
    std::optional<UsbGate> gate_;
    BootTime now_ = 1000s;
    /// What the gate is to be.
    bool wish_ = false;
    bool hasBaseline_ = false;
    bool isEventful_ = false;
    bool isFailing_ = false;
    bool isPatient_ = true;
    int killIn_ = 0;
    std::set<std::string> hubs_;
    std::set<std::string> unseen_;
    std::set<Attachment> wasIn_;
    std::set<Attachment> letIn_;
    std::string story_;
};

TEST(GateSequencesTest, NothingIsInButByARule) {
    // Each sequence writes some hundred small files.
    const support::TemporaryDirectory directory(support::directoryInMemory());
    const StateFile record(directory.file("gate"), StateFile::Durability::none);
    const StateFile devices(directory.file("devices"), StateFile::Durability::none);
    for (std::uint32_t seed = 1; seed <= GATE_SEQUENCES; ++seed) {
        Sequence sequence(seed, record, devices);
        sequence.run();
        ASSERT_FALSE(HasFailure()) << "sequence " << seed << '\n' << sequence.story();
    }
}

} // namespace
} // namespace keystrand::usb
