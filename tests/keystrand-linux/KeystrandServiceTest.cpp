#include "keystrand-linux/KeystrandService.h"

#include "tests/keystrand-linux/FakeSysfs.h"
#include "tests/keystrand-linux/MachineDoubles.h"
#include "tests/support/TemporaryDirectory.h"

#include <gmock/gmock.h>

#include <algorithm>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <sys/epoll.h>
#include <sys/socket.h>

namespace keystrand::usb {
namespace {

using namespace std::chrono_literals;

class KeystrandServiceTest : public testing::Test {
  protected:
    KeystrandServiceTest() {
        for (const char* const directory : {"run/keystrand", "etc/keystrand"}) {
            std::filesystem::create_directories(directory_.file(directory));
        }
    }

    void policies(const std::string& text) {
        std::ofstream(directory_.file("etc/keystrand/policies")) << text;
    }

    std::unique_ptr<KeystrandService> make() {
        std::string error;
        auto service =
            KeystrandService::create(directory_.path(), base::FileDescriptor(), log_, error);
        EXPECT_TRUE(service) << error;
        return service;
    }

    support::TemporaryDirectory directory_;
    Log log_;
};

TEST_F(KeystrandServiceTest, GuardsThePortsAlsoWithPoliciesThatAreNotUnderstood) {
    policies("nonsense");
    EXPECT_TRUE(make());
    EXPECT_THAT(log_.lines, testing::Contains(testing::AllOf(
                                testing::StartsWith("keystrand: "),
                                testing::HasSubstr("/etc/keystrand/policies"),
                                testing::EndsWith("; contexts and credentials are not served"))));
}

TEST_F(KeystrandServiceTest, SaysNothingOfPoliciesThatAreNotThere) {
    EXPECT_TRUE(make());
    EXPECT_THAT(log_.lines, testing::Not(testing::Contains(testing::HasSubstr("policies"))));
}

/// A machine of files whose service has ended. Nothing here can come late: time passes by itself.
class RestoreOfServiceTest : public testing::Test {
  protected:
    class QuickClock : public MachineClock {
      public:
        [[nodiscard]] BootTime sinceStart() const override { return now_ += 10s; }
        [[nodiscard]] std::chrono::microseconds wall() const override { return now_; }

      private:
        mutable BootTime now_ = 1000s;
    };

    RestoreOfServiceTest() {
        std::filesystem::create_directories(directory_.file("run/keystrand"));
        sysfs_.machine().addRootHub(1, "pci0");
        sysfs_.machine().setParameterDefault(kHardWiredOnly);
        sysfs_.machine().setRootHubDefault(1, kHardWiredOnly);
        sysfs_.machine().plug("1-1", aDisk());
    }

    void record(const std::string& text) { std::ofstream(path_) << text; }
    bool restore(KeystrandService::Restored what = KeystrandService::Restored::whatWasClosed) {
        return KeystrandService::restore(directory_.path(), what, QuickClock(), log_);
    }
    std::string read(const std::filesystem::path& path) {
        const SmallFile file = readSmallFile(path.string(), kAttributeLimit);
        return std::string(trimmed(file.bytes));
    }
    std::string all() {
        return read(sysfs_.parameter()) + ' ' +
               read(sysfs_.directoryOf("usb1") / "authorized_default") + ' ' +
               read(sysfs_.directoryOf("1-1") / "authorized");
    }

