#include "base/UnixAddress.h"
#include "keystrand-sessions/KeystrandLink.h"
#include "tests/keystrand/FakeTimers.h"
#include "tests/keystrand/LoopTurns.h"
#include "tests/support/TemporaryDirectory.h"

#include <gtest/gtest.h>

#include <array>
#include <memory>
#include <string>
#include <string_view>
#include <sys/socket.h>
#include <unistd.h>
#include <utility>
#include <vector>

namespace keystrand::sessions {
namespace {

using std::chrono::milliseconds;
using std::chrono::seconds;

class SocketLinkTest : public testing::Test {
  protected:
    void listen() {
        listening_ = base::FileDescriptor(
            ::socket(AF_UNIX, SOCK_SEQPACKET | SOCK_CLOEXEC | SOCK_NONBLOCK, 0));
        const auto address = base::UnixAddress::of(path_).value();
        ASSERT_EQ(::bind(listening_.get(), address.get(), address.size()), 0);
        ASSERT_EQ(::listen(listening_.get(), 1), 0);
    }

    void start() {
        link_.start({[this] { told_.emplace_back("connected"); },
                     [this] { told_.emplace_back("closed"); },
                     [this] {
                         told_.emplace_back("lost");
                     }});
        EXPECT_EQ(told_, std::vector<std::string>{}) << "not from within the call";
        pass(milliseconds(0));
    }

    void accept() {
        peer_ = base::FileDescriptor(::accept4(listening_.get(), nullptr, nullptr, SOCK_NONBLOCK));
        ASSERT_TRUE(peer_.isOpen());
    }

    void answer(std::string_view text) {
        ASSERT_EQ(::send(peer_.get(), text.data(), text.size(), MSG_NOSIGNAL),
                  static_cast<ssize_t>(text.size()));
        turnAll(*loop_);
    }

    std::string heard() {
        std::array<char, 64> packet{};
        const ssize_t size = ::recv(peer_.get(), packet.data(), packet.size(), 0);
        return size < 0 ? "nothing" : std::string(packet.data(), static_cast<std::size_t>(size));
    }

    void pass(milliseconds time) {
        timers_.pass(time);
        turnAll(*loop_);
    }

    std::vector<std::string> told() { return std::exchange(told_, {}); }

    const support::TemporaryDirectory directory_;
    const std::string path_ = directory_.file("sessions.sock");
    std::unique_ptr<EventLoop> loop_ = EventLoop::create();
    FakeTimers timers_;
    SocketLink link_{*loop_, timers_, path_};
    base::FileDescriptor listening_;
    base::FileDescriptor peer_;
    std::vector<std::string> told_;
};

using Told = std::vector<std::string>;

TEST_F(SocketLinkTest, SaysEachWordInAPacketOfItsOwn) {
    listen();
    start();
    EXPECT_EQ(told(), Told{"connected"});
    EXPECT_TRUE(link_.isConnected());
    accept();
    for (const Word word : {Word::locked, Word::unlocked, Word::goingToSleep, Word::awake}) {
        link_.say(word);
    }
    EXPECT_EQ(heard(), "locked");
    EXPECT_EQ(heard(), "unlocked");
    EXPECT_EQ(heard(), "going to sleep");
    EXPECT_EQ(heard(), "awake");
    EXPECT_EQ(heard(), "nothing");
    EXPECT_EQ(timers_.running(), 0U);
}

TEST_F(SocketLinkTest, HearsClosedAndNothingElse) {
    listen();
    start();
    accept();
    told();
    for (const std::string_view text :
         {"close", "closed ", "opened", "closed, and more than there is room for"}) {
        answer(text);
        EXPECT_EQ(told(), Told{}) << text;
    }
    answer("closed");
    EXPECT_EQ(told(), Told{"closed"});
}

TEST_F(SocketLinkTest, TriesAgainEachSecondUntilSomebodyListens) {
    start();
    EXPECT_FALSE(link_.isConnected());
    pass(seconds(5));
    link_.say(Word::locked);
    EXPECT_EQ(told(), Told{});
    listen();
    pass(milliseconds(999));
    EXPECT_EQ(told(), Told{});
    pass(milliseconds(1));
    EXPECT_EQ(told(), Told{"connected"});
    accept();
    EXPECT_EQ(heard(), "nothing") << "what was said to nobody";
}

TEST_F(SocketLinkTest, ConnectsAgainASecondAfterTheEnd) {
    listen();
    start();
    accept();
    told();
    peer_.reset();
    turnAll(*loop_);
    EXPECT_EQ(told(), Told{"lost"});
    EXPECT_FALSE(link_.isConnected());
    pass(milliseconds(999));
    EXPECT_EQ(told(), Told{});
    pass(milliseconds(1));
    EXPECT_EQ(told(), Told{"connected"});
}

TEST_F(SocketLinkTest, PeerThatReadsNothingIsLeft) {
    listen();
    start();
    accept();
    told();
    for (int i = 0; i < 10000 && told_.empty(); ++i) {
        link_.say(Word::locked);
        turnAll(*loop_);
    }
    EXPECT_EQ(told(), Told{"lost"});
}

TEST_F(SocketLinkTest, PathThatIsNoAddressIsTriedAndNeverReached) {
    SocketLink link(*loop_, timers_, std::string(200, 'x'));
    link.start({[] { FAIL(); }, [] { FAIL(); },
                [] {
                    FAIL();
                }});
    pass(seconds(3));
    EXPECT_FALSE(link.isConnected());
    EXPECT_EQ(timers_.running(), 1U);
}

} // namespace
} // namespace keystrand::sessions
