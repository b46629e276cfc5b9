#pragma once

#include "base/NotCopied.h"
#include "keystrand-linux/GateLog.h"
#include "keystrand-linux/GatePolicy.h"
#include "keystrand-linux/GateRecord.h"
#include "keystrand-linux/StateFile.h"
#include "keystrand-linux/UsbBus.h"

#include <functional>
#include <optional>
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

    /// Closes or opens; nothing when it is so already. Where there is no USB, it closes as soon as
    /// there is; what is attached then stays.
    void setClosed(bool closed);
    /// While the machine is locked each change of what is attached is kept for the next start.
    void setLocked(bool locked);
    /// From now on the devices that are in are kept for the next start of the machine. Until then
    /// what the last one has left is not touched.
    void keepDevices();
    /// To be kept in the record, from the next write on.
    void remember(const GateRecord::Service& service);

    /// Of what is in, only what was attached and in when the machine went off stays. For a closed
    /// gate; nothing, with a line, when that is not known.
    void keepOnlyKnown();

    /// Lets the device in, whether the gate is closed or not. A reason for people, or none when it
    /// is in.
    [[nodiscard]] std::optional<std::string> accept(const Attachment& attachment);

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
    [[nodiscard]] bool closed() const { return policy_.closed(); }
    /// Nothing that this service wrote is left to be put back.
    [[nodiscard]] bool isOpen() const { return policy_.state().phase == GateState::Phase::open; }

  private:
    [[nodiscard]] std::optional<BusView> lookAtBus();
    void settle();
    [[nodiscard]] bool step();
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
    /// When the bus was looked at last, if it could not be seen.
    std::optional<BootTime> blindSince_;
    bool keepsDevices_ = false;
    bool locked_ = false;
    /// What was said last, whether it could be done or not.
    bool wantsClosed_ = false;
    bool watching_ = false;
    bool settling_ = false;
};

/// "08/06/50", one after the other, at most fifty.
[[nodiscard]] std::string classesOf(const UsbFunctions& functions, char between);

/// "1-2.3 (0781:5567 \"Maker\" \"Name\", serial \"123\", classes 08/06/50)", with every byte that
/// is not printable ASCII, and each quote and backslash, as \xNN.
[[nodiscard]] std::string describe(const UsbDevice& device);

} // namespace keystrand::usb
