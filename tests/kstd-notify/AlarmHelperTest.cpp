#include "kstd-notify/AlarmHelper.h"

#include "base/UnixAddress.h"
#include "platform/fake/FakeSystemLog.h"
#include "platform/linux/EventSocket.h"
#include "tests/kstd-notify/FakeTimerUnit.h"
#include "tests/platform/linux/OpenDescriptors.h"
#include "tests/platform/linux/RootDirectory.h"
#include "tests/support/ChildProcess.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <array>
#include <cstring>
#include <fcntl.h>
#include <optional>
#include <sstream>
#include <string>
#include <sys/socket.h>
#include <vector>

namespace notify {
namespace {

using platform::Date;
using platform::FakeClock;
using Calls = std::vector<std::string>;
using Timer = wire::AlarmAnswer::Timer;

constexpr std::int64_t kNow = FakeClock::kStart.nanosecondsSince1970;
constexpr std::int64_t kSoon = kNow + 1'000'000'000;
constexpr char kAlarms[] = "/var/lib/kstd/alarms/com.zerva.alarm";

class AlarmHelperTest : public testing::Test {
  protected:
    AlarmHelperTest() {
        root.makeDirectory("/run/kstd");
        root.makeDirectory(kAlarms);
        listener = platform::makeEventSocket(root.paths().alarmHelperSocket());
    }

    /// Runs one helper on what is in the socket; whether it was content.
    bool run() {
        std::ostringstream stream;
        AlarmTimer timer(unit, clock, AlarmTimer::Machine::canBeWoken);
        platform::AlarmStore store(root.paths().alarmDirectory(), {"alarm", "other"}, log);
        base::FileDescriptor socket(::fcntl(listener.get(), F_DUPFD_CLOEXEC, 0));
        const bool result = AlarmHelper(std::move(socket), store, unit, timer, clock, stream).run();
        errors = stream.str();
        return result;
    }

    void putAlarm(std::int64_t date, const std::string& event = "alarm") const {
        const std::string digits = std::to_string(date);
        root.put(std::string(kAlarms) + "/" + event,
                 std::string(20 - digits.size(), '0') + digits + "\n");
    }

    /// Sends a datagram with these descriptors. Gives where the answer comes.
    void tell(const std::vector<int>& descriptors) const {
        const base::FileDescriptor sender(::socket(AF_UNIX, SOCK_DGRAM | SOCK_CLOEXEC, 0));
        const auto address = base::UnixAddress::of(root.paths().alarmHelperSocket()).value();
        ASSERT_EQ(::connect(sender.get(), address.get(), address.size()), 0);
        char content = 1;
        iovec data{&content, sizeof content};
        alignas(cmsghdr) std::array<std::uint8_t, CMSG_SPACE(4 * sizeof(int))> control{};
        msghdr message{};
        message.msg_iov = &data;
        message.msg_iovlen = 1;
        if (!descriptors.empty()) {
            const std::size_t size = descriptors.size() * sizeof(int);
            message.msg_control = control.data();
            message.msg_controllen = CMSG_SPACE(size);
            cmsghdr* const rights = CMSG_FIRSTHDR(&message);
            rights->cmsg_level = SOL_SOCKET;
            rights->cmsg_type = SCM_RIGHTS;
            rights->cmsg_len = CMSG_LEN(size);
            std::memcpy(CMSG_DATA(rights), descriptors.data(), size);
        }
        ASSERT_EQ(::sendmsg(sender.get(), &message, MSG_DONTWAIT), 1);
    }

    /// Asks with a pair of sockets, as the daemon does; the end where the answer comes.
    [[nodiscard]] base::FileDescriptor ask() const {
        int ends[2] = {-1, -1};
        EXPECT_EQ(::socketpair(AF_UNIX, SOCK_SEQPACKET | SOCK_CLOEXEC, 0, ends), 0);
        tell({ends[1]});
        ::close(ends[1]);
        return base::FileDescriptor(ends[0]);
    }

    static std::optional<wire::AlarmAnswer> answerAt(const base::FileDescriptor& end) {
        std::array<std::uint8_t, wire::kAlarmAnswerMaxSize> buffer{};
        const ssize_t length = ::recv(end.get(), buffer.data(), buffer.size(), MSG_DONTWAIT);
        return length > 0
                   ? wire::decodeAlarmAnswer({buffer.data(), static_cast<std::size_t>(length)})
                   : std::nullopt;
    }

    static wire::AlarmAnswer waits(std::int64_t date) { return {Timer::waits, true, date, {}}; }

