// Each system call of the senders and of the alarm's helper failed in turn: they end, with 0 when
// everything is done and with a line when it is not, and the next one does it.

#include "base/UnixAddress.h"
#include "platform/linux/Paths.h"
#include "tests/support/SystemCallErrors.h"
#include "tests/system/CallInjector.h"
#include "tests/system/RelaunchFixture.h"
#include "wire/AlarmAnswer.h"
#include "wire/EventDatagram.h"

#include <array>
#include <cstdlib>
#include <cstring>
#include <fcntl.h>
#include <filesystem>
#include <iostream>
#include <poll.h>
#include <string.h>
#include <sys/socket.h>
#include <unistd.h>

namespace system_tests {
namespace {

namespace fs = std::filesystem;

constexpr int kFirstHandedDescriptor = 3;

class FaultedNotifyTest : public RelaunchFixture {
  protected:
    void SetUp() override {
        fs::create_directories(real("/var/lib/kstd/alarms/com.zerva.alarm"));
        putFile("/var/lib/kstd/alarms/com.zerva.alarm/com.zerva.kstd.alarm",
                bytes("01700000000000000000\n"));
    }

    /// One run. What it has done is in `outcome`.
    void run(const std::string& subject, const std::optional<Fault>& fault, int handed = -1) {
        CallInjector injector(root.path().string(), eventSocket(), fault);
        injector.armAtMain();
        support::SystemCallGate gate(
            {NOTIFY_UNDER, root.path().string(), subject},
            [&injector](const support::SystemCall& call) { return injector.judge(call); },
            [handed] { handOver(handed); });
        status_ = gate.program().awaitEnd().value_or(-1);
        lines_ = gate.program().lines();
        points_ = injector.points();
    }

    /// Has `act` run with every fault, and first without one.
    void failEachCallOf(const std::string& subject,
                        const std::function<void(const std::optional<Fault>& fault)>& act) {
        act(std::nullopt);
        EXPECT_EQ(status_, 0);
        std::size_t number = 0;
        std::size_t tried = 0;
        for (const CallPoint& point : std::vector(points_)) {
            for (const int error : point.errors) {
                for (const bool lasts : {false, true}) {
                    if (number++ % KSTD_FAULT_STEP == 0) {
                        SCOPED_TRACE(point.name() + ' ' + ::strerrorname_np(error) +
                                     (lasts ? " lasting" : " once"));
                        ++tried;
                        act(Fault{point, error, lasts});
                    }
                }
            }
        }
        std::cout << subject << ": " << points_.size() << " calls, " << number << " faults, "
                  << tried << " tried\n";
        EXPECT_GT(number, 10U);
    }

    /// The notices of a subject, sent or not sent with a line.
    void send(const std::string& subject, const std::optional<Fault>& fault) {
        dropEvents();
        run(subject, fault);
        const bool isSent = received() == 1;
        EXPECT_TRUE(status_ == 0 || status_ == 1) << status_;
        if (fault && !isSent) {
            EXPECT_EQ(status_, 1);
        }
        EXPECT_EQ(status_ == 0, isSent);
        EXPECT_EQ(status_ != 0, saysWhy()) << testing::PrintToString(lines_);
    }

    [[nodiscard]] bool saysWhy() const {
        return !lines_.empty() && lines_.back().starts_with("kstd-notify: ");
    }

    [[nodiscard]] int received() const {
        int count = 0;
        char byte = 0;
        while (::recv(eventSocket(), &byte, sizeof byte, MSG_DONTWAIT) >= 0) {
            ++count;
        }
        return count;
    }

    static std::vector<std::uint8_t> bytes(std::string_view text) {
        return {text.begin(), text.end()};
    }

    static void handOver(int socket) {
        if (socket < 0) {
            return;
        }
        const int copy = ::fcntl(socket, F_DUPFD, kFirstHandedDescriptor + 1);
        ::dup2(copy, kFirstHandedDescriptor);
        ::close(copy);
        ::setenv("LISTEN_FDS", "1", 1);
        ::setenv("LISTEN_FDNAMES", "alarms", 1);
        ::setenv("LISTEN_PID", std::to_string(::getpid()).c_str(), 1);
    }

