#pragma once

#include "keystrand-linux/UsbBus.h"

#include <cstdint>
#include <map>
#include <set>
#include <span>
#include <string>
#include <string_view>
#include <vector>

namespace keystrand::usb {

/// What a device says about itself.
struct Plug {
    std::string name = "thing";
    std::vector<std::uint8_t> descriptors;
    std::uint16_t vendor = 0x1111;
    std::uint16_t product = 0x2222;
    std::string serial = {};
    bool hardWired = false;
};

/// Descriptors of one configuration with an interface of each of these classes.
[[nodiscard]] std::vector<std::uint8_t> descriptorsOf(std::span<const UsbClass> interfaces);
[[nodiscard]] Plug aKeyboard();
[[nodiscard]] Plug aMouse();
[[nodiscard]] Plug aDisk();
[[nodiscard]] Plug aHub();
/// A keyboard that is a disk as well.
[[nodiscard]] Plug aKeyboardWithDisk();

/// A bus as the kernel keeps one: it decides about devices when they come, shows nothing behind a
/// refused hub, and disconnects what is behind a hub that is refused.
class FakeUsbBus : public UsbBus {
  public:
    /// A root hub comes; it is as the parameter says.
    void addRootHub(std::uint32_t bus, const std::string& controller = {});
    void removeRootHub(std::uint32_t bus);

    /// A device is plugged in. What is behind a refused hub is seen when the hub is let in.
    void plug(const std::string& port, const Plug& what);
    /// The same in two: the kernel decides about it, and later it is seen.
    void plugUnseen(const std::string& port, const Plug& what);
    void show(const std::string& port);
    void unplug(const std::string& port);
    /// The same device once more, at the same port.
    void replug(const std::string& port);

    /// Somebody else writes.
    void setAuthorized(const std::string& port, bool authorized);
    void setRootHubDefault(std::uint32_t bus, AuthorizedDefault value);
    void setParameterDefault(AuthorizedDefault value) { parameter_ = value; }

    /// From now on the machine works with what is at that port.
    void use(const std::string& port) { used_.insert(port); }
    /// The kernel knows 0 and 1 only.
    void knowOnlyTwoValues() { twoValues_ = true; }
    /// Writes to the parameter and to root hubs fail, or are taken and change nothing.
    void failDefaults(bool fail = true) { defaultsFail_ = fail; }
    void ignoreDefaults() { defaultsAreIgnored_ = true; }
    /// Each write to a device fails that many times.
    void failWrites(unsigned count) { failures_ = count; }
    /// Nobody has loaded USB, or it is unloaded: then the next one knows nothing of this one.
    void setMissing(bool missing);
    /// It is there and cannot be looked at.
    void setUnreadable(bool unreadable) { unreadable_ = unreadable; }
    /// Called before each look and each write: what happens in between.
    void setMeanwhile(std::function<void()> meanwhile) { meanwhile_ = std::move(meanwhile); }
    /// Called whenever what devices say is read: how long they take is theirs.
    void setHanging(std::function<void()> hanging) { hanging_ = std::move(hanging); }

    /// What is at that port has its reader wait for its names; a look does not wait.
    void setBusy(const std::string& port, bool busy = true) {
        busy ? static_cast<void>(busy_.insert(port)) : static_cast<void>(busy_.erase(port));
    }

    [[nodiscard]] bool isPlugged(const std::string& port) const { return plugs_.contains(port); }
    /// False also for what is not seen.
    [[nodiscard]] bool isAuthorized(const std::string& port) const;
    [[nodiscard]] Attachment attachmentAt(const std::string& port) const;
    [[nodiscard]] AuthorizedDefault rootHubDefault(std::uint32_t bus) const;
    [[nodiscard]] const std::vector<std::uint8_t>& descriptorsAt(const std::string& port) const {
        return plugs_.at(port).descriptors;
    }
    [[nodiscard]] AuthorizedDefault parameter() const { return parameter_; }
    /// "parameter=2", "usb1=2", "1-1=0", in the order in which they were written.
    [[nodiscard]] const std::vector<std::string>& writes() const { return writes_; }
    void forgetWrites() { writes_.clear(); }

    /// What a look shows, without anything happening.
    [[nodiscard]] BusView present() const;
    [[nodiscard]] bool isMissing() const { return missing_; }

    [[nodiscard]] std::optional<BusView> look(std::string& problem) override;
    [[nodiscard]] std::optional<BusView> glance(std::string& problem) override;
    [[nodiscard]] GateOutcome setParameter(AuthorizedDefault value) override;
    [[nodiscard]] GateOutcome setRootHub(const RootHub& hub, AuthorizedDefault value) override;
    [[nodiscard]] GateOutcome accept(const UsbDevice& device) override;
    [[nodiscard]] GateOutcome refuse(const UsbDevice& device) override;
    void watch(Changed changed) override { changed_ = std::move(changed); }
    [[nodiscard]] bool isWatched() const { return changed_ != nullptr; }

  private:
    struct Seen {
        Attachment attachment;
        bool authorized = false;
    };

    void happen();
    void tell();
    void appear(const std::string& port);
    void disappear(const std::string& port);
    void becomeAuthorized(const std::string& port);
    [[nodiscard]] bool letsIn(const std::string& port) const;
    [[nodiscard]] bool hubAboveIsIn(const std::string& port) const;
    [[nodiscard]] bool isUsed(const std::string& port) const;
    [[nodiscard]] GateOutcome write(const UsbDevice& device, bool authorized);
    [[nodiscard]] GateOutcome writeDefault(AuthorizedDefault& at, AuthorizedDefault value) const;
    [[nodiscard]] AuthorizedDefault read(AuthorizedDefault value) const;

    std::map<std::uint32_t, RootHub> rootHubs_;
    std::map<std::string, Plug> plugs_;
    std::map<std::string, Seen> seen_;
    /// What was decided about devices that are not seen yet.
    std::map<std::string, bool> unseen_;
    std::set<std::string> used_;
    std::set<std::string> busy_;
    std::map<std::uint32_t, std::uint32_t> lastNumber_;
    std::uint64_t lastInode_ = 0;
    AuthorizedDefault parameter_ = kAsTheControllerHasIt;
    bool twoValues_ = false;
    bool defaultsFail_ = false;
    bool defaultsAreIgnored_ = false;
    bool missing_ = false;
    bool unreadable_ = false;
    unsigned failures_ = 0;
    std::function<void()> meanwhile_;
    std::function<void()> hanging_;
    Changed changed_;
    std::vector<std::string> writes_;
};

} // namespace keystrand::usb
