#include "platform/linux/LinuxHost.h"

#include "base/UnixAddress.h"
#include "platform/EventStream.h"
#include "platform/MainRunLoop.h"
#include "platform/ProcessTransaction.h"
#include "platform/linux/EventSocket.h"
#include "platform/linux/LinuxClock.h"
#include "tests/platform/linux/RootDirectory.h"
#include "tests/platform/linux/StandardErrorCapture.h"
#include "tests/platform/linux/alarms/FakeAlarmHelper.h"
#include "tests/support/TerminationSignal.h"
#include "wire/EventDatagram.h"

#include <gmock/gmock.h>

#include <cstdlib>
#include <fcntl.h>
#include <filesystem>
#include <memory>
#include <new>
#include <string>
#include <sys/resource.h>
#include <sys/socket.h>
#include <vector>

namespace platform {
namespace {

using testing::ElementsAre;
using testing::HasSubstr;

constexpr std::int64_t kFarAway = 4'102'444'800'000'000'000;
constexpr char kAlarms[] = "com.zerva.alarm";

class LinuxHostTest : public testing::Test {
  protected:
    LinuxHostTest() {
        for (const char* const directory : {"/run/kstd", "/etc/kstd", "/var/lib/kstd"}) {
            root.makeDirectory(directory);
        }
    }

    void start(std::optional<std::chrono::milliseconds> idleTime = std::nullopt) {
        start(idleTime, makeEventSocket(root.paths().eventSocket()));
    }

    void start(std::optional<std::chrono::milliseconds> idleTime,
               base::FileDescriptor eventSocket) {
        host = std::make_unique<LinuxHost>(LinuxHostOptions{.paths = root.paths(),
                                                            .eventSocket = std::move(eventSocket),
                                                            .idleTime = idleTime,
                                                            .stop = stop,
                                                            .alarms = {"alarm"}});
        for (const char* const stream : {"com.zerva.notifyd.matching", kAlarms}) {
            interfaces().events.setHandler(stream, [this](const Event& event) {
                delivered.push_back(event.name);
                if (event.name == "stops the process") {
                    support::TerminationSignal::send();
                }
            });
        }
    }

    [[nodiscard]] Host interfaces() { return host->interfaces(); }

    void send(std::string_view stream, std::string_view name,
              const std::vector<std::uint8_t>& payload = {}) {
        const base::FileDescriptor sender(::socket(AF_UNIX, SOCK_DGRAM | SOCK_CLOEXEC, 0));
        const auto datagram = wire::encodeEvent(stream, name, payload).value();
        const auto address = base::UnixAddress::of(root.paths().eventSocket()).value();
        ASSERT_EQ(::sendto(sender.get(), datagram.data(), datagram.size(), 0, address.get(),
                           address.size()),
                  static_cast<ssize_t>(datagram.size()));
    }

    void handleAll() {
        for (int i = 0; i < 10; ++i) {
            EXPECT_TRUE(interfaces().runLoop.runOnce({0}));
        }
    }

    void setAlarm(std::int64_t date) {
        const EventDictionary dictionary{{kAlarmDateKey, {date}}};
        interfaces().alarms.set(kAlarms, "alarm", &dictionary);
    }

    /// The helper says that the timer waits for the date.
    static void confirm(const FakeAlarmHelper& helper, std::int64_t date) {
        const auto asked = helper.question();
        ASSERT_TRUE(asked);
        asked->answer(wire::AlarmAnswer{wire::AlarmAnswer::Timer::waits, true, date, {}});
    }

    void breakAlarms() const {
        std::filesystem::remove_all(root.paths().alarmDirectory());
        root.put("/var/lib/kstd/alarms", std::string("a file"));
    }
    void mendAlarms() const { std::filesystem::remove(root.paths().alarmDirectory()); }

    static std::vector<std::uint8_t> dateBytes(std::int64_t date) {
        std::vector<std::uint8_t> bytes(8);
        for (std::size_t i = 0; i < bytes.size(); ++i) {
            bytes[i] = static_cast<std::uint8_t>(static_cast<std::uint64_t>(date) >> (8 * i));
        }
        return bytes;
    }

