#include "keystrand-linux/KeystrandService.h"

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
