// A program made of the room alone: a clock of its own, no faults, no policies, nobody to control
// it.

#include "base/UnixAddress.h"
#include "keystrand/Commands.h"
#include "keystrand/EventSender.h"
#include "keystrand/KernelSocketServer.h"
#include "tests/keystrand/Bytes.h"
#include "tests/support/TemporaryDirectory.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <ctime>
#include <sys/socket.h>
#include <thread>

namespace keystrand::test {

namespace {

using testing::ElementsAre;

constexpr std::uint64_t kStart = 1'700'000'000;
constexpr char kEntry[] = "IOService:/IOResources/Keystrand";

/// Counts on from a start, in sleep too, and never leaps.
class BootTimeClock final : public ModelClock {
  public:
    [[nodiscard]] Seconds now() const override { return kStart + sinceBoot() - start_; }

  private:
    static Seconds sinceBoot() {
        timespec time{};
        ::clock_gettime(CLOCK_BOOTTIME, &time);
        return static_cast<Seconds>(time.tv_sec);
    }

    Seconds start_ = sinceBoot();
};

class Program {
  public:
    explicit Program(const std::string& directory)
        : events_(*loop_, directory + "/events.sock"),
          server_(*loop_,
                  std::move(
                      *ListeningSocket::open(directory + "/service.sock", SOCK_SEQPACKET, error_)),
                  handler_) {
        RestrictedModeController::Hooks hooks;
        hooks.rearm = [this] {
            armDeadline();
        };
        hooks.restrictedModeChanged = [this](bool restricted) {
            told.push_back(restricted ? "closed" : "opened");
        };
        hooks.daemonStarted = [this](bool /*allowed*/, const StateBytes& /*state*/) {
            told.push_back("daemon started");
        };
        hooks.acknowledged = [this](const Registry::Record& record) {
            told.push_back("acknowledged " + record.name);
            loop_->stop();
        };
        restrictedMode_.setHooks(std::move(hooks));
        limit_.expireIn(std::chrono::seconds(30));
    }

    bool run() { return loop_->run(); }
    RestrictedModeController& restrictedMode() { return restrictedMode_; }

    std::vector<std::string> told;

  private:
    void armDeadline() {
        deadline_.expireIn(std::chrono::seconds(restrictedMode_.nextDeadline() - clock_.now()));
    }

    std::string error_;
    std::unique_ptr<EventLoop> loop_ = EventLoop::create();
    KernelState kernel_;
    EventSender events_;
    BootTimeClock clock_;
    NotificationPublisher publisher_{kernel_.registry, events_};
    RestrictedModeController restrictedMode_{
        {.untilRestricted = 0}, clock_, kernel_.registry, publisher_};
    DispatchTable controls_ = makeKernelControls(restrictedMode_);
    DispatchTable commands_ = makeServiceCommands(kernel_, controls_);
    RequestHandler handler_{
        {.registry = kernel_.registry, .commands = commands_, .logLevel = kernel_.logLevel}};
    KernelSocketServer server_;
    EventSource deadline_ = loop_->timer(CLOCK_BOOTTIME, [this] { restrictedMode_.catchUp(); });
    EventSource limit_ = loop_->timer(CLOCK_BOOTTIME, [this] { loop_->stop(); });
};

/// Asks one thing after the other, and returns the answers.
std::vector<ByteVector> ask(const std::string& path, const std::vector<ByteVector>& requests) {
    const base::FileDescriptor fd(::socket(AF_UNIX, SOCK_SEQPACKET | SOCK_CLOEXEC, 0));
    const auto address = base::UnixAddress::of(path);
    if (!address || ::connect(fd.get(), address->get(), address->size()) != 0) {
        return {};
    }
    std::vector<ByteVector> answers;
    for (const ByteVector& request : requests) {
        ByteVector answer(4096);
        if (::send(fd.get(), request.data(), request.size(), MSG_NOSIGNAL) < 0) {
            break;
        }
        const ssize_t size = ::recv(fd.get(), answer.data(), answer.size(), 0);
        answer.resize(size > 0 ? static_cast<std::size_t>(size) : 0);
        answers.push_back(answer);
    }
    return answers;
}

TEST(ProgramTest, OneWithoutCredentialsRunsOnTheRoomAlone) {
    const support::TemporaryDirectory directory;
    auto program = std::make_unique<Program>(directory.path());
    program->restrictedMode().lock();

    std::vector<ByteVector> answers;
    std::thread daemon([&] {
        answers = ask(
            directory.file("service.sock"),
            {request(4, 1, Bytes().u32(0).text(kEntry)),
             structCall(2, 0, control(3, Bytes().u8(1).u16(0).fill(13, 0))),
             structCall(3, 17, frame(1, {})),
             request(3, 4, Bytes().u16(sizeof kEntry - 1).text(kEntry).text("KSTRMTimerRestarted")),
             structCall(5, 0, control(7, ackName("KSTRMTimerRestarted")))});
    });
    EXPECT_TRUE(program->run());
    EXPECT_THAT(program->told,
                ElementsAre("closed", "daemon started", "acknowledged KSTRMTimerRestarted"));
    // Hangs up on a client that still waits.
    program.reset();
    daemon.join();
    ASSERT_GE(answers.size(), 4U);
    EXPECT_EQ(answers[0], reply(4, 1, 0, 0));
    EXPECT_EQ(answers[1], reply(5, 2, 0, 0));
    EXPECT_EQ(answers[2], reply(5, 3, -6006, 0));
    EXPECT_EQ(answers[3].size(), 24U + 36U);
}

} // namespace

} // namespace keystrand::test