    support::TemporaryDirectory directory_;
    const std::string path_ = directory_.file("run/keystrand/gate");
    FakeSysfs sysfs_{directory_.path()};
    Log log_;
};

TEST_F(RestoreOfServiceTest, PutsBackWhatIsInTheRecord) {
    const Attachment device = sysfs_.machine().attachmentAt("1-1");
    const auto inodeOf = [&](const char* name) {
        return std::to_string(readSmallFile(sysfs_.directoryOf(name).string(), 0).status.st_ino);
    };
    record("keystrand-gate 1\nphase closed\nparameter -1 2 done\nhub 1 " + inodeOf("usb1") +
           " 1 2 done\ndevice 1-1 " + std::to_string(device.number) + ' ' + inodeOf("1-1") +
           " refused 0 done\nend\n");
    ASSERT_EQ(all(), "2 2 0");
    EXPECT_TRUE(restore());
    EXPECT_EQ(all(), "-1 1 1");
    EXPECT_FALSE(std::filesystem::exists(path_));
}

TEST_F(RestoreOfServiceTest, WithoutARecordNothingIsOpened) {
    EXPECT_TRUE(restore());
    EXPECT_EQ(all(), "2 2 0");
    EXPECT_EQ(log_.lines, std::vector<std::string>{"keystrand: there is nothing to be put back"});
}

TEST_F(RestoreOfServiceTest, LostRecordIsAFailureAndKept) {
    record("nonsense\n");
    EXPECT_FALSE(restore());
    EXPECT_EQ(all(), "2 2 0");
    EXPECT_EQ(log_.lines.back(),
              "keystrand: cannot open the parameter authorized_default, root hub "
              "usb1: who closed it is not known any more");
    EXPECT_FALSE(restore());
}

TEST_F(RestoreOfServiceTest, LostRecordOfWhatIsOpenIsNone) {
    sysfs_.machine().setParameterDefault(kEverybody);
    sysfs_.machine().setRootHubDefault(1, kEverybody);
    sysfs_.show();
    record("nonsense\n");
    EXPECT_TRUE(restore());
    EXPECT_EQ(log_.lines.back(), "keystrand: there is nothing to be put back");
    EXPECT_FALSE(std::filesystem::exists(path_));
}

TEST_F(RestoreOfServiceTest, AllIsOpenedWhoeverClosedIt) {
    record("nonsense\n");
    // Not only when it is asked for by somebody who accepts.
    std::filesystem::create_directories(directory_.file("etc/keystrand"));
    std::ofstream(directory_.file("etc/keystrand/keystrand.conf")) << "on-unlock = replug\n";
    EXPECT_TRUE(restore(KeystrandService::Restored::all));
    EXPECT_EQ(all(), "-1 1 1");
    EXPECT_FALSE(std::filesystem::exists(path_));
    EXPECT_TRUE(restore());
}

/// The init system's end of what a service says about itself.
class WatchWorkTest : public testing::Test {
  protected:
    WatchWorkTest() {
        ::setenv("NOTIFY_SOCKET", directory_.file("notify").c_str(), 1);
        ::setenv("WATCHDOG_USEC", "5000000", 1);
    }
    ~WatchWorkTest() override {
        ::unsetenv("NOTIFY_SOCKET");
        ::unsetenv("WATCHDOG_USEC");
    }

    support::TemporaryDirectory directory_;
};

TEST_F(WatchWorkTest, WatchdogRunsFromWhatComesToTheNextRestAndNoLonger) {
    std::string error;
    const base::FileDescriptor socket = usb::openEventsAt(directory_.file("notify"), error);
    ASSERT_TRUE(socket.isOpen()) << error;
    const auto loop = EventLoop::create();
    KeystrandService::watchWork(*loop);
    std::vector<std::string> said;
    // What is said about a rest ends it.
    const EventSource source = loop->watch(socket.get(), EPOLLIN, [&](std::uint32_t) {
        char text[128];
        const ssize_t size = ::recv(socket.get(), text, sizeof text, 0);
        said.emplace_back(text, static_cast<std::size_t>(std::max<ssize_t>(size, 0)));
        if (said.size() == 3) {
            loop->stop();
        }
    });
    EXPECT_TRUE(loop->run());
    const std::string rest = "WATCHDOG_USEC=18446744073709551615";
    EXPECT_EQ(said, (std::vector<std::string>{rest, "WATCHDOG=1\nWATCHDOG_USEC=5000000", rest}));
}

TEST_F(WatchWorkTest, WithoutAWatchdogNothingIsSaid) {
    ::unsetenv("WATCHDOG_USEC");
    std::string error;
    const base::FileDescriptor socket = usb::openEventsAt(directory_.file("notify"), error);
    const auto loop = EventLoop::create();
    KeystrandService::watchWork(*loop);
    EventSource timer = loop->timer(CLOCK_MONOTONIC, [&] { loop->stop(); });
    timer.expireIn(std::chrono::milliseconds(0));
    EXPECT_TRUE(loop->run());
    char text[128];
    EXPECT_EQ(::recv(socket.get(), text, sizeof text, MSG_DONTWAIT), -1);
}

} // namespace
} // namespace keystrand::usb
