// The events that the two analytics notifications become.

#include "kstd/Analytics/Analytics.h"
#include "kstd/Analytics/TQAnalyticsLoggerSQLiteStore.h"
#include "platform/PropertyLists.h"
#include "tests/kstd/DaemonFixture.h"
#include "tests/support/HostWith.h"

#include <filesystem>

namespace kstd {
namespace {

using platform::Value;
using platform::ValueMap;

class AnalyticsEventsTest : public DaemonFixture {
  protected:
    void arrive(const Bytes& bytes) {
        putRecord("P", bytes);
        makeService()->onKextNotificationArrivedWithPropertyName("P");
    }

    static Bytes policyRecord(std::uint32_t period, std::uint32_t duration, const Bytes& flags) {
        return record(2, joined({littleEndian(period, 4), littleEndian(duration, 4),
                                 littleEndian(0xEEEEEEEE, 4), flags}));
    }

    static Bytes restartedRecord(std::uint32_t seconds) {
        return record(4, littleEndian(seconds, 4));
    }

    /// What is stored, read over a connection of the test's own.
    platform::ValueList events() {
        TQAnalyticsLoggerSQLiteStore store(
            fake.files.locate("/var/root/.usbrestrictedmode_analytics_v2.db"), kEventSchema,
            {.log = fake.log, .clock = machine.clock, .propertyLists = fake.propertyLists});
        return store.allEvents();
    }

    static ValueMap policyEvent(std::int64_t period, std::int64_t duration,
                                const std::vector<std::int64_t>& flags, std::int64_t enabled) {
        return {{"eventVersion", std::int64_t{3}},
                {"restrictedMode", flags[0]},
                {"restrictedModeDuration", duration},
                {"policyEnabled", enabled},
                {"policyDisabledByPasscodeNotSet", flags[1]},
                {"policyDisabledByBootArg", flags[2]},
                {"policyDisabledByQuorvane", flags[3]},
                {"eventPeriodDuration", period},
                {"eventType", "policy"},
                {"eventTime", 1700000000000.0}};
    }

    static ValueMap restartedEvent(std::int64_t minutes) {
        return {{"eventVersion", std::int64_t{4}},
                {"totalRestrictedModeDurationMin", minutes},
                {"eventType", "timerRestarted"},
                {"eventTime", 1700000000000.0}};
    }
};

TEST_F(AnalyticsEventsTest, PolicyEvents) {
    arrive(policyRecord(4294967295, 3600, {1, 0, 2, 0}));
    arrive(policyRecord(0, 4294967295, {0, 0, 0, 0}));
    arrive(policyRecord(1, 2, {255, 1, 0, 0}));
    arrive(policyRecord(1, 2, {2, 0, 0, 128}));
    arrive(policyRecord(1, 2, {1, 255, 255, 255}));
    EXPECT_EQ(events(), (platform::ValueList{policyEvent(4294967295, 3600, {1, 0, 2, 0}, 0),
                                             policyEvent(0, 4294967295, {0, 0, 0, 0}, 1),
                                             policyEvent(1, 2, {255, 1, 0, 0}, 0),
                                             policyEvent(1, 2, {2, 0, 0, 128}, 0),
                                             policyEvent(1, 2, {1, 255, 255, 255}, 0)}));
}

/// Keeps what is to be stored, as it came.
class RecordingPropertyLists final : public platform::PropertyLists {
  public:
    explicit RecordingPropertyLists(platform::PropertyLists& real) : real_(real) {}

    [[nodiscard]] platform::Result<platform::Bytes> binary(const Value& value) override {
        written.push_back(value);
        return real_.binary(value);
    }
    [[nodiscard]] bool read(std::span<const std::uint8_t> data,
                            platform::ValueSink& sink) override {
        return real_.read(data, sink);
    }

    platform::ValueList written;

  private:
    platform::PropertyLists& real_;
};

TEST_F(AnalyticsEventsTest, KindsOfNumbers) {
    RecordingPropertyLists propertyLists(fake.propertyLists);
    const auto service = DeviceRestrictedModeService::make(
        support::hostWith(fake.host(), {.propertyLists = &propertyLists}));
    const Bytes policy = policyRecord(4, 5, {1, 0, 2, 0});
    EXPECT_EQ(service->onKextAnalyticsCollected(*KSTDRMDeamonNotification::fromBytes(policy)), 0);
    const Bytes restarted = restartedRecord(119);
    EXPECT_EQ(service->onKextTimerRestartedAnalyticsCollected(
                  *KSTDRMDeamonNotification::fromBytes(restarted)),
              0);
    const ValueMap policyAttributes = {{"eventVersion", std::int32_t{3}},
                                       {"restrictedMode", std::uint8_t{1}},
                                       {"restrictedModeDuration", std::uint32_t{5}},
                                       {"policyEnabled", std::int32_t{0}},
                                       {"policyDisabledByPasscodeNotSet", std::uint8_t{0}},
                                       {"policyDisabledByBootArg", std::uint8_t{2}},
                                       {"policyDisabledByQuorvane", std::uint8_t{0}},
                                       {"eventPeriodDuration", std::uint32_t{4}},
                                       {"eventType", "policy"},
                                       {"eventTime", 1700000000000.0}};
    const ValueMap restartedAttributes = {{"eventVersion", std::int32_t{4}},
                                          {"totalRestrictedModeDurationMin", std::uint32_t{1}},
                                          {"eventType", "timerRestarted"},
                                          {"eventTime", 1700000000000.0}};
    EXPECT_EQ(propertyLists.written, (platform::ValueList{policyAttributes, restartedAttributes}));
}

TEST_F(AnalyticsEventsTest, TimerRestartedEventsHaveWholeMinutes) {
    platform::ValueList expected;
    for (const auto& [seconds, minutes] : std::vector<std::pair<std::uint32_t, std::int64_t>>{
             {0, 0}, {59, 0}, {60, 1}, {119, 1}, {120, 2}, {4294967295, 71582788}}) {
        arrive(restartedRecord(seconds));
        expected.emplace_back(restartedEvent(minutes));
    }
    EXPECT_EQ(events(), expected);
}

TEST_F(AnalyticsEventsTest, BothKindsInTheOrderInWhichTheyCame) {
    arrive(restartedRecord(60));
    arrive(policyRecord(1, 2, {0, 0, 0, 0}));
    EXPECT_EQ(events(),
              (platform::ValueList{restartedEvent(1), policyEvent(1, 2, {0, 0, 0, 0}, 1)}));
}

TEST_F(AnalyticsEventsTest, AcknowledgedEvenWhenNothingCanBeStored) {
    std::filesystem::create_directories(
        fake.files.locate("/var/root/.usbrestrictedmode_analytics_v2.db"));
    arrive(policyRecord(1, 2, {0, 0, 0, 0}));
    arrive(restartedRecord(60));
    EXPECT_EQ(requests(),
              (std::vector<ControlRequest>{{7, ackPayload("P")}, {7, ackPayload("P")}}));
    EXPECT_EQ(events(), platform::ValueList());
}

TEST_F(AnalyticsEventsTest, OtherTypesMakeNoLogger) {
    arrive(record(3, counting(32, 1)));
    arrive(timerRecord(0));
    EXPECT_TRUE(fake.queues.names().empty());
}

TEST_F(AnalyticsEventsTest, OneLoggerForAllEvents) {
    arrive(restartedRecord(60));
    arrive(policyRecord(1, 2, {0, 0, 0, 0}));
    EXPECT_EQ(fake.queues.names().size(), 1U);
}

} // namespace
} // namespace kstd
