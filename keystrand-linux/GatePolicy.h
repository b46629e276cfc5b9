#pragma once

#include "keystrand-linux/UsbDevice.h"

#include <chrono>
#include <cstdint>
#include <functional>
#include <optional>
#include <string>
#include <utility>
#include <vector>

namespace keystrand::usb {

/// A moment of this start of the machine, sleep included (CLOCK_BOOTTIME).
using BootTime = std::chrono::microseconds;

enum class KeyboardRule : std::uint8_t { never, whenNone, always };
enum class OnUnlock : std::uint8_t { accept, replug };

struct GateRules {
    /// Devices on hard-wired ports come in while the gate is closed.
    bool internal = true;
    KeyboardRule keyboards = KeyboardRule::whenNone;
    OnUnlock onUnlock = OnUnlock::accept;
    struct Product {
        std::uint16_t vendor = 0;
        std::uint16_t product = 0;
        bool operator==(const Product&) const = default;
    };
    /// What only looks like a keyboard.
    std::vector<Product> notKeyboards = {};
    /// A portable machine has a keyboard that is not on the bus.
    bool keyboardBuiltIn = false;
};

/// Why a device is in, or is not.
enum class Standing : std::uint8_t {
    /// In: it was there when the gate closed.
    attached,
    /// In: it was when the machine went off, and came a little late when it started.
    returned,
    /// In: the kernel lets devices on its port come.
    hardWired,
    /// In: it is the keyboard that somebody needs to unlock.
    keyboard,
    /// In for a few seconds: a hub behind which there may be that keyboard.
    probe,
    /// In: a hub behind which there is that keyboard.
    keyboardHub,
    /// In: taking it away would take away what the machine works with.
    inUse,
    /// In: an administrator said so.
    administrator,
    /// In: was refused, and somebody else let it in.
    letInByOthers,
    /// Out, because it came while the gate was closed.
    refused,
    /// Out before the gate closed; not this service's to let in.
    refusedByOthers,
};

[[nodiscard]] constexpr bool isIn(Standing standing) {
    return standing != Standing::refused && standing != Standing::refusedByOthers;
}

struct KnownDevice {
    Attachment attachment;
    Standing standing = Standing::attached;
    BootTime since{0};
    /// False between the decision and the kernel's having carried it out.
    bool confirmed = true;
    /// The kernel could not let it in, and would not if it were asked at once again.
    bool givenUp = false;

    bool operator==(const KnownDevice&) const = default;
};

/// What was written where, and what had been there.
struct WrittenDefault {
    AuthorizedDefault before = kEverybody;
    AuthorizedDefault written = kNobody;
    /// False between the decision and the kernel's having carried it out.
    bool confirmed = false;
    /// When the kernel did not, or did not take back what had been there.
    std::optional<BootTime> failedAt = std::nullopt;

    /// What had been there was written again.
    bool putBack = false;

    /// Whether it is time to try it, once more if need be.
    [[nodiscard]] bool isDue(BootTime now) const;

    /// Whether that changed something, and what reads `now` has not been changed by others since.
    [[nodiscard]] bool isStillThere(AuthorizedDefault now) const {
        return before != written && written == now;
    }

    bool operator==(const WrittenDefault&) const = default;
};

struct WrittenHub {
    std::uint32_t bus = 0;
    std::uint64_t inode = 0;
    WrittenDefault value;

    bool operator==(const WrittenHub&) const = default;
};

/// All that has to be remembered from one write to the next, also by the service that comes after
/// this one.
struct GateState {
    enum class Phase : std::uint8_t { open, closed, opening };
    Phase phase = Phase::open;
    std::optional<WrittenDefault> parameter = std::nullopt;
    std::vector<WrittenHub> hubs = {};
    std::vector<KnownDevice> devices = {};

    bool operator==(const GateState&) const = default;
};

/// One write to the bus.
struct GateAction {
    /// `stayOut` writes nothing: the kernel has refused the device already.
    enum class Kind : std::uint8_t { setParameter, setRootHub, accept, refuse, stayOut };
    Kind kind = Kind::setParameter;
    /// For the parameter and a root hub.
    AuthorizedDefault value = kNobody;
    RootHub hub;
    /// For a device, and why.
    UsbDevice device;
    Standing standing = Standing::refused;
};

/// What became of it.
struct GateOutcome {
    enum class Kind : std::uint8_t { done, vanished, inUse, failed };
    Kind kind = Kind::done;
    /// What the parameter or the root hub reads now.
    AuthorizedDefault readBack = kNobody;
    /// For people: what uses the device, or why it failed.
    std::string reason = {};
};

/// Who may come in. Pure: it is shown the bus and the time, and says what to write.
///
/// A look, what `decide` says, and what became of it belong together; then everything is looked at
/// again, until `decide` has nothing to say. Where looks and events stand in no order, nothing is
/// lost by that: what is decided follows from what is there.
class GatePolicy {
  public:
    static constexpr BootTime kProbeTime = std::chrono::seconds(5);
    /// Until what could not be closed, refused or put back is tried again.
    static constexpr BootTime kRetryTime = std::chrono::seconds(10);

    /// The kernel decides about a device before it shows it, by what its root hub read then: so
    /// long after the root hubs were put back one may still come that was refused.
    static constexpr BootTime kLateTime = std::chrono::seconds(10);

    /// So long after a start of the machine slow disks and docks are awaited.
    static constexpr BootTime kReturnTime = std::chrono::seconds(60);

    explicit GatePolicy(GateRules rules);

