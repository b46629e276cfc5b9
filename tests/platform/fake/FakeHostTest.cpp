#include "platform/fake/FakeHost.h"

#include <gmock/gmock.h>

#include <string>
#include <vector>

namespace {

using platform::Event;
using platform::FakeHost;
using platform::FakeMachine;
using platform::Host;
using platform::kDistantFuture;
using testing::ElementsAre;
using testing::Optional;

TEST(FakeHostTest, ProgramReachesEachDouble) {
    FakeMachine machine;
    FakeHost process(machine);
    const Host host = process.host();

    host.log.write(platform::LogLevel::warning, "text\n", {"file", 3, "function"});
    ASSERT_EQ(process.log.lines().size(), 1U);
    EXPECT_EQ(process.log.lines()[0].level, platform::LogLevel::warning);
    EXPECT_EQ(process.log.lines()[0].text, "text");
    EXPECT_EQ(process.log.lines()[0].file, "file");
    EXPECT_EQ(process.log.lines()[0].line, 3);
    EXPECT_EQ(process.log.lines()[0].function, "function");

    const platform::ServiceHandle service = host.registry.findByPath(machine.kernel.path);
    EXPECT_EQ(process.registry.liveReferences(), 1U);
    platform::ConnectionHandle connection = platform::kNoConnection;
    EXPECT_EQ(host.channel.open(service, 0, &connection), platform::kSuccess);
    host.registry.release(service);

    EXPECT_TRUE(host.settings.isRestrictedModeAllowed());
    EXPECT_EQ(process.settings.questions(), 1U);

    host.transactions.begin("label");
    EXPECT_EQ(process.events.transactions().count(), 1U);
    host.transactions.end("label");

    machine.disk.put("/var/root/x", {1});
    EXPECT_THAT(host.files.load("/var/root/x"), Optional(platform::FakeBytes{1}));
}

TEST(FakeHostTest, ChangedSettingIsAnnounced) {
    FakeMachine machine;
    FakeHost process(machine);
    const Host host = process.host();
    std::vector<std::string> names;
    host.events.setHandler("com.zerva.notifyd.matching",
                           [&names](const Event& event) { names.push_back(event.name); });
    process.settings.put(true);
    process.settings.change(false);
    process.events.closeSources();
    EXPECT_FALSE(host.settings.isRestrictedModeAllowed());
    EXPECT_FALSE(host.runLoop.runOnce(kDistantFuture));
    EXPECT_THAT(names, ElementsAre());

    FakeHost next(machine);
    next.host().events.setHandler("com.zerva.notifyd.matching",
                                  [&names](const Event& event) { names.push_back(event.name); });
    next.settings.change(false);
    EXPECT_TRUE(next.host().runLoop.runOnce(kDistantFuture));
    EXPECT_THAT(names, ElementsAre(platform::kSettingsChangedEvent));
}

TEST(FakeHostTest, SecondProcessFindsTheFilesAndAlarmsOfTheFirst) {
    FakeMachine machine;
    const platform::EventDictionary dictionary = {{platform::kAlarmDateKey, platform::Date{0}}};
    {
        FakeHost first(machine);
        first.host().alarms.set("com.zerva.alarm", "alarm", &dictionary);
        const auto stream = first.files.attachStream(first.files.openForWriting(
            "/var/root/x", platform::ProtectionClass::none, platform::kNoClassOptions, 0600));
        EXPECT_EQ(stream->write("abc", 1, 3), 3U);
    }
    FakeHost second(machine);
    std::vector<std::string> names;
    second.host().events.setHandler("com.zerva.alarm",
                                    [&names](const Event& event) { names.push_back(event.name); });
    EXPECT_TRUE(second.host().runLoop.runOnce(kDistantFuture));
    EXPECT_THAT(names, ElementsAre("alarm"));
    EXPECT_THAT(second.files.load("/var/root/x"), Optional(platform::FakeBytes{'a', 'b', 'c'}));
}

} // namespace