    support::RootDirectory root;
    std::vector<std::string> delivered;
    std::unique_ptr<LinuxHost> host;
    const StopRequest* stop = nullptr;
};

TEST_F(LinuxHostTest, IdleHostSaysThatItStopsAndLeavesTheLoopWithoutSources) {
    const base::FileDescriptor listener = makeEventSocket(root.real("/run/notify"));
    ::setenv("NOTIFY_SOCKET", root.real("/run/notify").c_str(), 1);
    start(std::chrono::milliseconds(1));
    while (interfaces().runLoop.runOnce(kDistantFuture)) {
    }
    ::unsetenv("NOTIFY_SOCKET");
    char message[64] = {};
    EXPECT_GT(::recv(listener.get(), message, sizeof message - 1, MSG_DONTWAIT), 0);
    EXPECT_STREQ(message, "STOPPING=1");
}

TEST_F(LinuxHostTest, HostWithSomethingInHandDoesNotEnd) {
    start(std::chrono::milliseconds(1));
    auto transaction = std::make_unique<ProcessTransaction>(interfaces().transactions, "busy");
    EXPECT_TRUE(interfaces().runLoop.runOnce({realTimeNow().nanosecondsSince1970 + 10'000'000}));
    EXPECT_TRUE(interfaces().runLoop.runOnce({0}));
    transaction.reset();
    while (interfaces().runLoop.runOnce(kDistantFuture)) {
    }
}

TEST_F(LinuxHostTest, AlarmForWhichNobodyElseWaitsKeepsTheProcess) {
    const FakeAlarmHelper helper(root.paths().alarmHelperSocket());
    start(std::chrono::milliseconds(1));
    setAlarm(kFarAway);
    for (int idleTimes = 0; idleTimes < 5; ++idleTimes) {
        EXPECT_TRUE(interfaces().runLoop.runOnce(kDistantFuture));
    }
    confirm(helper, kFarAway);
    while (interfaces().runLoop.runOnce(kDistantFuture)) {
    }
}

TEST_F(LinuxHostTest, AlarmThatIsNotOnDiskKeepsTheProcessUntilItIs) {
    const FakeAlarmHelper helper(root.paths().alarmHelperSocket());
    start(std::chrono::milliseconds(1));
    breakAlarms();
    setAlarm(kFarAway);
    confirm(helper, kFarAway);
    for (int idleTimes = 0; idleTimes < 5; ++idleTimes) {
        EXPECT_TRUE(interfaces().runLoop.runOnce(kDistantFuture));
    }
    mendAlarms();
    while (!helper.question()) {
        ASSERT_TRUE(interfaces().runLoop.runOnce(kDistantFuture));
    }
    EXPECT_TRUE(root.bytesOf("/var/lib/kstd/alarms/com.zerva.alarm/alarm"));
    // The answer comes with the next registration only: this helper has lost the question.
    setAlarm(kFarAway);
    confirm(helper, kFarAway);
    while (interfaces().runLoop.runOnce(kDistantFuture)) {
    }
}

TEST_F(LinuxHostTest, ProcessStaysForAnIdleTimeAfterAnEventOfItsOwn) {
    constexpr std::int64_t kIdleTime = 100'000'000;
    start(std::chrono::milliseconds(kIdleTime / 1'000'000));
    setAlarm(realTimeNow().nanosecondsSince1970 + kIdleTime / 2);
    Date handled{};
    while (interfaces().runLoop.runOnce(kDistantFuture)) {
        if (!delivered.empty() && handled == Date{}) {
            handled = realTimeNow();
        }
    }
    EXPECT_THAT(delivered, ElementsAre("alarm"));
    EXPECT_GE(realTimeNow().nanosecondsSince1970 - handled.nanosecondsSince1970,
              kIdleTime - 1'000'000);
}

TEST_F(LinuxHostTest, EventThatArrivesAfterTheEndStaysInTheSocketForTheNextProcess) {
    base::FileDescriptor first = makeEventSocket(root.paths().eventSocket());
    // The init system's own descriptor of the socket.
    base::FileDescriptor kept(::fcntl(first.get(), F_DUPFD_CLOEXEC, 0));
    start(std::nullopt, std::move(first));
    host->closeStreams();
    send("com.zerva.notifyd.matching", "late");
    EXPECT_FALSE(interfaces().runLoop.runOnce({0}));
    EXPECT_THAT(delivered, ElementsAre());
    start(std::nullopt, std::move(kept));
    handleAll();
    EXPECT_THAT(delivered, ElementsAre("late"));
}

/// A host that looks for SIGTERM.
class StoppedHostTest : public LinuxHostTest {
  protected:
    StoppedHostTest() { stop = &request_; }
    ~StoppedHostTest() override { host.reset(); }