    /// Goes on from what another service has left. What it decided without having carried it out
    /// is decided anew.
    void resume(GateState state);

    /// What is in now stays; a glance is enough. Nothing when the gate is closed.
    void close(const BusView& view, BootTime now);
    /// Puts everything back. Nothing when it is open.
    void open();

    /// Takes all that reads closed, and each device that is out, for this service's own, whoever
    /// that was, so that `open` opens it. The gate is closed then.
    void takeOver(const BusView& view, BootTime now);

    /// Of what is in, whatever `isKnown` does not know goes, but for hard-wired ports and
    /// keyboards. What it knows comes in, if it was refused or comes within kReturnTime. For a
    /// closed gate.
    using IsKnown = std::function<bool(const UsbDevice&)>;
    void keepOnly(IsKnown isKnown, const BusView& view, BootTime now);

    /// The device comes in, whatever the rules say. False when it is not there or in already.
    [[nodiscard]] bool accept(const Attachment& attachment, BootTime now);

    /// What closes, for a glance: the first that `decide` would say, too, of a gate that is closed.
    [[nodiscard]] std::vector<GateAction> decideDefaults(const BusView& glance, BootTime now);
    /// What to write next, in this order. Remembered as decided, not yet as carried out.
    [[nodiscard]] std::vector<GateAction> decide(const BusView& view, BootTime now);
    void carriedOut(const GateAction& action, const GateOutcome& outcome, BootTime now);

    /// When to look again though nothing came.
    [[nodiscard]] std::optional<BootTime> nextLook() const;

    [[nodiscard]] const GateState& state() const { return state_; }
    [[nodiscard]] bool closed() const { return state_.phase == GateState::Phase::closed; }
    /// Everything is put back, as far as it is there by now.
    [[nodiscard]] bool isPutBack() const;
    /// Awaits nothing late any more when it is time, whether the bus can be seen or not.
    void endLate(BootTime now);
    /// The device's entry, null for one that is not known.
    [[nodiscard]] const KnownDevice* find(const Attachment& attachment) const;
    /// What the kernel did not close or refuse though the gate is closed, or did not take back
    /// though it is open, in words for people.
    [[nodiscard]] std::vector<std::string> gaps() const;

  private:
    using Actions = std::vector<GateAction>;
    using Entry = std::vector<KnownDevice>::iterator;

    void forgetWhatWent(const BusView& view);
    void tryAgain();
    [[nodiscard]] Actions decideClosed(const BusView& view, BootTime now);
    [[nodiscard]] Actions decideOpening(const BusView& view, BootTime now);
    [[nodiscard]] Actions closeDefaults(const BusView& view, BootTime now);
    [[nodiscard]] WrittenHub closedHub(const RootHub& hub, AuthorizedDefault before) const;
    [[nodiscard]] Actions putDefaultsBack(const BusView& view, BootTime now);
    void takeInWhatCameLast(const BusView& view, BootTime now);
    [[nodiscard]] bool refusesForThis(const RootHub& hub) const;
    [[nodiscard]] std::optional<AuthorizedDefault> valueBefore(const RootHub& hub) const;
    [[nodiscard]] std::optional<AuthorizedDefault>
    valueWithoutTheParameter(const RootHub& hub) const;
    [[nodiscard]] Actions letIn(const BusView& view, bool hubs);

    [[nodiscard]] std::optional<GateAction> decideKnown(KnownDevice& known, const UsbDevice& device,
                                                        const BusView& view, BootTime now);
    [[nodiscard]] std::optional<GateAction> decideNew(const UsbDevice& device, const BusView& view,
                                                      BootTime now);
    [[nodiscard]] std::optional<GateAction> decideProbe(KnownDevice& known, const UsbDevice& device,
                                                        const BusView& view, BootTime now);
    [[nodiscard]] std::optional<GateAction> refuse(KnownDevice& known, const UsbDevice& device,
                                                   const BusView& view, BootTime now);

    [[nodiscard]] bool returns(const UsbDevice& device, BootTime now) const;
    [[nodiscard]] bool isNoKeyboard(const UsbDevice& device) const;
    [[nodiscard]] bool mayBeTheKeyboard(const UsbDevice& device) const;
    [[nodiscard]] bool wantsKeyboard(const BusView& view) const;
    [[nodiscard]] bool isKeyboardIn(const UsbDevice& device) const;
    [[nodiscard]] bool keyboardBehind(const UsbDevice& hub, const BusView& view) const;
    [[nodiscard]] bool isClosedByOthers(const UsbDevice& device) const;
    [[nodiscard]] bool isLetInByItsPort(const UsbDevice& device) const;

    void defaultWritten(WrittenDefault& value, const GateOutcome& outcome, BootTime now);
    void parameterPutBack(const GateAction& action, const GateOutcome& outcome, BootTime now);
    void hubPutBack(const GateAction& action, const GateOutcome& outcome, BootTime now);
    void deviceWritten(const GateAction& action, const GateOutcome& outcome, BootTime now);
    [[nodiscard]] Entry entryOf(const Attachment& attachment);
    [[nodiscard]] WrittenHub* hubAt(std::uint64_t inode);

    GateRules rules_;
    GateState state_;
    /// What closes: a kernel that does not know the value for hard-wired ports gets the other one.
    AuthorizedDefault closing_;
    /// What was in when the machine went off, and until when that counts.
    IsKnown isKnown_;
    BootTime returnsUntil_{0};
    /// When the last default was put back, while it opens.
    std::optional<BootTime> putBackAt_;
};

} // namespace keystrand::usb
