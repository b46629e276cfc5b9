#include "keystrand-linux/SessionsSocket.h"

#include "base/UnixAddress.h"
#include "tests/keystrand/FakeTimers.h"
#include "tests/keystrand/LoopTurns.h"
#include "tests/support/ChildProcess.h"
#include "tests/support/TemporaryDirectory.h"

#include <gtest/gtest.h>

#include <array>
#include <cerrno>
#include <fcntl.h>
#include <grp.h>
#include <memory>
#include <string>
#include <string_view>
#include <sys/socket.h>
#include <sys/stat.h>
#include <vector>

namespace keystrand::usb {
namespace {

using Said = LockState::Said;
using std::chrono::milliseconds;
using std::chrono::minutes;

/// One end of a connection, as `keystrand-sessions` has it.
class Speaker {
  public:
    explicit Speaker(const std::string& path)
        : socket_(::socket(AF_UNIX, SOCK_SEQPACKET | SOCK_CLOEXEC | SOCK_NONBLOCK, 0)) {
        const auto address = base::UnixAddress::of(path).value();
        isConnected_ = ::connect(socket_.get(), address.get(), address.size()) == 0;
    }

    [[nodiscard]] bool isConnected() const { return isConnected_; }

    void say(std::string_view word) const {
        EXPECT_EQ(::send(socket_.get(), word.data(), word.size(), MSG_NOSIGNAL),
                  static_cast<ssize_t>(word.size()));
    }

    /// What is there to read; "nothing", or "the end".
    [[nodiscard]] std::string heard() const {
        std::array<char, 64> packet{};
        const ssize_t size = ::recv(socket_.get(), packet.data(), packet.size(), 0);
        if (size < 0) {
            return errno == EAGAIN ? "nothing" : "the end";
        }
        return size == 0 ? "the end" : std::string(packet.data(), static_cast<std::size_t>(size));
    }

    void hangUp() { socket_.reset(); }

  private:
    base::FileDescriptor socket_;
    bool isConnected_ = false;
};

class SessionsSocketTest : public testing::Test {
  protected:
    SessionsSocketTest() { open(::geteuid()); }

    void open(uid_t user) {
        socket_.reset();
        std::string error;
        socket_ = SessionsSocket::open(
            *loop_, timers_, path_, user,
            [this](const std::string& line) { lines_.push_back(line); }, error);
        ASSERT_NE(socket_, nullptr) << error;
        socket_->listen([this](Said said) { said_.push_back(said); });
    }

    std::unique_ptr<Speaker> connect() {
        auto speaker = std::make_unique<Speaker>(path_);
        EXPECT_TRUE(speaker->isConnected());
        turn();
        return speaker;
    }

    void say(const Speaker& speaker, std::string_view word) {
        speaker.say(word);
        turn();
    }

    void turn() { turnAll(*loop_); }

    std::vector<Said> said() { return std::exchange(said_, {}); }
    std::vector<std::string> lines() { return std::exchange(lines_, {}); }

