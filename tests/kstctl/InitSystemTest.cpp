// What the init system's bus interface is asked for and what becomes of its answers. The other end
// is a connection of the test's own.

#include "kstctl/ExitStatus.h"
#include "kstctl/status/DaemonProcess.h"

#include <gtest/gtest.h>
#include <systemd/sd-bus.h>

#include <atomic>
#include <map>
#include <string>
#include <sys/socket.h>
#include <thread>
#include <unistd.h>
#include <vector>

namespace kstctl {
namespace {

/// Answers questions for properties until it is asked for none any more.
class FakeInitSystem {
  public:
    std::string load = "loaded";
    std::uint64_t started = 0;
    std::uint32_t pid = 0;
    /// Answers nothing but errors.
    bool isBroken = false;

    DaemonState asked() {
        int ends[2] = {-1, -1};
        EXPECT_EQ(::socketpair(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0, ends), 0);
        std::thread server([this, end = ends[0]] { serve(end); });
        sd_bus* client = nullptr;
        EXPECT_GE(sd_bus_new(&client), 0);
        EXPECT_GE(sd_bus_set_fd(client, ends[1], ends[1]), 0);
        EXPECT_GE(sd_bus_start(client), 0);
        DaemonState state = askInitSystem(client);
        sd_bus_flush_close_unref(client);
        server.join();
        return state;
    }

    /// Paths, interfaces and properties in the order of the questions.
    std::vector<std::string> questions;

  private:
    void serve(int end) {
        sd_bus* bus = nullptr;
        sd_id128_t id{};
        sd_bus_new(&bus);
        sd_bus_set_fd(bus, end, end);
        sd_bus_set_server(bus, 1, id);
        sd_bus_add_filter(bus, nullptr, answer, this);
        sd_bus_start(bus);
        while (sd_bus_process(bus, nullptr) >= 0 && sd_bus_wait(bus, UINT64_MAX) >= 0) {
        }
        sd_bus_flush_close_unref(bus);
    }

    static int answer(sd_bus_message* message, void* self, sd_bus_error* /*error*/) {
        if (sd_bus_message_is_method_call(message, "org.freedesktop.DBus.Properties", "Get") <= 0) {
            return 0;
        }
        return static_cast<FakeInitSystem*>(self)->answerGet(message);
    }

    int answerGet(sd_bus_message* message) {
        const char* interface = nullptr;
        const char* property = nullptr;
        sd_bus_message_read(message, "ss", &interface, &property);
        questions.push_back(std::string(sd_bus_message_get_path(message)) + ' ' + interface + ' ' +
                            property);
        if (isBroken) {
            return sd_bus_reply_method_errorf(message, SD_BUS_ERROR_ACCESS_DENIED, "no");
        }
        const std::string name = property;
        if (name == "LoadState") {
            return sd_bus_reply_method_return(message, "v", "s", load.c_str());
        }
        if (name == "MainPID") {
            return sd_bus_reply_method_return(message, "v", "u", pid);
        }
        return sd_bus_reply_method_return(message, "v", "t", started);
    }
};

TEST(InitSystemTest, RunningDaemon) {
    FakeInitSystem init;
    init.started = 1'700'000'000'123'456;
    init.pid = 77;
    const DaemonState state = init.asked();
    EXPECT_FALSE(state.problem);
    EXPECT_EQ(state.pid, 77);
    ASSERT_TRUE(state.lastStart);
    EXPECT_EQ(state.lastStart->nanosecondsSince1970, 1'700'000'000'123'456'000);
    EXPECT_EQ(state.source, "init system");
    const std::string unit = "/org/freedesktop/systemd1/unit/kstd_2eservice ";
    EXPECT_EQ(init.questions, (std::vector<std::string>{
                                  unit + "org.freedesktop.systemd1.Unit LoadState",
                                  unit + "org.freedesktop.systemd1.Service ExecMainStartTimestamp",
                                  unit + "org.freedesktop.systemd1.Service MainPID"}));
}

TEST(InitSystemTest, DaemonThatHasEnded) {
    FakeInitSystem init;
    init.started = 1'700'000'000'000'000;
    const DaemonState state = init.asked();
    EXPECT_FALSE(state.problem);
    EXPECT_FALSE(state.pid);
    EXPECT_TRUE(state.lastStart);
}

TEST(InitSystemTest, DaemonThatWasNeverStarted) {
    FakeInitSystem init;
    const DaemonState state = init.asked();
    EXPECT_FALSE(state.problem);
    EXPECT_FALSE(state.lastStart);
    EXPECT_EQ(state.whyNoStart, "not since the machine has started");
}

TEST(InitSystemTest, MachineWithoutTheUnit) {
    FakeInitSystem init;
    init.load = "not-found";
    const DaemonState state = init.asked();
    ASSERT_TRUE(state.problem);
    EXPECT_EQ(statusOf(*state.problem), ExitStatus::missing);
    EXPECT_EQ(state.problem->description, "there is no unit kstd.service");
}

TEST(InitSystemTest, RefusedQuestion) {
    FakeInitSystem init;
    init.isBroken = true;
    const DaemonState state = init.asked();
    ASSERT_TRUE(state.problem);
    EXPECT_EQ(statusOf(*state.problem), ExitStatus::unreadable);
    EXPECT_EQ(state.problem->description, "the init system cannot be asked: Permission denied");
}

TEST(InitSystemTest, NoConnection) {
    const DaemonState state = askInitSystem(nullptr);
    ASSERT_TRUE(state.problem);
    EXPECT_EQ(statusOf(*state.problem), ExitStatus::failed);
}

} // namespace
} // namespace kstctl
