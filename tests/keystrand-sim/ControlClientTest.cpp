#include "keystrand-sim/ControlClient.h"

#include "tests/support/TemporaryDirectory.h"

#include <gtest/gtest.h>

#include <cstring>
#include <sys/socket.h>
#include <sys/un.h>
#include <unistd.h>

namespace keystrand::sim::test {

namespace {

/// The other end, played by the test: what it writes before the client asks is read as the answer.
class ControlClientTest : public testing::Test {
  protected:
    void SetUp() override {
        listener_ = ::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0);
        sockaddr_un address{};
        address.sun_family = AF_UNIX;
        std::strncpy(address.sun_path, path_.c_str(), sizeof address.sun_path - 1);
        ASSERT_EQ(::bind(listener_, reinterpret_cast<const sockaddr*>(&address), sizeof address),
                  0);
        ASSERT_EQ(::listen(listener_, 1), 0);
        client_ = ControlClient::connect(path_);
        ASSERT_TRUE(client_);
        peer_ = ::accept(listener_, nullptr, nullptr);
    }
    void TearDown() override {
        ::close(peer_);
        ::close(listener_);
    }

    void say(const std::string& text) const {
        ASSERT_EQ(::send(peer_, text.data(), text.size(), MSG_NOSIGNAL),
                  static_cast<ssize_t>(text.size()));
    }

    support::TemporaryDirectory directory_;
    std::string path_ = directory_.file("control.sock");
    int listener_ = -1;
    int peer_ = -1;
    std::optional<ControlClient> client_;
};

TEST_F(ControlClientTest, LinesAndTheirValues) {
    say("key value with blanks\nkeys 2\nkey 3\nok\n");
    const auto answer = client_->command("status");
    EXPECT_TRUE(answer.ok);
    EXPECT_EQ(answer.lines.size(), 3U);
    EXPECT_EQ(answer.value("key"), "value with blanks");
    EXPECT_EQ(answer.value("keys"), "2");
    EXPECT_EQ(answer.value("ke"), std::nullopt);
    char sent[16] = {};
    EXPECT_EQ(::recv(peer_, sent, sizeof sent, 0), 7);
    EXPECT_STREQ(sent, "status\n");
}

TEST_F(ControlClientTest, ErrorsHaveTheirReason) {
    say("error bad luck\nok\n");
    const auto failed = client_->command("a");
    EXPECT_FALSE(failed.ok);
    EXPECT_EQ(failed.reason, "bad luck");
    EXPECT_TRUE(client_->command("b").ok);
}

TEST_F(ControlClientTest, HangUpWithinAnAnswer) {
    say("half an ans");
    ::shutdown(peer_, SHUT_RDWR);
    EXPECT_EQ(client_->receive().reason, "no answer");
    EXPECT_EQ(client_->command("again").reason, "cannot send");
}

TEST_F(ControlClientTest, CommandIsOneLine) {
    EXPECT_FALSE(client_->command("lock\nunlock").ok);
}

TEST_F(ControlClientTest, NobodyListens) {
    EXPECT_FALSE(ControlClient::connect(directory_.file("none.sock")));
    EXPECT_FALSE(ControlClient::connect(directory_.file("none.sock"), 2));
    EXPECT_FALSE(ControlClient::connect(std::string(200, 'p')));
    EXPECT_FALSE(ControlClient::connect(""));
}

} // namespace

} // namespace keystrand::sim::test
