#include "kstd-notify/SystemdAlarmTimer.h"

#include "base/FileDescriptor.h"
#include "base/UnixAddress.h"
#include "tests/neighbours/Bus.h"
#include "tests/support/TemporaryDirectory.h"

#include <gtest/gtest.h>

#include <cerrno>
#include <chrono>
#include <optional>
#include <string>
#include <sys/socket.h>
#include <utility>
#include <vector>

namespace notify {
namespace {

TEST(SystemdAlarmTimerTest, CalendarTextHasEveryMicrosecond) {
    const std::vector<std::pair<AlarmTimerUnit::Time, std::string>> cases = {
        {0, "1970-01-01 00:00:00.000000 UTC"},
        {1, "1970-01-01 00:00:00.000001 UTC"},
        {1'700'000'000'999'999, "2023-11-14 22:13:20.999999 UTC"},
        {1'709'208'000'000'000, "2024-02-29 12:00:00.000000 UTC"},
        {AlarmTimerUnit::kLatest, "2199-12-31 23:59:59.999999 UTC"},
    };
    for (const auto& [time, text] : cases) {
        EXPECT_EQ(calendarText(time), text);
    }
}

void expectEveryCallFails(SystemdAlarmTimer timer, const platform::Error& error) {
    const auto elapses = timer.elapses();
    ASSERT_FALSE(elapses);
    EXPECT_EQ(elapses.error(), error);
    EXPECT_EQ(timer.start(1, AlarmTimerUnit::Wakes::nothing), error);
    EXPECT_EQ(timer.elapseNow(), error);
    EXPECT_EQ(timer.stop(), error);
}

TEST(SystemdAlarmTimerTest, BusThatIsNotThereIsAnError) {
    const support::TemporaryDirectory directory;
    expectEveryCallFails(SystemdAlarmTimer(directory.file("bus")),
                         {platform::kSystemErrorDomain, ENOENT, "No such file or directory"});
}

TEST(SystemdAlarmTimerTest, BusThatDoesNotListenIsAnError) {
    const support::TemporaryDirectory directory;
    const base::FileDescriptor socket(::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0));
    const auto address = base::UnixAddress::of(directory.file("bus")).value();
    ASSERT_EQ(::bind(socket.get(), address.get(), address.size()), 0);
    expectEveryCallFails(SystemdAlarmTimer(directory.file("bus")),
                         {platform::kSystemErrorDomain, ECONNREFUSED, "Connection refused"});
}

TEST(SystemdAlarmTimerTest, WordsAboutOtherJobsGainABusNoTime) {
    const support::TemporaryDirectory directory;
    neighbours::Bus bus(directory.file("bus"), neighbours::Random(1), 0);
    bus.beTalkative();
    // Time for the calls, which the bus's library limits, and none for the end of a job.
    SystemdAlarmTimer timer(directory.file("bus"), std::chrono::milliseconds(0));
    const platform::Error tooLate{platform::kSystemErrorDomain, ETIMEDOUT, "Connection timed out"};
    EXPECT_EQ(timer.stop(), tooLate);
    EXPECT_EQ(timer.start(1, AlarmTimerUnit::Wakes::nothing), tooLate);
    EXPECT_EQ(timer.elapseNow(), tooLate);
    EXPECT_EQ(SystemdAlarmTimer(directory.file("bus")).stop(), std::nullopt);
}

TEST(SystemdAlarmTimerTest, TimerIsMadeAskedForAndTakenAwayOverTheBus) {
    const support::TemporaryDirectory directory;
    neighbours::Bus bus(directory.file("bus"), neighbours::Random(1), 0);
    SystemdAlarmTimer timer(directory.file("bus"));
    const auto elapses = [&timer] {
        const auto time = timer.elapses();
        EXPECT_TRUE(time);
        return time ? time.value() : std::optional<AlarmTimerUnit::Time>(-1);
    };
    EXPECT_EQ(elapses(), std::nullopt);
    EXPECT_EQ(timer.start(1'700'000'000'999'999, AlarmTimerUnit::Wakes::machine), std::nullopt);
    EXPECT_EQ(elapses(), 1'700'000'000'999'999);
    EXPECT_EQ(timer.stop(), std::nullopt);
    EXPECT_EQ(elapses(), std::nullopt);
}

} // namespace
} // namespace notify
