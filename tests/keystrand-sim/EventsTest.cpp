#include "tests/keystrand-sim/SimulatorProcess.h"
#include "tests/keystrand/Records.h"

#include <filesystem>

namespace keystrand::sim::test {

using namespace keystrand::test;

namespace {

constexpr std::string_view kStream = "com.zerva.notifyd.matching";
constexpr std::uint64_t kNow = 1'000'000;

class EventsTest : public SimulatorProcess {
  protected:
    ByteVector hexOf(const std::string& property) {
        const PacketSocket client = connect();
        ByteVector packet = exchange(client, propertyRequest(1, property));
        return {packet.begin() + 24, packet.end()};
    }
    static ByteVector daemonStarted() {
        return control(3, Bytes().u8(1).u16(0).bytes(ByteVector(13)));
    }
    static ByteVector event(const std::string& property) {
        return eventDatagram(kStream, "com.zerva.Keystrand." + property);
    }
};

TEST_F(EventsTest, LockAndItsPeriodAndUnlockPublishTrueRecords) {
    const PacketSocket events = PacketSocket::boundTo(eventPath());
    start({"--clock", "1000000", "--period", "60"});
    tell("lock");
    EXPECT_EQ(events.receive(), event("KSTRMTimerRestarted"));
    EXPECT_EQ(hexOf("KSTRMTimerRestarted"), timerRestarted(kNow + 60, 1, kNow, 0));
    tell("clock advance 59");
    EXPECT_FALSE(events.hasSomething());
    tell("clock advance 1");
    EXPECT_EQ(events.receive(), event("KSTRMTimerRestarted"));
    EXPECT_EQ(events.receive(), event("KSTRMSaveAnalytics"));
    EXPECT_EQ(hexOf("KSTRMTimerRestarted"), timerRestarted(0, 1, kNow, 1));
    tell("clock advance 40");
    tell("unlock");
    EXPECT_EQ(events.receive(), event("KSTRMTimerRestartedAnalyticsCollected"));
    EXPECT_EQ(events.receive(), event("KSTRMTimerRestarted"));
    EXPECT_EQ(events.receive(), event("KSTRMSaveAnalytics"));
    EXPECT_EQ(hexOf("KSTRMTimerRestartedAnalyticsCollected"), timerRestartedAnalytics(40));
    EXPECT_EQ(hexOf("KSTRMTimerRestarted"), timerRestarted(0, 1, 0, 0));
    tell("clock set 1086400");
    EXPECT_EQ(events.receive(), event("KSTRMAnalyticsCollected"));
    EXPECT_EQ(events.receive(), event("KSTRMSaveAnalytics"));
    EXPECT_EQ(hexOf("KSTRMAnalyticsCollected"), analyticsCollected(86400, 40, 0));
    EXPECT_FALSE(events.hasSomething());
}

TEST_F(EventsTest, TimerRunsOnTheRealClockToo) {
    const PacketSocket events = PacketSocket::boundTo(eventPath());
    start({"--period", "1"});
    tell("lock");
    EXPECT_EQ(events.receive(), event("KSTRMTimerRestarted"));
    EXPECT_EQ(events.receive(), event("KSTRMTimerRestarted"));
    EXPECT_EQ(events.receive(), event("KSTRMSaveAnalytics"));
    EXPECT_EQ(ask("status", "restricted"), "on");
}

TEST_F(EventsTest, PublishedRecordsWithOrderedValues) {
    const PacketSocket events = PacketSocket::boundTo(eventPath());
    start();
    tell("publish timer-restarted alarm=18446744073709551615 version=3 start=5 locked=255");
    tell("publish analytics-collected period=1 restricted=2 mode=3 passcode=4 boot-arg=5 "
         "quorvane=6");
    tell("publish save-analytics " + std::string(64, '7'));
    tell("publish timer-restarted-analytics total=119");
    EXPECT_EQ(events.receive(), event("KSTRMTimerRestarted"));
    EXPECT_EQ(events.receive(), event("KSTRMAnalyticsCollected"));
    EXPECT_EQ(events.receive(), event("KSTRMSaveAnalytics"));
    EXPECT_EQ(events.receive(), event("KSTRMTimerRestartedAnalyticsCollected"));
    EXPECT_EQ(hexOf("KSTRMTimerRestarted"), timerRestarted(~std::uint64_t{0}, 3, 5, 255));
    EXPECT_EQ(hexOf("KSTRMAnalyticsCollected"), analyticsCollected(1, 2, 3, 4, 5, 6));
    EXPECT_EQ(hexOf("KSTRMSaveAnalytics"), saveAnalytics(ByteVector(32, 0x77)));
    EXPECT_EQ(hexOf("KSTRMTimerRestartedAnalyticsCollected"), timerRestartedAnalytics(119));
}

TEST_F(EventsTest, PublishedRecordsWithTrueValues) {
    start();
    tell("lock");
    tell("clock advance 10");
    tell("passcode off");
    tell("boot-arg on");
    tell("publish timer-restarted");
    tell("publish analytics-collected");
    tell("publish save-analytics");
    tell("publish timer-restarted-analytics");
    EXPECT_EQ(hexOf("KSTRMTimerRestarted"), timerRestarted(0, 1, kNow, 0));
    EXPECT_EQ(hexOf("KSTRMAnalyticsCollected"), analyticsCollected(10, 0, 0, 1, 1, 0));
    EXPECT_EQ(hexOf("KSTRMSaveAnalytics"), saveAnalytics(figuresBlob(kNow, 0, 0, 0)));
    EXPECT_EQ(hexOf("KSTRMTimerRestartedAnalyticsCollected"), timerRestartedAnalytics(0));
}

TEST_F(EventsTest, PublishRefusesValuesThatDoNotFit) {
    start();
    for (const char* line :
         {"publish", "publish other", "publish timer-restarted locked=256",
          "publish timer-restarted alarm=18446744073709551616", "publish save-analytics 00",
          "publish save-analytics 00 11", "publish timer-restarted-analytics total=4294967296"}) {
        EXPECT_FALSE(control_->command(line).ok) << line;
    }
    EXPECT_EQ(ask("status", "published"), "0");
}

TEST_F(EventsTest, PostedEventsOfAnyName) {
    const PacketSocket events = PacketSocket::boundTo(eventPath());
    start();
    tell("post com.zerva.quorvane.effectivesettingschanged");
    tell("post any stream=com.zerva.corvid.matching count=2");
    EXPECT_EQ(events.receive(),
              eventDatagram(kStream, "com.zerva.quorvane.effectivesettingschanged"));
    EXPECT_EQ(events.receive(), eventDatagram("com.zerva.corvid.matching", "any"));
    EXPECT_EQ(events.receive(), eventDatagram("com.zerva.corvid.matching", "any"));
}

TEST_F(EventsTest, NamesThatNoEventHasAreRefused) {
    start();
    EXPECT_FALSE(control_->command("post").ok);
    EXPECT_FALSE(control_->command("post x stream=").ok);
    EXPECT_FALSE(control_->command("post x stream=" + std::string(256, 's')).ok);
    EXPECT_FALSE(control_->command("post " + std::string(1025, 'n')).ok);
    EXPECT_FALSE(control_->command("post x count=200001").ok);
    EXPECT_EQ(ask("status", "events-queued"), "0");
    tell("post " + std::string(1024, 'n') + " stream=" + std::string(255, 's'));
    EXPECT_EQ(ask("status", "events-queued"), "1");
}

TEST_F(EventsTest, EventQueueHasALimit) {
    start();
    tell("post x count=199999");
    EXPECT_FALSE(control_->command("post x count=2").ok);
    tell("post x");
    EXPECT_FALSE(control_->command("post x").ok);
    EXPECT_EQ(ask("status", "events-queued"), "200000");
    EXPECT_FALSE(control_->command("publish timer-restarted").ok);
    EXPECT_EQ(ask("status", "events-refused"), "1");
}

TEST_F(EventsTest, NothingIsLostWhileNobodyOwnsTheSocket) {
    start();
    for (int i = 0; i < 1000; ++i) {
        tell("post event" + std::to_string(i));
    }
    EXPECT_EQ(ask("status", "events-queued"), "1000");
    const PacketSocket events = PacketSocket::boundTo(eventPath());
    for (int i = 0; i < 1000; ++i) {
        ASSERT_EQ(events.receive(), eventDatagram(kStream, "event" + std::to_string(i)));
    }
    EXPECT_EQ(ask("status", "events-queued"), "0");
    EXPECT_EQ(ask("status", "events-sent"), "1000");
}

TEST_F(EventsTest, NothingIsLostOverAChangeOfOwner) {
    start();
    std::optional<PacketSocket> events = PacketSocket::boundTo(eventPath());
    int next = 0;
    auto post = [&, posted = 0](int count) mutable {
        for (int i = 0; i < count; ++i) {
            tell("post event" + std::to_string(posted++));
        }
    };
    const auto expectNext = [&](int count) {
        for (int i = 0; i < count; ++i) {
            ASSERT_EQ(events->receive(), eventDatagram(kStream, "event" + std::to_string(next++)));
        }
    };
    post(3);
    expectNext(3);
    // The file stays behind without an owner, then another owner takes its name.
    events.reset();
    post(3);
    EXPECT_EQ(ask("status", "events-queued"), "3");
    std::filesystem::remove(eventPath());
    events = PacketSocket::boundTo(eventPath());
    expectNext(3);
    // Another file while the first owner still lives.
    const PacketSocket former = std::move(*events);
    std::filesystem::remove(eventPath());
    events = PacketSocket::boundTo(eventPath());
    post(3);
    expectNext(3);
    EXPECT_FALSE(former.hasSomething());
}

TEST_F(EventsTest, FullSocketThatIsReplacedDoesNotHoldTheQueue) {
    start();
    const PacketSocket former = PacketSocket::boundTo(eventPath());
    tell("post event count=2000");
    const auto taken = std::stoi(ask("status", "events-sent"));
    ASSERT_LT(taken, 2000);
    std::filesystem::remove(eventPath());
    const PacketSocket events = PacketSocket::boundTo(eventPath());
    for (int i = taken; i < 2000; ++i) {
        ASSERT_EQ(events.receive(), eventDatagram(kStream, "event"));
    }
}

TEST_F(EventsTest, ForbiddingEndsRestrictedModeAndAllowingBringsItBack) {
    start();
    const PacketSocket client = openClient();
    tell("lock");
    tell("clock advance 3600");
    EXPECT_EQ(call(client, control(5, {0})), reply(5, 2, 0, 0));
    EXPECT_EQ(hexOf("KSTRMTimerRestarted"), timerRestarted(0, 1, kNow, 0));
    EXPECT_EQ(ask("status", "restricted"), "off");
    EXPECT_EQ(call(client, control(5, {1})), reply(5, 2, 0, 0));
    EXPECT_EQ(hexOf("KSTRMTimerRestarted"), timerRestarted(0, 1, kNow, 1));
}

TEST_F(EventsTest, DaemonHandsBackWhatItKeptOverARestartOfTheKernelSide) {
    start();
    tell("lock");
    const ByteVector record = hexOf("KSTRMTimerRestarted");
    tell("quit");
    EXPECT_EQ(program_->awaitEnd(), 0);

    start({"--clock", "1000100"});
    const PacketSocket client = openClient();
    const ByteVector blob = figuresBlob(kNow - 500, 8, 9, 0);
    EXPECT_EQ(call(client, control(6, blob)), reply(5, 2, 0, 0));
    const ByteVector state(record.begin() + 12, record.begin() + 25);
    EXPECT_EQ(call(client, control(3, Bytes().u8(1).u16(0).bytes(state))), reply(5, 2, 0, 0));
    EXPECT_EQ(ask("status", "start"), "1000000");
    EXPECT_EQ(ask("status", "locked"), "on");
    EXPECT_EQ(ask("status", "alarm"), "1003600");
    EXPECT_EQ(ask("status", "period-restricted"), "8");
    EXPECT_EQ(hexOf("KSTRMTimerRestarted"), record);
}

TEST_F(EventsTest, ADaemonThatStartsIsToldOfEachUnacknowledgedRecordOnce) {
    const PacketSocket events = PacketSocket::boundTo(eventPath());
    start({"--clock", "1000000", "--quiet"});
    const PacketSocket client = openClient();
    EXPECT_EQ(call(client, daemonStarted()), reply(5, 2, 0, 0));
    tell("publish save-analytics");
    tell("publish timer-restarted");
    tell("publish analytics-collected");
    EXPECT_EQ(exchange(client, propertyRequest(1, "KSTRMTimerRestarted")).size(), 60U);
    EXPECT_EQ(call(client, control(7, ackName("KSTRMTimerRestarted"))), reply(5, 2, 0, 0));
    for (int i = 0; i < 3; ++i) {
        ASSERT_TRUE(events.receive());
    }
    EXPECT_EQ(call(client, daemonStarted()), reply(5, 2, 0, 0));
    EXPECT_EQ(events.receive(), event("KSTRMSaveAnalytics"));
    EXPECT_EQ(events.receive(), event("KSTRMAnalyticsCollected"));
    EXPECT_EQ(ask("status", "events-sent"), "5");
    EXPECT_EQ(ask("status", "events-queued"), "0");
    // A copy and an acknowledgement are enough for both events of a record.
    EXPECT_EQ(exchange(client, propertyRequest(1, "KSTRMSaveAnalytics")).size(), 60U);
    EXPECT_EQ(call(client, control(7, ackName("KSTRMSaveAnalytics"))), reply(5, 2, 0, 0));
    EXPECT_EQ(ask("status", "properties"), "1");
}

TEST_F(EventsTest, ADaemonIsToldOnlyWhenItHasItsReply) {
    const PacketSocket events = PacketSocket::boundTo(eventPath());
    start({"--clock", "1000000", "--quiet"});
    tell("publish save-analytics");
    EXPECT_EQ(events.receive(), event("KSTRMSaveAnalytics"));
    tell("fault control=3 delay=600000");
    tell("fault control=3 silence perform");
    tell("fault control=3 hang-up perform");
    tell("fault control=3 silence");
    {
        const PacketSocket client = openClient();
        ASSERT_TRUE(client.send(structCall(2, 4096, daemonStarted())));
        tell("wait control=3 count=1");
        EXPECT_EQ(ask("status", "events-sent"), "1");
        EXPECT_EQ(ask("status", "events-queued"), "0");
    }
    // It has hung up and gets none any more.
    EXPECT_EQ(events.receive(), event("KSTRMSaveAnalytics"));
    for (int i = 2; i <= 3; ++i) {
        const PacketSocket client = openClient();
        ASSERT_TRUE(client.send(structCall(2, 4096, daemonStarted())));
        EXPECT_EQ(events.receive(), event("KSTRMSaveAnalytics"));
    }
    // Nothing came of this one.
    const PacketSocket client = openClient();
    ASSERT_TRUE(client.send(structCall(2, 4096, daemonStarted())));
    tell("wait control=3 count=4");
    EXPECT_EQ(ask("status", "events-sent"), "4");
}

TEST_F(EventsTest, RecordPublishedWhileTheOlderIsHandledIsNotLost) {
    start();
    const PacketSocket client = openClient();
    tell("publish timer-restarted version=1");
    EXPECT_EQ(exchange(client, propertyRequest(1, "KSTRMTimerRestarted")).size(), 60U);
    tell("publish timer-restarted version=2");
    EXPECT_EQ(call(client, control(7, ackName("KSTRMTimerRestarted"))), reply(5, 2, 0, 0));
    EXPECT_EQ(hexOf("KSTRMTimerRestarted"), timerRestarted(0, 2, 0, 0));
    EXPECT_EQ(call(client, control(7, ackName("KSTRMTimerRestarted"))), reply(5, 2, 0, 0));
    EXPECT_FALSE(control_->command("property get KSTRMTimerRestarted").ok);
    EXPECT_EQ(ask("status", "acks"), "2");
}

} // namespace

} // namespace keystrand::sim::test
