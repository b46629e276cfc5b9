#include "kstd-notify/Notify.h"

#include "platform/fake/FakeClock.h"
#include "platform/linux/EventSocket.h"
#include "tests/platform/linux/RootDirectory.h"
#include "wire/EventDatagram.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <array>
#include <sstream>
#include <string>
#include <sys/socket.h>
#include <vector>

namespace notify {
namespace {

using Texts = std::vector<std::string>;

constexpr std::int64_t kNow = platform::FakeClock::kStart.nanosecondsSince1970;
constexpr char kAlarms[] = "/var/lib/kstd/alarms/com.zerva.alarm/";
constexpr char kAlarm[] = "com.zerva.kstd.alarm";
constexpr std::chrono::milliseconds kShortPatience{5};

class NotifyTest : public testing::Test {
  protected:
    NotifyTest() {
        root.makeDirectory("/run/kstd");
        root.makeDirectory(kAlarms);
    }

    void listen() { daemon = platform::makeEventSocket(root.paths().eventSocket()); }

    int run(const std::vector<std::string_view>& arguments) {
        std::ostringstream stream;
        const int status = notify::run(arguments, root.paths(), clock, kShortPatience, stream);
        errors = stream.str();
        return status;
    }

    void putAlarm(const std::string& content, const std::string& event = kAlarm) {
        root.put(kAlarms + event, content);
    }

    static std::string line(std::int64_t date) {
        const std::string digits = std::to_string(date);
        return std::string(20 - digits.size(), '0') + digits + "\n";
    }

    /// What the daemon finds in its socket, such as "stream name 1700000000000000000", sorted.
    Texts received() {
        Texts events;
        std::array<std::uint8_t, wire::kEventMaxSize> buffer{};
        ssize_t length = 0;
        while ((length = ::recv(daemon.get(), buffer.data(), buffer.size(), MSG_DONTWAIT)) >= 0) {
            const auto event =
                wire::decodeEvent({buffer.data(), static_cast<std::size_t>(length)}).value();
            std::string text = std::string(event.stream) + ' ' + std::string(event.name);
            std::uint64_t date = 0;
            for (std::size_t i = 0; i < event.payload.size(); ++i) {
                date |= std::uint64_t{event.payload[i]} << (8 * i);
            }
            events.push_back(event.payload.empty() ? text : text + ' ' + std::to_string(date));
        }
        std::sort(events.begin(), events.end());
        return events;
    }

    [[nodiscard]] std::string cannotSend(const std::string& event,
                                         const std::string& reason) const {
        return "kstd-notify: cannot send " + event + " to " + root.paths().eventSocket() + ": " +
               reason + "\n";
    }