    int status_ = 0;
    Lines lines_;
    std::vector<CallPoint> points_;
};

TEST_F(FaultedNotifyTest, Settings) {
    failEachCallOf("settings",
                   [this](const std::optional<Fault>& fault) { send("settings", fault); });
}

TEST_F(FaultedNotifyTest, Alarm) {
    failEachCallOf("alarm", [this](const std::optional<Fault>& fault) { send("alarm", fault); });
}

/// The daemon's side of a question to the alarm's helper.
class Question {
  public:
    explicit Question(const std::string& path) {
        int ends[2];
        EXPECT_EQ(::socketpair(AF_UNIX, SOCK_SEQPACKET | SOCK_CLOEXEC, 0, ends), 0);
        answers_ = base::FileDescriptor(ends[0]);
        const base::FileDescriptor helpers(ends[1]);
        const base::FileDescriptor sender(::socket(AF_UNIX, SOCK_DGRAM | SOCK_CLOEXEC, 0));
        const auto address = base::UnixAddress::of(path).value();
        char content = 1;
        iovec data{&content, sizeof content};
        alignas(cmsghdr) std::array<char, CMSG_SPACE(sizeof(int))> control{};
        msghdr message{};
        message.msg_name = const_cast<sockaddr*>(address.get());
        message.msg_namelen = address.size();
        message.msg_iov = &data;
        message.msg_iovlen = 1;
        message.msg_control = control.data();
        message.msg_controllen = control.size();
        cmsghdr* const rights = CMSG_FIRSTHDR(&message);
        rights->cmsg_level = SOL_SOCKET;
        rights->cmsg_type = SCM_RIGHTS;
        rights->cmsg_len = CMSG_LEN(sizeof(int));
        const int descriptor = helpers.get();
        std::memcpy(CMSG_DATA(rights), &descriptor, sizeof descriptor);
        EXPECT_GT(::sendmsg(sender.get(), &message, 0), 0);
    }

    /// What was answered; none when nobody did, and nobody will.
    [[nodiscard]] std::optional<wire::AlarmAnswer> answer() const {
        std::array<std::uint8_t, wire::kAlarmAnswerMaxSize> buffer{};
        const ssize_t size = ::recv(answers_.get(), buffer.data(), buffer.size(), MSG_DONTWAIT);
        return size > 0 ? wire::decodeAlarmAnswer({buffer.data(), static_cast<std::size_t>(size)})
                        : std::nullopt;
    }

  private:
    base::FileDescriptor answers_;
};

/// There is no bus under the root, so no timer either: the helper says so.
TEST_F(FaultedNotifyTest, HelperWithoutABus) {
    const std::string path = real("/run/kstd/alarms.sock");
    const base::FileDescriptor socket(
        ::socket(AF_UNIX, SOCK_DGRAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0));
    const auto address = base::UnixAddress::of(path).value();
    const int on = 1;
    ASSERT_EQ(::setsockopt(socket.get(), SOL_SOCKET, SO_PASSCRED, &on, sizeof on), 0);
    ASSERT_EQ(::bind(socket.get(), address.get(), address.size()), 0);
    const auto waits = [&socket] {
        pollfd watched{socket.get(), POLLIN, 0};
        return ::poll(&watched, 1, 0) > 0;
    };
    failEachCallOf("arm", [&](const std::optional<Fault>& fault) {
        const Question question(path);
        run("arm", fault, socket.get());
        EXPECT_TRUE(status_ == 0 || status_ == 1) << status_;
        // The daemon knows, or the unit has failed with a line, or the question waits for the next.
        const auto answer = question.answer();
        EXPECT_TRUE(answer || (status_ == 1 && saysWhy()) || waits())
            << status_ << testing::PrintToString(lines_);
        if (answer) {
            EXPECT_EQ(answer->timer, wire::AlarmAnswer::Timer::failed);
        }
        if (waits()) {
            run("arm", std::nullopt, socket.get());
            EXPECT_TRUE(question.answer());
        }
    });
}

} // namespace
} // namespace system_tests
