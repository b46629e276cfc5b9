#pragma once

#include "base/NotCopied.h"
#include "keystrand-linux/GateLog.h"
#include "keystrand-linux/GatePolicy.h"
#include "keystrand-linux/GateRecord.h"
#include "keystrand-linux/StateFile.h"
#include "keystrand-linux/UsbBus.h"

#include <functional>
#include <optional>
#include <set>
#include <string>
#include <vector>

namespace keystrand::usb {

/// The gate as it stands in the machine: looks at the bus, asks the policy, and writes, until
/// nothing is left to be written. What it is going to write is in the record before it is written.
///
/// Everything happens on one thread. Bus, files, log and clock outlive it.
class UsbGate : private base::NotCopied {
  public:
    struct Parts {
        UsbBus& bus;
        /// `/run/keystrand/gate`, which goes with the machine's memory.
        const StateFile& record;
        /// What is attached and in, over restarts of the machine.
        const StateFile& devices;
        GateLog& log;
        std::function<BootTime()> now;
        /// The next look may be due at another time.
        std::function<void()> rearm;
    };

    UsbGate(Parts parts, GateRules rules);
    ~UsbGate();

    /// Takes up what an earlier service of this start of the machine has left, without writing to
    /// the bus. None when there is none, or, with a line, none that can be understood.
    std::optional<GateRecord> resume();

    /// Closes or opens; nothing when it is so already. Where there is no USB, all that comes with
    /// it is new. Where it cannot be read or written, the gate closes as soon as it can, and what
    /// is attached then stays.
    ///
    /// What devices say about themselves is read when the parameter and the root hubs are closed:
    /// one that hangs has nothing wait that closes.
    void setClosed(bool closed);
    /// While the machine is locked each change of what is attached is kept for the next start. To
    /// be said after `setClosed`, as it looks at the devices.
    void setLocked(bool locked);
    /// From now on the devices that are in are kept for the next start of the machine. Until then
    /// what the last one has left is not touched.
    void keepDevices();
    /// To be kept in the record, from the next write on.
    void remember(const GateRecord::Service& service);

    /// Of what is in, only what was attached and in when the machine went off stays; and what of
    /// it is shown a little late comes in. For a closed gate; nothing, with a line, when that is
    /// not known.
    void keepOnlyKnown();

    /// Lets the device in, whether the gate is closed or not. A reason for people, or none when it
    /// is in.
    [[nodiscard]] std::optional<std::string> accept(const Attachment& attachment);

    /// Opens for good, and goes on as long as something may come late that was refused, but no
    /// longer than twenty seconds. `wait` returns at that time, or earlier; what it has heard of
    /// has been looked at. False, with a line that names it, when something could not be opened.
    using Wait = std::function<void(BootTime until)>;
    [[nodiscard]] bool restore(const Wait& wait);
    /// Before that: has it open all that reads closed, and accept all that is out, whoever did
    /// that.
    void takeOver();
    /// What reads closed though the gate is open, when nobody knows any more who closed it; in
    /// words for people.
    [[nodiscard]] std::string closedByNobodyKnows();

    /// Looks again, because something came or went, or because it is time.
    void look();
    [[nodiscard]] std::optional<BootTime> nextLook() const;

    struct Listed {
        UsbDevice device;
        /// None while the gate is open: nobody watches then.
        std::optional<Standing> standing;
        BootTime since{0};
    };
    [[nodiscard]] std::vector<Listed> list();
    /// How many devices are out.
    [[nodiscard]] std::size_t countRefused();
    [[nodiscard]] bool closed() const { return policy_.closed() && toldProblem_.empty(); }
    /// What is open all the same while the gate is to be closed, or closed though it is to be open,
    /// in words for people; empty when nothing is.
    [[nodiscard]] std::string gap() const;
    /// Nothing that this service wrote is left to be put back.
    [[nodiscard]] bool isOpen() const { return policy_.isPutBack(); }

  private:
    using Look = std::optional<BusView> (UsbBus::*)(std::string& problem);
    [[nodiscard]] std::optional<BusView> lookAtBus(Look at = &UsbBus::look);
    void settle();
    [[nodiscard]] bool step();
    [[nodiscard]] bool awaitsNames(const BusView& view) const;
    [[nodiscard]] bool carryOut(const std::vector<GateAction>& actions, BootTime now);
    void tellState();
    void tellFailure(const std::string& line);
    [[nodiscard]] GateOutcome carryOut(const GateAction& action);
    void tell(const GateAction& action, const GateOutcome& outcome);
    void tellDevice(const GateAction& action, const GateOutcome& outcome);
    void save();
    void saveDevices(const BusView& view);
    void watchAsNeeded();

    Parts parts_;
    GatePolicy policy_;
    GateRecord record_;
    /// What the files hold, so that they are written when that changes.
    std::string savedRecord_;
    std::optional<std::string> savedDevices_;
    std::string toldProblem_;
    /// Whether the gate was said to be closed, and what is said to be otherwise.
    bool toldClosed_ = false;
    std::string toldGap_;
    /// The failures of this closing or opening; each is told once, however often it is met.
    std::set<std::string> toldFailures_;
    /// Which the kernel did not take.
    std::set<Attachment> notAccepted_;
    bool keepsDevices_ = false;
    bool locked_ = false;
    /// When the bus was looked at last, if it could not be seen.
    std::optional<BootTime> blindSince_;
    /// When the devices were, if one had not said all.
    std::optional<BootTime> busyAt_;
    /// What was said last, whether it could be done or not.
    bool wantsClosed_ = false;
    bool watching_ = false;
    bool settling_ = false;
    bool hasSettled_ = false;
};

/// "08/06/50", one after the other, at most fifty.
[[nodiscard]] std::string classesOf(const UsbFunctions& functions, char between);

/// "1-2.3 (0781:5567 \"Maker\" \"Name\", serial \"123\", classes 08/06/50)", with every byte that
/// is not printable ASCII, and each quote and backslash, as \xNN.
[[nodiscard]] std::string describe(const UsbDevice& device);

} // namespace keystrand::usb
