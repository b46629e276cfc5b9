#include "base/UnixAddress.h"
#include "platform/linux/EventSocket.h"
#include "platform/linux/IdleExit.h"
#include "platform/linux/LinuxClock.h"
#include "platform/linux/LinuxHost.h"
#include "tests/platform/contract/EventHostContract.h"
#include "tests/platform/linux/RootDirectory.h"
#include "wire/EventDatagram.h"

#include <filesystem>
#include <memory>
#include <stdexcept>
#include <sys/socket.h>

namespace contract {

namespace {

class LinuxEventHostFixture final : public EventHostFixture {
  public:
    LinuxEventHostFixture() {
        for (const char* const directory : {"/run/kstd", "/etc/kstd", "/var/lib/kstd"}) {
            root_.makeDirectory(directory);
        }
        start();
    }

    platform::EventStream& events() override { return host_->interfaces().events; }
    platform::AlarmEvent& alarms() override { return host_->interfaces().alarms; }
    platform::MainRunLoop& runLoop() override { return host_->interfaces().runLoop; }
    platform::ProcessTransactions& transactions() override {
        return host_->interfaces().transactions;
    }
    platform::Date now() override { return platform::realTimeNow(); }

    void post(std::string_view stream, std::string_view name) override {
        const auto datagram = wire::encodeEvent(stream, name).value();
        const auto address = base::UnixAddress::of(root_.paths().eventSocket()).value();
        const ssize_t sent = ::sendto(sender_.get(), datagram.data(), datagram.size(), MSG_DONTWAIT,
                                      address.get(), address.size());
        if (sent != static_cast<ssize_t>(datagram.size())) {
            throw std::runtime_error("the event socket is full");
        }
    }

    void changeSetting(bool restrictedModeAllowed) override {
        const std::string setting = restrictedModeAllowed ? "restricted-mode-allowed = yes\n"
                                                          : "restricted-mode-allowed = no\n";
        root_.put("/etc/kstd/new", setting);
        std::filesystem::rename(root_.real("/etc/kstd/new"), root_.paths().managedSettings());
    }
    platform::ManagedSettings& settings() override { return host_->interfaces().settings; }

    bool hasTransactions() override {
        return dynamic_cast<platform::LinuxProcessTransactions&>(transactions()).busy();
    }
    void closeSources() override { host_->closeStreams(); }

    void restart() override {
        host_.reset();
        start();
    }

  private:
    void start() {
        host_ = std::make_unique<platform::LinuxHost>(platform::LinuxHostOptions{
            .paths = root_.paths(),
            .eventSocket = platform::makeEventSocket(root_.paths().eventSocket()),
            .alarms = {"alarm", "later", "sooner", "far", "near", "cancelled", "kept", "one", "two",
                       "never registered"}});
    }

    support::RootDirectory root_;
    base::FileDescriptor sender_{::socket(AF_UNIX, SOCK_DGRAM | SOCK_CLOEXEC, 0)};
    std::unique_ptr<platform::LinuxHost> host_;
};

} // namespace

INSTANTIATE_TEST_SUITE_P(Linux, EventHostContract,
                         (fixtureOf<EventHostFixture, LinuxEventHostFixture>()));

} // namespace contract