    void runToTheEnd() {
        while (interfaces().runLoop.runOnce(kDistantFuture)) {
        }
    }

  private:
    const support::TerminationSignal signal_;
    const StopRequest request_;
};

TEST_F(StoppedHostTest, TheEventInHandIsTheLastAndWhatIsQueuedStaysInTheSocket) {
    base::FileDescriptor first = makeEventSocket(root.paths().eventSocket());
    base::FileDescriptor kept(::fcntl(first.get(), F_DUPFD_CLOEXEC, 0));
    start(std::chrono::hours(1), std::move(first));
    for (const char* const event : {"before", "stops the process", "queued"}) {
        send("com.zerva.notifyd.matching", event);
    }
    runToTheEnd();
    EXPECT_THAT(delivered, ElementsAre("before", "stops the process"));
    stop = nullptr;
    start(std::nullopt, std::move(kept));
    handleAll();
    EXPECT_THAT(delivered, ElementsAre("before", "stops the process", "queued"));
}

TEST_F(StoppedHostTest, WhatWasReceivedIsDelivered) {
    start();
    send("com.zerva.notifyd.matching", "received");
    EXPECT_TRUE(interfaces().runLoop.runOnce({0}));
    support::TerminationSignal::send();
    EXPECT_THAT(delivered, ElementsAre());
    runToTheEnd();
    EXPECT_THAT(delivered, ElementsAre("received"));
}

TEST_F(StoppedHostTest, WaitingForAnAlarmEnds) {
    start(std::chrono::hours(1));
    setAlarm(kFarAway);
    support::TerminationSignal::send();
    runToTheEnd();
    EXPECT_THAT(delivered, ElementsAre());
}

TEST_F(StoppedHostTest, AlarmThatIsNotOnDiskIsTriedOnceMore) {
    start(std::chrono::hours(1));
    breakAlarms();
    setAlarm(kFarAway);
    mendAlarms();
    const support::StandardErrorCapture standardError;
    support::TerminationSignal::send();
    runToTheEnd();
    EXPECT_TRUE(root.bytesOf("/var/lib/kstd/alarms/com.zerva.alarm/alarm"));
    EXPECT_EQ(standardError.text(), "");
}

TEST_F(StoppedHostTest, AlarmThatDoesNotGetOntoDiskIsLostWithALine) {
    start(std::chrono::hours(1));
    breakAlarms();
    setAlarm(kFarAway);
    const support::StandardErrorCapture standardError;
    support::TerminationSignal::send();
    runToTheEnd();
    EXPECT_EQ(standardError.text(),
              "kstd: AlarmStore: the alarm is lost until the kernel side sends it again: " +
                  root.real("/var/lib/kstd/alarms/com.zerva.alarm/alarm") + ": Not a directory.\n");
}

TEST_F(StoppedHostTest, AStopBeforeTheFirstTurnIsSeenAndSaidOnce) {
    const base::FileDescriptor listener = makeEventSocket(root.real("/run/notify"));
    ::setenv("NOTIFY_SOCKET", root.real("/run/notify").c_str(), 1);
    support::TerminationSignal::send();
    start(std::chrono::milliseconds(0));
    send("com.zerva.notifyd.matching", "queued");
    runToTheEnd();
    host->closeStreams();
    ::unsetenv("NOTIFY_SOCKET");
    EXPECT_THAT(delivered, ElementsAre());
    char message[64] = {};
    EXPECT_GT(::recv(listener.get(), message, sizeof message - 1, MSG_DONTWAIT), 0);
    EXPECT_STREQ(message, "STOPPING=1");
    EXPECT_LT(::recv(listener.get(), message, sizeof message, MSG_DONTWAIT), 0);
}

TEST_F(LinuxHostTest, AlarmDatagramCountsForThePresentRegistrationOnly) {
    start();
    setAlarm(kFarAway);
    send(kAlarms, "alarm", dateBytes(kFarAway + 1));
    handleAll();
    EXPECT_THAT(delivered, ElementsAre());
    send(kAlarms, "alarm", dateBytes(kFarAway));
    send("com.zerva.notifyd.matching", "after");
    for (int i = 0; i < 10 && interfaces().runLoop.runOnce({0}); ++i) {
    }
    EXPECT_THAT(delivered, ElementsAre("alarm", "after"));
}

TEST_F(LinuxHostTest, AlarmDatagramWithoutADateIsDroppedWithALine) {
    start();
    setAlarm(kFarAway);
    const support::StandardErrorCapture standardError;
    send(kAlarms, "alarm");
    handleAll();
    EXPECT_THAT(standardError.text(),
                HasSubstr("kstd: EventSocket: dropped alarm alarm without a date.\n"));
    EXPECT_THAT(delivered, ElementsAre());
}

TEST_F(LinuxHostTest, HostWithoutAnEventSocketSaysSo) {
    const support::StandardErrorCapture standardError;
    const LinuxHost lonely({.paths = root.paths()});
    EXPECT_THAT(
        standardError.text(),
        HasSubstr("kstd: EventSocket: no socket was handed over; no events will arrive.\n"));
}

TEST_F(LinuxHostTest, ProgramsOwnStatusIsTheProcesss) {
    start();
    EXPECT_EQ(host->run([](const Host&) { return 7; }), 7);
}

TEST_F(LinuxHostTest, ProgramThatCannotGoOnEndsWithALineAndAStatus) {
    start();
    support::StandardErrorCapture shown;
    EXPECT_EQ(host->run([](const Host&) -> int { throw std::bad_alloc(); }), EXIT_FAILURE);
    EXPECT_EQ(shown.text(), "kstd: cannot go on: std::bad_alloc.\n");
}

TEST_F(LinuxHostTest, LoopThatCannotGoOnIsAFailureWhateverTheProgramSays) {
    start();
    interfaces().events.setHandler("com.zerva.notifyd.matching",
                                   [](const Event&) { throw std::bad_alloc(); });
    send("com.zerva.notifyd.matching", "any");
    support::StandardErrorCapture shown;
    const auto program = [](const Host& interfaces) {
        while (interfaces.runLoop.runOnce(kDistantFuture)) {
        }
        return EXIT_SUCCESS;
    };
    EXPECT_EQ(host->run(program), EXIT_FAILURE);
    EXPECT_EQ(shown.text(), "kstd: MainRunLoop: cannot run: std::bad_alloc.\n");
}

TEST_F(LinuxHostTest, HostWhoseStopRequestHasNoDescriptorSaysSo) {
    rlimit before{};
    ASSERT_EQ(::getrlimit(RLIMIT_NOFILE, &before), 0);
    const rlimit none{0, before.rlim_max};
    ASSERT_EQ(::setrlimit(RLIMIT_NOFILE, &none), 0);
    const StopRequest request;
    ASSERT_EQ(::setrlimit(RLIMIT_NOFILE, &before), 0);
    stop = &request;
    support::StandardErrorCapture shown;
    start();
    EXPECT_EQ(shown.text(), "kstd: StopRequest: SIGTERM ends the daemon wherever it is: Too many "
                            "open files.\n");
    host.reset();
}

TEST_F(LinuxHostTest, HandlersAreDestroyedWhileTheInterfacesAreStillThere) {
    start();
    struct Witness {
        Host interfaces;
        bool& gone;
        ~Witness() {
            // What a handler holds may still use the host.
            interfaces.alarms.set("stream", "alarm", nullptr);
            interfaces.events.setHandler("other", nullptr);
            gone = true;
        }
    };
    bool gone = false;
    std::shared_ptr<Witness> witness(new Witness{interfaces(), gone});
    interfaces().events.setHandler("stream", [witness](const Event&) {});
    witness.reset();
    EXPECT_FALSE(gone);
    host.reset();
    EXPECT_TRUE(gone);
}

} // namespace
} // namespace platform
