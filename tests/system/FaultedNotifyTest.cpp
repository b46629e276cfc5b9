// Each system call of the senders and of the alarm's helper failed in turn: they end, with 0 when
// everything is done and with a line when it is not, and the next one does it.

#include "base/UnixAddress.h"
#include "platform/linux/Paths.h"
#include "tests/neighbours/Bus.h"
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
        if (!fault && points_.empty()) {
            points_ = injector.points();
        }
    }

    /// Has `act` run with every fault, and first without one.
    void failEachCallOf(const std::string& subject,
                        const std::function<void(const std::optional<Fault>& fault)>& act,
                        std::size_t step = KSTD_FAULT_STEP) {
        // The calls of the first run that this makes.
        act(std::nullopt);
        EXPECT_EQ(status_, 0);
        std::size_t number = 0;
        std::size_t tried = 0;
        for (const CallPoint& point : std::vector(points_)) {
            for (const int error : point.errors) {
                for (const bool lasts : {false, true}) {
                    const std::string name = point.name() + ' ' + ::strerrorname_np(error) +
                                             (lasts ? " lasting" : " once");
                    if (isWanted(name, number++, step)) {
                        SCOPED_TRACE(name);
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

    /// By a text that the fault's name holds, which KSTD_FAULT may give; otherwise by its number.
    [[nodiscard]] static bool isWanted(const std::string& name, std::size_t number,
                                       std::size_t step) {
        const char* const text = std::getenv("KSTD_FAULT");
        return text != nullptr ? name.find(text) != std::string::npos : number % step == 0;
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

/// The alarm's helper, with the socket at which it is asked.
class FaultedHelperTest : public FaultedNotifyTest {
  protected:
    void SetUp() override {
        fs::create_directories(real("/var/lib/kstd/alarms/com.zerva.alarm"));
        fs::create_directories(fs::path(real(kBus)).parent_path());
        const auto address = base::UnixAddress::of(path_).value();
        const int on = 1;
        ASSERT_EQ(::setsockopt(socket_.get(), SOL_SOCKET, SO_PASSCRED, &on, sizeof on), 0);
        ASSERT_EQ(::bind(socket_.get(), address.get(), address.size()), 0);
    }

    void putAlarm(std::string_view line) {
        putFile("/var/lib/kstd/alarms/com.zerva.alarm/com.zerva.kstd.alarm", bytes(line));
    }

    void arm(const std::optional<Fault>& fault) {
        run("arm", fault, socket_.get());
        EXPECT_TRUE(status_ == 0 || status_ == 1) << status_;
        EXPECT_TRUE(status_ == 0 || saysWhy()) << "ended with 1, and no line says why";
    }

    /// The bus, with an init system that has no timer yet.
    [[nodiscard]] std::unique_ptr<neighbours::Bus> newBus() const {
        fs::remove(real(kBus));
        return std::make_unique<neighbours::Bus>(real(kBus), neighbours::Random(1), 0);
    }

    [[nodiscard]] Question ask() const { return Question(path_); }
    [[nodiscard]] bool questionWaits() const {
        pollfd watched{socket_.get(), POLLIN, 0};
        return ::poll(&watched, 1, 0) > 0;
    }
    void dropQuestions() const {
        char byte = 0;
        while (::recv(socket_.get(), &byte, sizeof byte, MSG_DONTWAIT) >= 0) {
        }
    }

  private:
    static constexpr char kBus[] = "/run/dbus/system_bus_socket";

    const std::string path_ = real("/run/kstd/alarms.sock");
    const base::FileDescriptor socket_{
        ::socket(AF_UNIX, SOCK_DGRAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0)};
};

using Timer = wire::AlarmAnswer::Timer;

/// Each try is two helpers, which is long for every run of all tests.
constexpr std::size_t kBusStep = KSTD_FAULT_STEP == 1 ? 1 : 5 * KSTD_FAULT_STEP;

constexpr std::string_view kComes = "04102444800000000000\n";
constexpr std::int64_t kComesAt = 4'102'444'800'000'000'000;
constexpr std::string_view kIsDue = "01700000000000000000\n";
constexpr std::string_view kIsCancelled = "none                \n";

/// There is no bus under the root, so no timer either: the helper says so.
TEST_F(FaultedHelperTest, WithoutABus) {
    putAlarm(kIsDue);
    failEachCallOf("arm", [&](const std::optional<Fault>& fault) {
        const Question question = ask();
        arm(fault);
        // The daemon knows, or the unit has failed with a line, or the question waits for the next.
        const auto answer = question.answer();
        EXPECT_TRUE(answer || status_ == 1 || questionWaits())
            << status_ << testing::PrintToString(lines_);
        if (answer) {
            EXPECT_EQ(answer->timer, Timer::failed);
        }
        if (questionWaits()) {
            arm(std::nullopt);
            EXPECT_TRUE(question.answer());
        }
    });
}

/// Where the answer is that the timer waits, it does; whatever else becomes of it, a line says why
/// or the timer waits all the same, and the next helper's does.
TEST_F(FaultedHelperTest, MakesTheTimer) {
    putAlarm(kComes);
    failEachCallOf(
        "arm an alarm",
        [&](const std::optional<Fault>& fault) {
            dropQuestions();
            const auto bus = newBus();
            const auto waits = [&bus] {
                return bus->toldTime() == static_cast<std::uint64_t>(kComesAt / 1000);
            };
            const Question question = ask();
            arm(fault);
            const auto answer = question.answer();
            if (answer && answer->timer == Timer::waits) {
                EXPECT_EQ(answer->date, kComesAt);
                EXPECT_TRUE(waits()) << "a timer of which the init system has not told";
            } else {
                EXPECT_TRUE(fault);
                EXPECT_TRUE(!lines_.empty() || waits()) << "no timer, and no line says why";
                EXPECT_TRUE(!answer || answer->timer == Timer::none || !answer->reason.empty());
            }
            const Question next = ask();
            arm(std::nullopt);
            EXPECT_EQ(status_, 0) << testing::PrintToString(lines_);
            EXPECT_TRUE(waits()) << "no timer at the next try";
            const auto nextAnswer = next.answer();
            EXPECT_TRUE(nextAnswer && nextAnswer->timer == Timer::waits &&
                        nextAnswer->date == kComesAt);
        },
        kBusStep);
}

TEST_F(FaultedHelperTest, TakesTheTimerAway) {
    putAlarm(kIsCancelled);
    failEachCallOf(
        "arm nothing",
        [&](const std::optional<Fault>& fault) {
            dropQuestions();
            const auto bus = newBus();
            const Question question = ask();
            arm(fault);
            const auto answer = question.answer();
            if (!answer || answer->timer != Timer::none) {
                EXPECT_TRUE(fault);
                EXPECT_TRUE(!answer || saysWhy()) << "no line says why";
            }
            const Question next = ask();
            arm(std::nullopt);
            const auto nextAnswer = next.answer();
            EXPECT_TRUE(nextAnswer && nextAnswer->timer == Timer::none);
        },
        kBusStep);
}

/// Nobody asks, so it is the helper that has what is due sent. With 1 it is started again.
TEST_F(FaultedHelperTest, FiresWhatIsDue) {
    putAlarm(kIsDue);
    failEachCallOf(
        "arm what is due",
        [&](const std::optional<Fault>& fault) {
            const auto bus = newBus();
            arm(fault);
            if (status_ == 0) {
                EXPECT_GT(bus->servicesStarted(), 0U);
            } else {
                arm(std::nullopt);
                EXPECT_EQ(status_, 0) << testing::PrintToString(lines_);
                EXPECT_GT(bus->servicesStarted(), 0U);
            }
        },
        kBusStep);
}

} // namespace
} // namespace system_tests
