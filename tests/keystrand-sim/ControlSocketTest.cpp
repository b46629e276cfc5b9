#include "tests/keystrand-sim/SimulatorProcess.h"

#include <cstring>
#include <sys/socket.h>
#include <sys/un.h>
#include <unistd.h>

namespace keystrand::sim::test {

using namespace keystrand::test;

namespace {

class ControlSocketTest : public SimulatorProcess {
  protected:
    void SetUp() override {
        SimulatorProcess::SetUp();
        start();
    }

    std::string reasonOf(const std::string& line) {
        const auto answer = control_->command(line);
        EXPECT_FALSE(answer.ok) << line;
        return answer.reason;
    }

    /// Sends text as it is, says that no more comes and reads everything that is answered.
    std::string rawExchange(const std::string& text) const {
        const int fd = ::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0);
        sockaddr_un address{};
        address.sun_family = AF_UNIX;
        std::strncpy(address.sun_path, controlPath().c_str(), sizeof address.sun_path - 1);
        EXPECT_EQ(::connect(fd, reinterpret_cast<const sockaddr*>(&address), sizeof address), 0);
        EXPECT_EQ(::send(fd, text.data(), text.size(), MSG_NOSIGNAL),
                  static_cast<ssize_t>(text.size()));
        ::shutdown(fd, SHUT_WR);
        std::string answer;
        char buffer[4096];
        for (ssize_t size = 0; (size = ::recv(fd, buffer, sizeof buffer, 0)) > 0;) {
            answer.append(buffer, static_cast<std::size_t>(size));
        }
        ::close(fd);
        return answer;
    }
};

TEST_F(ControlSocketTest, LinesAreAnsweredInTurnAndToTheEnd) {
    EXPECT_EQ(rawExchange("log-level 7\r\nenv get 1\n"), "ok\nvalue empty\nok\n");
}

TEST_F(ControlSocketTest, LineWithoutItsEndIsNotCarriedOut) {
    EXPECT_EQ(rawExchange("log-level 7\nlog-level 8"), "ok\n");
    EXPECT_EQ(ask("status", "log-level"), "7");
}

TEST_F(ControlSocketTest, LongestLineIsTakenAndALongerOneEndsTheConnection) {
    const std::string blanks(8192 - 4, ' ');
    EXPECT_EQ(rawExchange("lock" + blanks + "\n").substr(0, 3), "ok\n");
    EXPECT_EQ(rawExchange("lock" + blanks + " \nunlock\n"), "error line too long\n");
    EXPECT_EQ(rawExchange(std::string(8193, 'x')), "error line too long\n");
    EXPECT_EQ(ask("status", "locked"), "on");
}

TEST_F(ControlSocketTest, UnknownAndMalformedCommands) {
    EXPECT_EQ(reasonOf(""), "unknown command");
    EXPECT_EQ(reasonOf("bogus"), "unknown command");
    EXPECT_EQ(reasonOf("lock now"), "now: not understood");
    EXPECT_EQ(reasonOf("passcode perhaps"), "perhaps: neither on nor off");
    EXPECT_EQ(reasonOf("clock set 0"), "time: bad number");
    EXPECT_EQ(reasonOf("clock set 9007199254740993"), "time: bad number");
    EXPECT_EQ(reasonOf("clock advance 9007199254740992"), "seconds: bad number");
    EXPECT_EQ(reasonOf("log-level 256"), "level: bad number");
    EXPECT_EQ(reasonOf("property set P 0"), "value: not hexadecimal");
    EXPECT_EQ(reasonOf("property get P"), "absent");
    EXPECT_EQ(reasonOf("property remove P"), "absent");
    EXPECT_EQ(reasonOf("env set 1 " + std::string(130, '0')),
              "value too long or too many variables");
    EXPECT_EQ(reasonOf("wait"), "requests, acks or control: missing");
    EXPECT_EQ(reasonOf("wait control=7"), "count: missing");
    EXPECT_EQ(reasonOf("wait acks=1 requests=1"), "requests: not understood");
}

TEST_F(ControlSocketTest, EveryCommandThatHelpNamesIsKnown) {
    const auto help = tell("help");
    EXPECT_GT(help.lines.size(), 20U);
    for (const std::string& line : help.lines) {
        // A word that no command takes, so that nothing is carried out.
        const auto answer = control_->command(line + " bogus bogus");
        EXPECT_FALSE(answer.ok) << line;
        EXPECT_NE(answer.reason, "unknown command") << line;
    }
}

TEST_F(ControlSocketTest, ClockIsMovedByHandOnlyWhenItIsManual) {
    EXPECT_EQ(ask("status", "clock"), "manual");
    tell("clock set 2000000");
    tell("clock advance 5");
    EXPECT_EQ(ask("status", "now"), "2000005");
    tell("clock real");
    EXPECT_EQ(reasonOf("clock advance 1"), "the clock is the real one");
    EXPECT_EQ(ask("status", "clock"), "real");
    tell("clock set 5");
    EXPECT_EQ(ask("status", "now"), "5");
}

TEST_F(ControlSocketTest, PropertiesShowTheirGeneration) {
    tell("property set P 01");
    EXPECT_EQ(ask("property get P", "value"), "01");
    EXPECT_EQ(ask("property get P", "generation"), "1");
    tell("property set P 01");
    EXPECT_EQ(ask("property get P", "generation"), "2");
    EXPECT_EQ(exchange(connect(), propertyRequest(1, "P")), reply(3, 1, 0, 1, {1}));
    EXPECT_EQ(ask("property get P", "handed-out"), "2");
}

TEST_F(ControlSocketTest, RequestsAreLoggedInOrder) {
    const PacketSocket client = openClient();
    static_cast<void>(call(client, frame(24, Bytes().u32(1).u8(0xab))));
    static_cast<void>(call(client, control(5, {1})));
    static_cast<void>(call(client, {0xff}));
    static_cast<void>(call(client, {}));
    static_cast<void>(call(client, frame(99, {})));
    EXPECT_EQ(
        tell("requests").lines,
        (std::vector<std::string>{"request 1 command 24 payload 01000000ab status 0",
                                  "request 2 command 26 control 5 payload 0500000001 status 0",
                                  "request 3 command none payload ff status -6005",
                                  "request 4 command none payload empty status -6005",
                                  "request 5 command 99 payload empty status -6006"}));
    EXPECT_EQ(tell("requests from=5").lines.size(), 1U);
    EXPECT_TRUE(tell("requests from=6").lines.empty());
    EXPECT_EQ(tell("requests from=2 limit=2").lines.back(), "next 4");
    EXPECT_EQ(tell("requests from=4 limit=2").value("next"), std::nullopt);
    tell("requests clear");
    EXPECT_TRUE(tell("requests").lines.empty());
    EXPECT_EQ(ask("status", "requests"), "0");
}

TEST_F(ControlSocketTest, LargeAnswersReachASlowReader) {
    const PacketSocket client = openClient();
    const ByteVector large = frame(1, ByteVector(60'000));
    for (int i = 0; i < 50; ++i) {
        static_cast<void>(call(client, large));
    }
    auto slow = ControlClient::connect(controlPath());
    ASSERT_TRUE(slow && slow->send("requests"));
    EXPECT_EQ(ask("status", "requests"), "50");
    const auto answer = slow->receive();
    ASSERT_TRUE(answer.ok);
    // Cut after the line that passes 4 MiB: 120,000 digits a line.
    EXPECT_EQ(answer.lines.size(), 36U);
    EXPECT_EQ(answer.lines.back(), "next 36");
}

TEST_F(ControlSocketTest, WaitThatIsMetAlready) {
    tell("wait requests=0");
    tell("wait acks=0 timeout=0");
    tell("wait control=7 count=0");
}

TEST_F(ControlSocketTest, WaitIsAnsweredWhenTheCountIsReached) {
    auto acks = ControlClient::connect(controlPath());
    auto controls = ControlClient::connect(controlPath());
    auto requests = ControlClient::connect(controlPath());
    ASSERT_TRUE(acks && acks->send("wait acks=2"));
    ASSERT_TRUE(controls && controls->send("wait control=5 count=1"));
    ASSERT_TRUE(requests && requests->send("wait requests=4"));
    const PacketSocket client = openClient();
    static_cast<void>(call(client, control(7, ackName("P"))));
    static_cast<void>(call(client, control(7, {})));
    static_cast<void>(call(client, control(5, {})));
    EXPECT_TRUE(controls->receive().ok);
    EXPECT_EQ(ask("status", "acks"), "1");
    static_cast<void>(call(client, control(7, ackName("P"))));
    EXPECT_TRUE(acks->receive().ok);
    EXPECT_TRUE(requests->receive().ok);
}

TEST_F(ControlSocketTest, WaitThatIsNotMetEndsInTime) {
    EXPECT_EQ(reasonOf("wait requests=1 timeout=0"), "timeout");
    EXPECT_EQ(reasonOf("wait control=5 count=1 timeout=20"), "timeout");
    EXPECT_TRUE(control_->command("status").ok);
}

TEST_F(ControlSocketTest, LinesAfterAWaitAreCarriedOutAfterIt) {
    EXPECT_EQ(rawExchange("wait requests=1 timeout=20\nlog-level 9\n"), "error timeout\nok\n");
}

TEST_F(ControlSocketTest, ClientThatLeavesWhileItWaits) {
    {
        auto waiting = ControlClient::connect(controlPath());
        ASSERT_TRUE(waiting && waiting->send("wait requests=1"));
    }
    EXPECT_EQ(call(openClient(), control(5, {1})), reply(5, 2, 0, 0));
    EXPECT_TRUE(control_->command("status").ok);
}

TEST_F(ControlSocketTest, ClientsBeyondTheLimitWaitForOneToGo) {
    std::vector<ControlClient> clients;
    for (int i = 0; i < 15; ++i) {
        auto client = ControlClient::connect(controlPath());
        ASSERT_TRUE(client && client->command("status").ok);
        clients.push_back(std::move(*client));
    }
    auto waiting = ControlClient::connect(controlPath());
    ASSERT_TRUE(waiting && waiting->send("status"));
    EXPECT_TRUE(clients.back().command("status").ok);
    clients.pop_back();
    EXPECT_TRUE(waiting->receive().ok);
}

} // namespace

} // namespace keystrand::sim::test