    const support::TemporaryDirectory directory_;
    const std::string path_ = directory_.file("sessions.sock");
    std::unique_ptr<EventLoop> loop_ = EventLoop::create();
    FakeTimers timers_;
    std::unique_ptr<SessionsSocket> socket_;
    std::vector<Said> said_;
    std::vector<std::string> lines_;
};

using Heard = std::vector<Said>;
using Lines = std::vector<std::string>;

TEST_F(SessionsSocketTest, EachWordIsTold) {
    const auto speaker = connect();
    say(*speaker, "locked");
    EXPECT_EQ(said(), Heard{Said::locked});
    say(*speaker, "unlocked");
    EXPECT_EQ(said(), Heard{Said::unlocked});
    say(*speaker, "going to sleep");
    EXPECT_EQ(said(), Heard{Said::goingToSleep});
    say(*speaker, "awake");
    EXPECT_EQ(said(), Heard{Said::awake});
    EXPECT_EQ(lines(), Lines{});
}

TEST_F(SessionsSocketTest, AwakeIsNewsOnlyAfterSleep) {
    auto speaker = connect();
    say(*speaker, "awake");
    EXPECT_EQ(said(), Heard{});
    say(*speaker, "going to sleep");
    said();
    speaker->hangUp();
    turn();
    EXPECT_EQ(said(), Heard{Said::away});
    speaker = connect();
    say(*speaker, "awake");
    EXPECT_EQ(said(), Heard{Said::awake}) << "it slept when it was heard of last";
    say(*speaker, "awake");
    EXPECT_EQ(said(), Heard{});
}

TEST_F(SessionsSocketTest, ClosedIsAnswerToGoingToSleepAlone) {
    const auto speaker = connect();
    socket_->closed();
    EXPECT_EQ(speaker->heard(), "nothing");
    say(*speaker, "going to sleep");
    EXPECT_EQ(speaker->heard(), "nothing");
    socket_->closed();
    EXPECT_EQ(speaker->heard(), "closed");
    socket_->closed();
    EXPECT_EQ(speaker->heard(), "nothing");
    say(*speaker, "awake");
    say(*speaker, "going to sleep");
    say(*speaker, "awake");
    socket_->closed();
    EXPECT_EQ(speaker->heard(), "nothing") << "the machine is awake again";
}

TEST_F(SessionsSocketTest, AnswerMayBeGivenWhileItIsTold) {
    const auto speaker = connect();
    socket_->listen([this](Said said) {
        if (said == Said::goingToSleep) {
            socket_->closed();
        }
    });
    say(*speaker, "going to sleep");
    EXPECT_EQ(speaker->heard(), "closed");
}

TEST_F(SessionsSocketTest, AnswerThatNobodyTakesIsLost) {
    auto speaker = connect();
    say(*speaker, "going to sleep");
    speaker->hangUp();
    socket_->closed();
    turn();
    speaker = connect();
    EXPECT_EQ(speaker->heard(), "nothing");
    socket_->closed();
    EXPECT_EQ(speaker->heard(), "nothing");
}

TEST_F(SessionsSocketTest, WhatIsNoWordEndsTheConnection) {
    for (const std::string word :
         {"lock", "Locked", "locked ", "locked\n", "away", "closed", "going to sleep.",
          "going to sleep and on", "a record that is longer than any of the words is"}) {
        const auto speaker = connect();
        say(*speaker, word);
        EXPECT_EQ(said(), Heard{Said::away}) << word;
        EXPECT_EQ(speaker->heard(), "the end") << word;
        EXPECT_EQ(lines(),
                  Lines{"keystrand: keystrand-sessions has said what is no word of its own."});
    }
}

TEST_F(SessionsSocketTest, EndLeavesTheStateForAMinute) {
    auto speaker = connect();
    say(*speaker, "unlocked");
    said();
    speaker->hangUp();
    turn();
    EXPECT_EQ(said(), Heard{Said::away});
    EXPECT_EQ(lines(), Lines{"keystrand: keystrand-sessions has hung up."});
    timers_.pass(minutes(1) - milliseconds(1));
    EXPECT_EQ(said(), Heard{});
    timers_.pass(milliseconds(1));
    EXPECT_EQ(said(), Heard{Said::locked});
    EXPECT_EQ(lines(), Lines{"keystrand: nothing was heard of keystrand-sessions for a minute; the "
                             "machine counts as locked."});
    timers_.pass(minutes(60));
    EXPECT_EQ(said(), Heard{});
    EXPECT_EQ(timers_.running(), 0U);
}

TEST_F(SessionsSocketTest, WhoIsBackInTimeKeepsTheState) {
    auto speaker = connect();
    say(*speaker, "unlocked");
    speaker->hangUp();
    turn();
    said();
    timers_.pass(minutes(1) - milliseconds(1));
    speaker = connect();
    timers_.pass(minutes(1));
    EXPECT_EQ(said(), Heard{});
    EXPECT_EQ(timers_.running(), 0U) << "nothing wakes the process while it is connected";
    say(*speaker, "unlocked");
    EXPECT_EQ(said(), Heard{Said::unlocked});
}

TEST_F(SessionsSocketTest, NobodyAtTheStartIsLockedAfterAMinute) {
    timers_.pass(minutes(1) - milliseconds(1));
    EXPECT_EQ(said(), Heard{});
    EXPECT_EQ(lines(), Lines{});
    timers_.pass(milliseconds(1));
    EXPECT_EQ(said(), Heard{Said::locked});
    EXPECT_EQ(lines().size(), 1U);
}

TEST_F(SessionsSocketTest, NewestConnectionCounts) {
    const auto first = connect();
    say(*first, "going to sleep");
    said();
    const auto second = connect();
    EXPECT_EQ(first->heard(), "the end");
    EXPECT_EQ(said(), Heard{}) << "nobody was away";
    socket_->closed();
    EXPECT_EQ(second->heard(), "nothing") << "it has asked nothing";
    say(*second, "unlocked");
    EXPECT_EQ(said(), Heard{Said::unlocked});
}

TEST_F(SessionsSocketTest, OtherUsersMayConnectAndAreNotHeard) {
    open(::geteuid() + 1);
    const auto speaker = connect();
    EXPECT_EQ(speaker->heard(), "the end") << "not even this process's user, or root";
    EXPECT_EQ(said(), Heard{});
    timers_.pass(minutes(1));
    EXPECT_EQ(said(), Heard{Said::locked}) << "it counts as nobody";
}

TEST_F(SessionsSocketTest, UserWithoutRightsIsHeardWhenItIsTheOne) {
    if (::geteuid() != 0) {
        GTEST_SKIP() << "to become another user needs root";
    }
    constexpr uid_t kUser = 54321;
    ASSERT_EQ(::chmod(directory_.path().c_str(), 0755), 0);
    open(kUser);
    const auto talk = [this] {
        if (::setgroups(0, nullptr) != 0 || ::setresgid(kUser, kUser, kUser) != 0 ||
            ::setresuid(kUser, kUser, kUser) != 0) {
            return 1;
        }
        const Speaker speaker(path_);
        speaker.say("unlocked");
        return speaker.isConnected() ? 0 : 2;
    };
    EXPECT_EQ(support::exitStatusOfChild(talk), 0);
    turn();
    EXPECT_EQ(said(), (Heard{Said::unlocked, Said::away}));
}

TEST_F(SessionsSocketTest, FileLetsAnybodyConnectWhateverTheUmaskIs) {
    const mode_t before = ::umask(0077);
    open(::geteuid());
    ::umask(before);
    struct stat file {};
    ASSERT_EQ(::stat(path_.c_str(), &file), 0);
    EXPECT_EQ(file.st_mode & 07777, 0666U);
}

TEST_F(SessionsSocketTest, PlaceThatIsTakenIsAReason) {
    std::string error;
    EXPECT_EQ(SessionsSocket::open(*loop_, timers_, path_, 0, nullptr, error), nullptr);
    EXPECT_EQ(error, path_ + ": another instance listens there");
}

} // namespace
} // namespace keystrand::usb
