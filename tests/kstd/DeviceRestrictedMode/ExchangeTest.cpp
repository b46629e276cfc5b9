// Each event of the service's life as the kernel side and the log see it, through the daemon's own
// run loop.

#include "kstd/Daemon.h"
#include "tests/kstd/DaemonFixture.h"

#include <gmock/gmock.h>

namespace kstd {
namespace {

using testing::ElementsAre;
using testing::IsEmpty;

const std::string kService = "kstd: -[DeviceRestrictedModeService ";

std::string wispEvent(const std::string& name) {
    return "kstd: main_block_invoke: Wisp Event: " + name + " (notifyd).";
}

std::string handleCalled(const std::string& name) {
    return kService + "handleWispEventWithName:]: called, eventName=" + name + ".";
}

const std::string kHandleReturning = kService + "handleWispEventWithName:]: returning, .";

std::string processing(const std::string& property) {
    return kService + "onKextNotificationArrivedWithPropertyName:]: XXX Daemon: PROCESSING " +
           property + ".";
}

std::string sendingAck(const std::string& property) {
    return kService + "sendNotificationACKWithPropertyName:]: XXX Daemon: SENDING ACK " + property +
           ".";
}

class ExchangeTest : public DaemonFixture {
  protected:
    /// Starts the daemon, lets `event` happen once it is idle, and ends it when it is idle again.
    /// Log and requests hold only what came of the event.
    void run(const std::function<void()>& event) {
        int idle = 0;
        fake.events.runLoop().onIdle([&] {
            if (++idle == 1) {
                fake.log.clear();
                machine.kernel.structCalls.clear();
                event();
            } else {
                eventLines = lines();
                fake.events.closeSources();
            }
        });
        EXPECT_EQ(Daemon(fake.host(), makeServices(fake.host())).run(), 0);
    }

    void notify(const std::string& property, const Bytes& bytes) {
        run([&] {
            putRecord(property, bytes);
            fake.events.post("com.zerva.notifyd.matching", "com.zerva.Keystrand." + property);
        });
    }