    support::RootDirectory root;
    platform::FakeSystemLog log;
    FakeClock clock;
    FakeTimerUnit unit{clock};
    base::FileDescriptor listener;
    std::string errors;
};

TEST_F(AlarmHelperTest, TimerIsMadeForTheEarliestAlarmAndTheDaemonIsTold) {
    putAlarm(kSoon + 1000);
    putAlarm(kSoon, "other");
    const auto asked = ask();
    EXPECT_TRUE(run());
    EXPECT_EQ(unit.waits, kSoon / 1000);
    EXPECT_EQ(answerAt(asked), waits(kSoon));
    EXPECT_EQ(errors, "");
}

TEST_F(AlarmHelperTest, AlarmThatIsDueIsLeftToTheDaemonThatAsks) {
    putAlarm(kNow);
    putAlarm(kNow + 1, "other");
    const auto asked = ask();
    EXPECT_TRUE(run());
    EXPECT_EQ(answerAt(asked), waits(kNow + 1));
    putAlarm(kNow, "other");
    const auto again = ask();
    EXPECT_TRUE(run());
    EXPECT_EQ(answerAt(again), wire::AlarmAnswer());
    EXPECT_FALSE(unit.waits);
    EXPECT_EQ(std::count(unit.calls.begin(), unit.calls.end(), "elapse now"), 0);
}

TEST_F(AlarmHelperTest, AlarmThatIsDueWhenNoDaemonIsThereIsSentAtOnce) {
    putAlarm(kNow);
    const Calls sent{"stop", "elapse now"};
    EXPECT_TRUE(run()) << "a helper before this one has ended over it";
    EXPECT_EQ(unit.takeCalls(), sent);
    tell({});
    EXPECT_TRUE(run());
    EXPECT_EQ(unit.takeCalls(), sent);
    auto gone = ask();
    gone.reset();
    EXPECT_TRUE(run());
    EXPECT_EQ(unit.takeCalls(), sent);
    unit.elapseError = {"bus", 1, "Access denied"};
    EXPECT_FALSE(run());
    EXPECT_EQ(errors, "kstd-notify: no timer for the alarm: Access denied\n");
}

TEST_F(AlarmHelperTest, FileThatIsNoAlarmMakesNoTimer) {
    putAlarm(kSoon, "alarm.bak");
    EXPECT_TRUE(run());
    EXPECT_FALSE(unit.waits);
}

TEST_F(AlarmHelperTest, EveryoneWhoAskedIsToldOfTheLastState) {
    putAlarm(kSoon);
    const auto first = ask();
    const auto second = ask();
    tell({});
    EXPECT_TRUE(run());
    EXPECT_EQ(answerAt(first), waits(kSoon));
    EXPECT_EQ(answerAt(second), waits(kSoon));
    EXPECT_EQ(unit.calls.size(), 4U) << "the timer was made once";
}

TEST_F(AlarmHelperTest, WhatComesMeanwhileIsLookedAtToo) {
    putAlarm(kSoon);
    const auto first = ask();
    base::FileDescriptor second;
    unit.onStart = [&] {
        unit.onStart = nullptr;
        putAlarm(kSoon + 1000);
        second = ask();
    };
    EXPECT_TRUE(run());
    EXPECT_EQ(answerAt(first), waits(kSoon));
    EXPECT_EQ(answerAt(second), waits(kSoon + 1000));
    EXPECT_EQ(unit.waits, kSoon / 1000 + 1);
}

TEST_F(AlarmHelperTest, WithoutAQuestionTheTimerIsBroughtUpToDate) {
    putAlarm(kSoon);
    EXPECT_TRUE(run());
    EXPECT_EQ(unit.waits, kSoon / 1000);
}

TEST_F(AlarmHelperTest, FailureIsContentOnlyWhenTheDaemonKnows) {
    const std::string line = "kstd-notify: no timer for the alarm: Access denied\n";
    putAlarm(kSoon);
    unit.startError = {"bus", 1, "Access denied"};
    const auto asked = ask();
    EXPECT_TRUE(run());
    EXPECT_EQ(answerAt(asked), (wire::AlarmAnswer{Timer::failed, true, kSoon, "Access denied"}));
    EXPECT_EQ(errors, line);
    EXPECT_FALSE(run());
    EXPECT_EQ(errors, line);
    tell({});
    EXPECT_FALSE(run());
    auto gone = ask();
    gone.reset();
    EXPECT_FALSE(run());
    unit.startError.reset();
    EXPECT_TRUE(run());
}

TEST_F(AlarmHelperTest, TimerThatCannotBeTakenAwayDoesNoHarm) {
    unit.stopError = {"bus", 1, "Access denied"};
    EXPECT_TRUE(run());
    EXPECT_EQ(errors, "kstd-notify: no timer for the alarm: Access denied\n");
}

TEST_F(AlarmHelperTest, AnotherUsersWordIsDropped) {
    if (::geteuid() != 0) {
        GTEST_SKIP() << "needs root";
    }
    for (const char* const path : {"/", "/run", "/run/kstd", "/run/kstd/alarms.sock"}) {
        root.setMode(path, 0777);
    }
    int ends[2] = {-1, -1};
    ASSERT_EQ(::socketpair(AF_UNIX, SOCK_SEQPACKET | SOCK_CLOEXEC, 0, ends), 0);
    const base::FileDescriptor mine(ends[0]);
    EXPECT_EQ(support::exitStatusOfChild([&] {
                  const bool isOther = ::setuid(65534) == 0;
                  tell({ends[1]});
                  return isOther && !HasFailure() ? 0 : 1;
              }),
              0);
    ::close(ends[1]);
    EXPECT_TRUE(run());
    EXPECT_EQ(answerAt(mine), std::nullopt);
    EXPECT_EQ(errors, "kstd-notify: another user's word about the alarms was dropped\n");
}

TEST_F(AlarmHelperTest, NoDescriptorStaysOpen) {
    const std::size_t before = support::countOpenDescriptors();
    tell({0, 0});
    tell({0, 0, 0, 0});
    tell({0});
    EXPECT_TRUE(run());
    EXPECT_EQ(support::countOpenDescriptors(), before);
}

TEST_F(AlarmHelperTest, NoSocketIsHandedOver) {
    EXPECT_FALSE(takeActivatedAlarmSocket().isOpen());
}

} // namespace
} // namespace notify