    support::RootDirectory root;
    platform::FakeClock clock;
    base::FileDescriptor daemon;
    std::string errors;
};

TEST_F(NotifyTest, ChangedSettingsAreOneEvent) {
    listen();
    EXPECT_EQ(run({"settings"}), kSent);
    EXPECT_EQ(received(), Texts{"com.zerva.notifyd.matching "
                                "com.zerva.quorvane.effectivesettingschanged"});
    EXPECT_EQ(errors, "");
}

TEST_F(NotifyTest, AlarmsThatAreDueAreSentWithTheirDatesAndOthersWithThePresentOne) {
    listen();
    const std::string event = "com.zerva.alarm com.zerva.kstd.alarm ";
    const std::pair<std::string, Texts> cases[] = {
        {line(kNow - 1), {event + std::to_string(kNow - 1)}},
        {line(kNow), {event + std::to_string(kNow)}},
        {line(kNow + 1), {event + std::to_string(kNow)}},
        {"none                \n", {}},
    };
    for (const auto& [content, events] : cases) {
        putAlarm(content);
        EXPECT_EQ(run({"alarm"}), kSent);
        EXPECT_EQ(received(), events);
        EXPECT_EQ(errors, "");
    }
}

TEST_F(NotifyTest, FileThatIsNoAlarmIsNotSent) {
    listen();
    putAlarm(line(kNow), std::string(kAlarm) + ".bak");
    EXPECT_EQ(run({"alarm"}), kSent);
    EXPECT_EQ(received(), Texts{});
    EXPECT_EQ(errors, "kstd: AlarmStore: no alarm of the daemon, left alone: " +
                          root.real(std::string(kAlarms) + kAlarm + ".bak") + ".\n");
}

TEST_F(NotifyTest, DirectoryThatCannotBeReadIsAnAlarmThatIsDue) {
    listen();
    std::filesystem::remove(root.real(kAlarms));
    root.put("/var/lib/kstd/alarms/com.zerva.alarm", std::string("a file"));
    EXPECT_EQ(run({"alarm"}), kSent);
    EXPECT_EQ(received(), Texts{"com.zerva.alarm com.zerva.kstd.alarm 0"});
    EXPECT_EQ(errors, "kstd: AlarmStore: unreadable directory, every alarm taken as due: " +
                          root.real("/var/lib/kstd/alarms/com.zerva.alarm") +
                          ": Not a directory.\n");
}

TEST_F(NotifyTest, AlarmThatCannotBeReadIsDue) {
    listen();
    putAlarm("0170000");
    EXPECT_EQ(run({"alarm"}), kSent);
    EXPECT_EQ(received(), Texts{"com.zerva.alarm com.zerva.kstd.alarm 0"});
    EXPECT_EQ(errors, "kstd: AlarmStore: unreadable alarm, taken as due: " +
                          root.real(std::string(kAlarms) + kAlarm) + ".\n");
}

TEST_F(NotifyTest, WithoutAlarmsNothingIsSentAndNobodyNeedsToListen) {
    EXPECT_EQ(run({"alarm"}), kSent);
    std::filesystem::remove_all(root.real("/var/lib/kstd"));
    EXPECT_EQ(run({"alarm"}), kSent);
    EXPECT_EQ(errors, "");
}

TEST_F(NotifyTest, SocketThatIsNotThereIsAFailure) {
    EXPECT_EQ(run({"settings"}), kNotSent);
    EXPECT_EQ(errors, cannotSend("com.zerva.quorvane.effectivesettingschanged",
                                 "No such file or directory"));
}

TEST_F(NotifyTest, SocketThatNobodyHasIsAFailure) {
    listen();
    daemon.reset();
    EXPECT_EQ(run({"settings"}), kNotSent);
    EXPECT_EQ(errors,
              cannotSend("com.zerva.quorvane.effectivesettingschanged", "Connection refused"));
}

TEST_F(NotifyTest, FullQueueIsAFailureAfterAWhile) {
    listen();
    int sent = 0;
    while (run({"settings"}) == kSent) {
        ASSERT_LT(++sent, 100000);
    }
    EXPECT_EQ(errors, cannotSend("com.zerva.quorvane.effectivesettingschanged",
                                 "the daemon takes no events, its queue is full"));
    EXPECT_EQ(received().size(), static_cast<std::size_t>(sent));
    EXPECT_EQ(run({"settings"}), kSent);
}

TEST_F(NotifyTest, AlarmThatIsNotSentIsNamed) {
    putAlarm(line(kNow));
    EXPECT_EQ(run({"alarm"}), kNotSent);
    EXPECT_EQ(errors, cannotSend(kAlarm, "No such file or directory"));
}

TEST_F(NotifyTest, HelperWithoutABusIsAFailureWhenNobodyAsked) {
    EXPECT_EQ(run({"arm"}), kSent) << "there is no alarm";
    putAlarm(line(kNow + 1));
    EXPECT_EQ(run({"arm"}), kNotSent);
    EXPECT_EQ(errors, "kstd-notify: no timer for the alarm: No such file or directory\n");
}

TEST_F(NotifyTest, HelperSaysWhyItCannotReadAnAlarm) {
    putAlarm("");
    EXPECT_EQ(run({"arm"}), kNotSent) << "there is no bus";
    EXPECT_EQ(errors, "kstd: AlarmStore: unreadable alarm, taken as due: " +
                          root.real(std::string(kAlarms) + kAlarm) +
                          ".\nkstd-notify: no timer for the alarm: No such file or directory\n"
                          "kstd-notify: no timer for the alarm: No such file or directory\n");
}

TEST_F(NotifyTest, OtherArgumentsGiveTheUsage) {
    listen();
    const std::vector<std::vector<std::string_view>> cases = {
        {}, {"boot"}, {""}, {"alarm", "alarm"}, {"--help"}};
    for (const auto& arguments : cases) {
        EXPECT_EQ(run(arguments), kWrongUsage);
        EXPECT_EQ(errors.substr(0, 39), "usage: kstd-notify alarm|arm|settings\n ");
    }
    EXPECT_EQ(received(), Texts{});
}

} // namespace
} // namespace notify
