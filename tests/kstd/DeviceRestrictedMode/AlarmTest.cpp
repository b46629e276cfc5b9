#include "tests/kstd/DaemonFixture.h"

#include <gmock/gmock.h>

#include <limits>

namespace kstd {
namespace {

using testing::ElementsAre;

constexpr char kUnscheduled[] = "kstd: -[DeviceRestrictedModeService unscheduleAlarm]: called, .";

class AlarmTest : public DaemonFixture {
  protected:
    void timerRestarted(std::uint64_t alarm) {
        putRecord("KSTRMTimerRestarted", timerRecord(alarm));
        service->onKextNotificationArrivedWithPropertyName("KSTRMTimerRestarted");
    }

    [[nodiscard]] std::string scheduledLine() const {
        for (const std::string& line : lines()) {
            if (line.find("scheduleAlarm:]") != std::string::npos) {
                return line;
            }
        }
        return "";
    }

    std::shared_ptr<DeviceRestrictedModeService> service = makeService();
};

TEST_F(AlarmTest, TimeOfARecordIsRegisteredInNanoseconds) {
    timerRestarted(1700000000);
    EXPECT_EQ(registeredAlarm(), 1700000000000000000);
    EXPECT_EQ(scheduledLine(),
              "kstd: -[DeviceRestrictedModeService scheduleAlarm:]: called, timestamp=1700000000.");
}

TEST_F(AlarmTest, TimeZeroCancels) {
    timerRestarted(1700000000);
    timerRestarted(0);
    EXPECT_EQ(registeredAlarm(), std::nullopt);
    EXPECT_THAT(lines(), testing::Contains(kUnscheduled));
}

TEST_F(AlarmTest, ALaterRecordReplacesTheAlarm) {
    timerRestarted(1700000000);
    timerRestarted(1800000000);
    EXPECT_EQ(registeredAlarm(), 1800000000000000000);
    EXPECT_EQ(machine.alarms.all().size(), 1U);
}

TEST_F(AlarmTest, CancellingWithoutAnAlarmIsSilent) {
    service->unscheduleAlarm();
    EXPECT_THAT(lines(), ElementsAre(kUnscheduled));
    EXPECT_EQ(registeredAlarm(), std::nullopt);
}

TEST_F(AlarmTest, FiredAlarmIsCancelledAndNothingElse) {
    fake.events.runLoop().onIdle([this] { fake.events.closeSources(); });
    timerRestarted(1700000000);
    fake.log.clear();
    const auto sent = requests().size();
    while (fake.events.runLoop().runOnce(platform::kDistantFuture)) {
    }
    EXPECT_THAT(lines(),
                ElementsAre("kstd: -[DeviceRestrictedModeService init]_block_invoke: alarm.",
                            kUnscheduled));
    EXPECT_EQ(registeredAlarm(), std::nullopt);
    EXPECT_EQ(requests().size(), sent);
}

TEST_F(AlarmTest, QueuedAlarmOfAnOlderRegistrationDoesNotCancelANewerOne) {
    fake.events.runLoop().onIdle([this] { fake.events.closeSources(); });
    timerRestarted(1);
    // Due at once, so its event is queued; the next record comes before it is delivered.
    timerRestarted(4000000000);
    static_cast<void>(fake.events.runLoop().runOnce({0}));
    EXPECT_EQ(registeredAlarm(), 4000000000000000000);
    EXPECT_THAT(lines(), testing::Not(testing::Contains(testing::HasSubstr("alarm."))));
}

/// A time from a record, and what becomes of it.
struct HostileTime {
    std::uint64_t seconds;
    std::uint32_t logged;
    std::int64_t date;
};

constexpr std::int64_t kLatest = std::numeric_limits<std::int64_t>::max();

class HostileTimeTest : public AlarmTest, public testing::WithParamInterface<HostileTime> {};

TEST_P(HostileTimeTest, SaturatesEverywhere) {
    timerRestarted(GetParam().seconds);
    EXPECT_EQ(scheduledLine(), "kstd: -[DeviceRestrictedModeService scheduleAlarm:]: called, "
                               "timestamp=" +
                                   std::to_string(GetParam().logged) + ".");
    EXPECT_EQ(registeredAlarm(), GetParam().date);
}

INSTANTIATE_TEST_SUITE_P(Times, HostileTimeTest,
                         testing::Values(HostileTime{1, 1, 1000000000},
                                         HostileTime{4294967295, 4294967295, 4294967295000000000},
                                         HostileTime{4294967296, 4294967295, 4294967296000000000},
                                         HostileTime{9223372036, 4294967295, 9223372036000000000},
                                         HostileTime{9223372037, 4294967295, kLatest},
                                         HostileTime{(1ULL << 53U) + 1, 4294967295, kLatest},
                                         HostileTime{1ULL << 63U, 4294967295, kLatest},
                                         HostileTime{UINT64_MAX, 4294967295, kLatest}));

TEST_F(AlarmTest, DatesNeverGoBackwardsAsTheTimeGrows) {
    std::int64_t previous = 0;
    for (unsigned bit = 2; bit < 64; ++bit) {
        for (const std::uint64_t seconds : {(1ULL << bit) - 1, 1ULL << bit, (1ULL << bit) + 1}) {
            service->scheduleAlarm(static_cast<double>(seconds));
            const std::int64_t date = registeredAlarm().value_or(0);
            EXPECT_GE(date, previous) << seconds;
            previous = date;
        }
    }
}

TEST_F(AlarmTest, SecondsThatAreNoTimeAreHeldWithinTheRange) {
    service->scheduleAlarm(-1.0);
    service->scheduleAlarm(std::numeric_limits<double>::quiet_NaN());
    service->scheduleAlarm(-std::numeric_limits<double>::infinity());
    service->scheduleAlarm(1.9);
    const std::string called = "kstd: -[DeviceRestrictedModeService scheduleAlarm:]: called, ";
    EXPECT_THAT(lines(), ElementsAre(called + "timestamp=0.", called + "timestamp=0.",
                                     called + "timestamp=0.", called + "timestamp=1."));
    EXPECT_EQ(registeredAlarm(), 1000000000);
}

} // namespace
} // namespace kstd
