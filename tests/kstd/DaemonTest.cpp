#include "kstd/Daemon.h"

#include "KSTLib/Platform.h"
#include "platform/EventStream.h"
#include "tests/kstd/DaemonFixture.h"
#include "tests/support/HostWith.h"

#include <gmock/gmock.h>

namespace kstd {
namespace {

using testing::ElementsAre;

/// A service that writes down what happens to it.
class Witness final : public KSTService {
  public:
    Witness(const platform::Host& host, std::string name, std::vector<std::string>& diary,
            platform::FakeHost& fake)
        : KSTService(host), name_(std::move(name)), diary_(diary), fake_(fake) {}

    void start() override { note("start"); }
    void stop() override { note("stop"); }
    void handleWispEventWithName(std::string_view eventName) override {
        transactions_ = fake_.events.transactions().open();
        note("event " + std::string(eventName));
    }
    [[nodiscard]] std::string description() const override { return name_; }

    [[nodiscard]] const std::vector<std::string>& transactionsDuringEvent() const {
        return transactions_;
    }

  private:
    void note(const std::string& what) {
        // What the log says last, so that the order of line and call shows.
        const auto texts = fake_.log.texts();
        diary_.push_back(name_ + " " + what + " after <" + (texts.empty() ? "" : texts.back()) +
                         ">");
    }

    std::string name_;
    std::vector<std::string>& diary_;
    platform::FakeHost& fake_;
    std::vector<std::string> transactions_;
};

class DaemonTest : public DaemonFixture {
  protected:
    std::shared_ptr<Witness> witness(const std::string& name) {
        return std::make_shared<Witness>(fake.host(), name, diary, fake);
    }

    /// Runs a daemon with these services until nothing is queued any more.
    int runUntilIdle(Daemon::Services services) {
        fake.events.runLoop().onIdle([this] { fake.events.closeSources(); });
        return Daemon(fake.host(), std::move(services)).run();
    }

    std::vector<std::string> diary;
};

TEST_F(DaemonTest, LinesComeBeforeTheCallsAndServicesGoInListOrder) {
    EXPECT_EQ(runUntilIdle({witness("first"), witness("second")}), 0);
    EXPECT_THAT(diary, ElementsAre("first start after <kstd: main: Started service - first.>",
                                   "second start after <kstd: main: Started service - second.>",
                                   "first stop after <kstd: main: Stoping service - first.>",
                                   "second stop after <kstd: main: Stoping service - second.>"));
}

TEST_F(DaemonTest, WholeLogOfALifeWithoutEvents) {
    EXPECT_EQ(runUntilIdle({witness("only")}), 0);
    EXPECT_THAT(lines(), ElementsAre("kstd: main: Started service - only.",
                                     "kstd: main: Entering the main runloop.",
                                     "kstd: main: Stoping service - only."));
}

TEST_F(DaemonTest, TheLibraryLosesItsPlatformWithTheDaemon) {
    EXPECT_NE(kst::installedPlatform(), nullptr);
    library.reset();
    EXPECT_EQ(kst::installedPlatform(), nullptr);
}

TEST_F(DaemonTest, EventsOfBothStreamsReachEveryServiceInOrderOfArrival) {
    fake.events.post("com.zerva.corvid.matching", "nobody's");
    fake.events.post("com.zerva.notifyd.matching", "unknown too");
    EXPECT_EQ(runUntilIdle({witness("first"), witness("second")}), 0);
    EXPECT_THAT(diary, testing::IsSupersetOf(
                           {"first event nobody's after <kstd: main_block_invoke: Wisp Event: "
                            "nobody's (corvid).>",
                            "second event nobody's after <kstd: main_block_invoke: Wisp Event: "
                            "nobody's (corvid).>",
                            "first event unknown too after <kstd: main_block_invoke: Wisp Event: "
                            "unknown too (notifyd).>",
                            "second event unknown too after <kstd: main_block_invoke: Wisp Event: "
                            "unknown too (notifyd).>"}));
    EXPECT_THAT(lines(), ElementsAre("kstd: main: Started service - first.",
                                     "kstd: main: Started service - second.",
                                     "kstd: main: Entering the main runloop.",
                                     "kstd: main_block_invoke: Wisp Event: nobody's (corvid).",
                                     "kstd: main_block_invoke: Wisp Event: unknown too (notifyd).",
                                     "kstd: main: Stoping service - first.",
                                     "kstd: main: Stoping service - second."));
}

TEST_F(DaemonTest, EventQueuedBeforeTheStartIsDeliveredOnceTheRunLoopRuns) {
    fake.events.post("com.zerva.notifyd.matching", "early");
    runUntilIdle({witness("only")});
    EXPECT_THAT(diary,
                ElementsAre("only start after <kstd: main: Started service - only.>",
                            "only event early after <kstd: main_block_invoke: Wisp Event: early "
                            "(notifyd).>",
                            "only stop after <kstd: main: Stoping service - only.>"));
}

/// Writes down who subscribes, and what the log says last.
class SubscriptionDiary final : public platform::EventStream {
  public:
    SubscriptionDiary(std::vector<std::string>& diary, platform::FakeHost& fake)
        : diary_(diary), fake_(fake) {}
    void setHandler(std::string_view stream, Handler /*handler*/) override {
        const auto texts = fake_.log.texts();
        diary_.push_back("subscribe " + std::string(stream) + " after <" +
                         (texts.empty() ? "" : texts.back()) + ">");
    }