    std::vector<std::string> eventLines;
};

TEST_F(ExchangeTest, ProcessStart) {
    machine.disk.put(kAnalyticsPath, counting(32, 9));
    machine.disk.put(kStatePath, defaultStateBlob());
    fake.events.runLoop().onIdle([this] { fake.events.closeSources(); });
    const auto services = makeServices(fake.host());
    const std::string name = services.front()->description();
    EXPECT_EQ(Daemon(fake.host(), services).run(), 0);
    EXPECT_THAT(requests(),
                ElementsAre(ControlRequest{6, counting(32, 9)},
                            ControlRequest{3, joined({{1, 0, 0}, defaultStateBlob()})}));
    EXPECT_THAT(
        lines(),
        ElementsAre("kstd: main: Started service - " + name + ".", kService + "start]: called, .",
                    kService + "loadDataBlob:]: called, filePath = " + kAnalyticsPath + ".",
                    kService + "loadDataBlob:]: called, filePath = " + kStatePath + ".",
                    kService + "notifyDaemonStarted]: kstd started, restricted mode allowed: YES.",
                    kService + "start]: returning, .", "kstd: main: Entering the main runloop.",
                    "kstd: main: Stoping service - " + name + ".", kService + "stop]: called, .",
                    kService + "stop]: returning, ."));
}

TEST_F(ExchangeTest, DeviceManagementChange) {
    run([&] { fake.settings.change(false); });
    const std::string name = "com.zerva.quorvane.effectivesettingschanged";
    EXPECT_THAT(requests(), ElementsAre(ControlRequest{5, {0}}));
    EXPECT_THAT(
        eventLines,
        ElementsAre(wispEvent(name), handleCalled(name), kService + "onQuorvaneChanged]: called, .",
                    kService + "onQuorvaneChanged]: Quorvane Changed Restricted Mode Allowed: NO.",
                    kHandleReturning));
}

TEST_F(ExchangeTest, TimerRestarted) {
    const std::string property = "KSTRMTimerRestarted";
    std::vector<std::string> callsBeforeAck;
    std::optional<std::int64_t> alarmAtAck;
    machine.kernel.onStructCall = [&](const platform::FakeStructCall&) {
        callsBeforeAck = fake.files.calls();
        alarmAtAck = registeredAlarm();
        return platform::FakeStructAnswer{};
    };
    notify(property, timerRecord(4102444800));
    EXPECT_THAT(requests(), ElementsAre(ControlRequest{7, ackPayload(property)}));
    EXPECT_EQ(machine.disk.read(kStatePath), defaultStateBlob());
    // Synced and registered before it was acknowledged.
    EXPECT_THAT(std::vector<std::string>(callsBeforeAck.end() - 3, callsBeforeAck.end()),
                ElementsAre("write 13", "sync", "close"));
    EXPECT_EQ(alarmAtAck, 4102444800000000000);
    const std::string name = "com.zerva.Keystrand." + property;
    const std::vector<std::string> notificationLines(eventLines.begin(), eventLines.begin() + 9);
    EXPECT_THAT(
        notificationLines,
        ElementsAre(wispEvent(name), handleCalled(name), processing(property),
                    kService + "onKextTimerRestarted:]: called, .",
                    kService + "onKextTimerRestarted:]: version = 2, standardModeStartTimestamp = "
                               "1700000000, lockedInRestrictedMode = 1.",
                    kService + "saveDataBlob:data:]: called, filePath = " + kStatePath + ".",
                    kService + "scheduleAlarm:]: called, timestamp=4102444800.",
                    sendingAck(property), kHandleReturning));
    // The virtual clock then runs on to the alarm.
    EXPECT_THAT(std::vector<std::string>(eventLines.begin() + 9, eventLines.end()),
                ElementsAre(kService + "init]_block_invoke: alarm.",
                            kService + "unscheduleAlarm]: called, ."));
}

TEST_F(ExchangeTest, AnalyticsCollected) {
    const std::string property = "KSTRMAnalyticsCollected";
    const std::string name = "com.zerva.Keystrand." + property;
    notify(property, record(2));
    EXPECT_THAT(requests(), ElementsAre(ControlRequest{7, ackPayload(property)}));
    EXPECT_THAT(eventLines, ElementsAre(wispEvent(name), handleCalled(name), processing(property),
                                        kService + "onKextAnalyticsCollected:]: called, .",
                                        sendingAck(property), kHandleReturning));
}

TEST_F(ExchangeTest, SaveAnalytics) {
    const std::string property = "KSTRMSaveAnalytics";
    const std::string name = "com.zerva.Keystrand." + property;
    notify(property, record(3, counting(32, 0x55)));
    EXPECT_THAT(requests(), ElementsAre(ControlRequest{7, ackPayload(property)}));
    EXPECT_EQ(machine.disk.read(kAnalyticsPath), counting(32, 0x55));
    EXPECT_THAT(eventLines, ElementsAre(wispEvent(name), handleCalled(name), processing(property),
                                        kService + "onKextSaveAnalytics:]: called, .",
                                        kService + "saveDataBlob:data:]: called, filePath = " +
                                            kAnalyticsPath + ".",
                                        sendingAck(property), kHandleReturning));
}

TEST_F(ExchangeTest, TimerRestartedAnalyticsCollected) {
    const std::string property = "KSTRMTimerRestartedAnalyticsCollected";
    const std::string name = "com.zerva.Keystrand." + property;
    notify(property, record(4));
    EXPECT_THAT(requests(), ElementsAre(ControlRequest{7, ackPayload(property)}));
    EXPECT_THAT(eventLines,
                ElementsAre(wispEvent(name), handleCalled(name), processing(property),
                            kService + "onKextTimerRestartedAnalyticsCollected:]: called, .",
                            sendingAck(property), kHandleReturning));
}

TEST_F(ExchangeTest, AlarmFires) {
    run([&] {
        const platform::EventDictionary dictionary{{"Date", {1000}}};
        fake.host().alarms.set(kAlarmStreamName, kAlarmEventName, &dictionary);
    });
    EXPECT_THAT(requests(), IsEmpty());
    EXPECT_EQ(registeredAlarm(), std::nullopt);
    EXPECT_THAT(eventLines, ElementsAre(kService + "init]_block_invoke: alarm.",
                                        kService + "unscheduleAlarm]: called, ."));
}

TEST_F(ExchangeTest, AlarmThatBecameDueWhileNobodyRanIsDeliveredToTheNextDaemon) {
    machine.alarms.save({kAlarmStreamName, kAlarmEventName}, {1});
    fake.events.runLoop().onIdle([this] { fake.events.closeSources(); });
    EXPECT_EQ(Daemon(fake.host(), makeServices(fake.host())).run(), 0);
    EXPECT_THAT(lines(), testing::Contains(kService + "init]_block_invoke: alarm."));
    EXPECT_EQ(registeredAlarm(), std::nullopt);
    // The start exchange is what it was launched for, and it comes first.
    EXPECT_EQ(requests().size(), 1U);
}

} // namespace
} // namespace kstd
