#include "tests/keystrand-sim/SimulatorProcess.h"

#include <csignal>
#include <filesystem>
#include <sys/socket.h>
#include <sys/un.h>

namespace keystrand::sim::test {

using namespace keystrand::test;

namespace {

/// The program as the init system starts it: with a socket that listens already. The first client
/// makes it start.
class ActivationTest : public SimulatorProcess {
  protected:
    void SetUp() override {
        SimulatorProcess::SetUp();
        std::filesystem::create_directories(path("run/keystrand"));
    }

    void activate(std::vector<std::string> words) {
        const std::vector<std::string> program = commandLine({"--clock", "1000000"});
        words.insert(words.begin(), "/usr/bin/systemd-socket-activate");
        words.insert(words.end(), program.begin(), program.end());
        program_ = std::make_unique<support::Program>(words);
        ASSERT_TRUE(program_->awaitLine("Listening on"));
    }

    [[nodiscard]] PacketSocket connectFirst() {
        PacketSocket client = connect();
        EXPECT_TRUE(program_->awaitLine("keystrand-sim: ready"));
        return client;
    }
};

TEST_F(ActivationTest, ActivatedSocketIsServedAndLeftInPlace) {
    activate({"--seqpacket", "--fdname=service", "--listen=" + servicePath()});
    const PacketSocket first = connectFirst();
    EXPECT_EQ(exchange(first, propertyRequest(1, "P")), reply(3, 1, 0, 0));
    EXPECT_EQ(exchange(connect(), propertyRequest(2, "P")), reply(3, 2, 0, 0));
    program_->signal(SIGTERM);
    EXPECT_EQ(program_->awaitEnd(), 0);
    EXPECT_TRUE(std::filesystem::exists(servicePath()));
    EXPECT_FALSE(std::filesystem::exists(controlPath()));
}

TEST_F(ActivationTest, ClientThatIsGoneBeforeTheStartDoesNotStopTheOthers) {
    activate({"--seqpacket", "--fdname=service", "--listen=" + servicePath()});
    { const PacketSocket gone = connect(); }
    ASSERT_TRUE(program_->awaitLine("keystrand-sim: ready"));
    EXPECT_EQ(exchange(connect(), propertyRequest(1, "P")), reply(3, 1, 0, 0));
}

TEST_F(ActivationTest, SocketOfAnotherNameIsClosedAndItsOwnIsMade) {
    const std::string other = path("run/other.sock");
    activate({"--seqpacket", "--fdname=other", "--listen=" + other});
    const PacketSocket client = PacketSocket::connectedTo(other);
    ASSERT_TRUE(program_->awaitLine("keystrand-sim: ready"));
    EXPECT_TRUE(client.awaitHangUp());
    EXPECT_EQ(exchange(connect(), propertyRequest(1, "P")), reply(3, 1, 0, 0));
    program_->signal(SIGTERM);
    EXPECT_EQ(program_->awaitEnd(), 0);
    EXPECT_FALSE(std::filesystem::exists(servicePath()));
    EXPECT_TRUE(std::filesystem::exists(other));
}

TEST_F(ActivationTest, TheNamedOneOfSeveralIsServed) {
    const std::string other = path("run/other.sock");
    activate({"--seqpacket", "--fdname=other:service", "--listen=" + other,
              "--listen=" + servicePath()});
    const PacketSocket client = connectFirst();
    EXPECT_EQ(exchange(client, propertyRequest(1, "P")), reply(3, 1, 0, 0));
}

TEST_F(ActivationTest, SocketOfAnotherTypeIsRefused) {
    activate({"--datagram", "--fdname=service", "--listen=" + servicePath()});
    const PacketSocket sender(::socket(AF_UNIX, SOCK_DGRAM | SOCK_CLOEXEC, 0));
    sockaddr_un address{};
    address.sun_family = AF_UNIX;
    servicePath().copy(address.sun_path, sizeof address.sun_path - 1);
    ASSERT_EQ(::connect(sender.fd(), reinterpret_cast<const sockaddr*>(&address), sizeof address),
              0);
    ASSERT_TRUE(sender.send({1}));
    EXPECT_EQ(program_->awaitEnd(), 1);
    EXPECT_EQ(program_->lines().back(),
              "keystrand-sim: the activated socket is not a listening packet socket");
    EXPECT_TRUE(std::filesystem::exists(servicePath()));
}

} // namespace

} // namespace keystrand::sim::test