  private:
    std::vector<std::string>& diary_;
    platform::FakeHost& fake_;
};

TEST_F(DaemonTest, ServicesAreStartedThenStreamsSubscribedThenTheRunLoopIsEntered) {
    SubscriptionDiary events(diary, fake);
    const platform::Host host = support::hostWith(fake.host(), {.events = &events});
    fake.events.closeSources();
    EXPECT_EQ(Daemon(host, {witness("first"), witness("second")}).run(), 0);
    EXPECT_THAT(diary,
                ElementsAre(testing::StartsWith("first start"), testing::StartsWith("second start"),
                            "subscribe com.zerva.notifyd.matching after "
                            "<kstd: main: Started service - second.>",
                            "subscribe com.zerva.corvid.matching after "
                            "<kstd: main: Started service - second.>",
                            testing::StartsWith("first stop"), testing::StartsWith("second stop")));
    EXPECT_THAT(lines(), testing::Contains("kstd: main: Entering the main runloop."));
}

TEST_F(DaemonTest, TheAlarmStreamIsSubscribedWhenTheListIsMade) {
    SubscriptionDiary events(diary, fake);
    const platform::Host host = support::hostWith(fake.host(), {.events = &events});
    const auto services = makeServices(host);
    EXPECT_THAT(diary, ElementsAre("subscribe com.zerva.alarm after <>"));
}

TEST_F(DaemonTest, ATransactionIsHeldWhileAnEventOfEitherStreamIsHandled) {
    const auto service = witness("only");
    fake.events.post("com.zerva.notifyd.matching", "a");
    runUntilIdle({service});
    EXPECT_THAT(service->transactionsDuringEvent(), ElementsAre("processing notifyd.matching"));
    EXPECT_EQ(fake.events.transactions().count(), 0U);
}

TEST_F(DaemonTest, TheSecondStreamHasALabelOfItsOwn) {
    const auto service = witness("only");
    fake.events.post("com.zerva.corvid.matching", "a");
    runUntilIdle({service});
    EXPECT_THAT(service->transactionsDuringEvent(), ElementsAre("processing corvid.matching"));
}

TEST_F(DaemonTest, AlarmTakesNoTransaction) {
    machine.alarms.save({kAlarmStreamName, kAlarmEventName}, {0});
    runUntilIdle(makeServices(fake.host()));
    EXPECT_THAT(fake.events.transactions().begun(), ElementsAre());
    EXPECT_THAT(lines(), testing::Contains(
                             "kstd: -[DeviceRestrictedModeService init]_block_invoke: alarm."));
}

TEST_F(DaemonTest, TheListHoldsOneRestrictedModeService) {
    const auto services = makeServices(fake.host());
    ASSERT_EQ(services.size(), 1U);
    EXPECT_NE(dynamic_cast<DeviceRestrictedModeService*>(services.front().get()), nullptr);
    EXPECT_EQ(services.front()->description(), services.front()->description());
    EXPECT_FALSE(services.front()->description().empty());
}

TEST_F(DaemonTest, ControlCharactersInAnEventNameCannotForgeALine) {
    fake.events.post("com.zerva.notifyd.matching", "x\nkstd: main: forged");
    runUntilIdle({witness("only")});
    EXPECT_THAT(lines(), testing::Contains("kstd: main_block_invoke: Wisp Event: x\\nkstd: main: "
                                           "forged (notifyd)."));
}

TEST_F(DaemonTest, BaseServiceDoesNothing) {
    class Plain final : public KSTService {
      public:
        using KSTService::KSTService;
        [[nodiscard]] std::string description() const override { return "plain"; }
    };
    Plain service(fake.host());
    service.start();
    service.handleWispEventWithName("x");
    service.stop();
    EXPECT_THAT(lines(), ElementsAre());
    EXPECT_TRUE(machine.kernel.structCalls.empty());
}

} // namespace
} // namespace kstd
