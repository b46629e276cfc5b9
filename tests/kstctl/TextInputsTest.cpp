// What people write on the command line: bytes, dates, names of events.

#include "kstctl/ExitStatus.h"
#include "kstctl/Report.h"
#include "kstctl/commands/Inputs.h"

#include <gtest/gtest.h>

#include <limits>

namespace kstctl {
namespace {

TEST(TextInputsTest, DigitsWithBlanksBetweenBytes) {
    const std::pair<std::string, platform::Bytes> kTexts[] = {
        {"", {}},
        {" \n", {}},
        {"00ff", {0x00, 0xff}},
        {"0aAf 1B\n9e\t\r00", {0x0a, 0xaf, 0x1b, 0x9e, 0x00}},
    };
    for (const auto& [text, bytes] : kTexts) {
        const auto result = bytesOfHex(text);
        ASSERT_TRUE(result) << text;
        EXPECT_EQ(result.value(), bytes);
    }
}

TEST(TextInputsTest, NoDigitsAndHalfBytesAreNamed) {
    const std::pair<std::string, std::string> kTexts[] = {
        {"0", "no hexadecimal digits: half a byte at character 2"},
        {"000", "no hexadecimal digits: half a byte at character 4"},
        {"0 0", "no hexadecimal digits: half a byte at character 2"},
        {"0x00", "no hexadecimal digits: another character at character 2"},
        {"00g0", "no hexadecimal digits: another character at character 3"},
        {"00:00", "no hexadecimal digits: another character at character 3"},
    };
    for (const auto& [text, reason] : kTexts) {
        const auto result = bytesOfHex(text);
        ASSERT_FALSE(result) << text;
        EXPECT_EQ(result.error().description, reason);
        EXPECT_EQ(statusOf(result.error()), ExitStatus::malformed);
    }
}

TEST(TextInputsTest, DatesInBothForms) {
    const std::pair<std::string, std::int64_t> kDates[] = {
        {"0", 0},
        {"1700000000", 1'700'000'000'000'000'000},
        {"1700000000.5", 1'700'000'000'500'000'000},
        {"0.000000001", 1},
        {"9223372036.854775807", std::numeric_limits<std::int64_t>::max()},
        {"2023-11-14T22:13:20Z", 1'700'000'000'000'000'000},
        {"2023-11-14T23:13:20+01:00", 1'700'000'000'000'000'000},
        {"1969-12-31T23:59:59Z", -1'000'000'000},
    };
    for (const auto& [text, nanoseconds] : kDates) {
        const auto date = dateOfText(text);
        ASSERT_TRUE(date) << text;
        EXPECT_EQ(date->nanosecondsSince1970, nanoseconds) << text;
    }
}

TEST(TextInputsTest, NoDates) {
    for (const char* const text : {"", "x", "-1", "1.", ".5", "1.0000000000", "1.-5", "+1", "1 ",
                                   "9223372036.854775808", "9223372037", "99999999999999999999",
                                   "2023-11-14", "2023-02-30T00:00:00Z", "9999-01-01T00:00:00Z"}) {
        EXPECT_FALSE(dateOfText(text)) << text;
    }
}

TEST(TextInputsTest, TimesAsText) {
    EXPECT_EQ(timeText(std::uint64_t{0}), "");
    EXPECT_EQ(timeText(std::uint64_t{1}), "1970-01-01T00:00:01Z");
    EXPECT_EQ(timeText(std::uint64_t{253402300799}), "9999-12-31T23:59:59Z");
    EXPECT_EQ(timeText(std::uint64_t{253402300800}), "");
    EXPECT_EQ(timeText(std::numeric_limits<std::uint64_t>::max()), "");
    EXPECT_EQ(timeText(platform::Date{1'700'000'000'999'000'000}), "2023-11-14T22:13:20Z");
}

struct Names {
    SendCommand command;
    std::string stream;
    std::string name;
};

TEST(TextInputsTest, NamesOfEvents) {
    const std::string notifyd = "com.zerva.notifyd.matching";
    const std::string kernel = "com.zerva.Keystrand.";
    const Names kNames[] = {
        {{.name = "settings"}, notifyd, "com.zerva.quorvane.effectivesettingschanged"},
        {{.name = "timer-restarted"}, notifyd, kernel + "KSTRMTimerRestarted"},
        {{.name = "analytics-collected"}, notifyd, kernel + "KSTRMAnalyticsCollected"},
        {{.name = "save-analytics"}, notifyd, kernel + "KSTRMSaveAnalytics"},
        {{.name = "timer-restarted-analytics"},
         notifyd,
         kernel + "KSTRMTimerRestartedAnalyticsCollected"},
        {{.name = "alarm"}, "com.zerva.alarm", "com.zerva.kstd.alarm"},
        {{.name = "a.b"}, notifyd, "a.b"},
        {{.name = "settings", .stream = "corvid"},
         "com.zerva.corvid.matching",
         "com.zerva.quorvane.effectivesettingschanged"},
        {{.name = "alarm", .stream = "notifyd"}, notifyd, "com.zerva.kstd.alarm"},
        {{.name = "a.b", .stream = "c.d"}, "c.d", "a.b"},
        {{.name = "setings", .isExact = true}, notifyd, "setings"},
        {{.name = "x", .stream = "alarm", .isExact = true}, "alarm", "x"},
    };
    for (const Names& names : kNames) {
        const auto found = findEventName(names.command);
        ASSERT_TRUE(found) << names.command.name;
        EXPECT_EQ(found.value().stream, names.stream);
        EXPECT_EQ(found.value().name, names.name);
    }
}

TEST(TextInputsTest, NamesThatNobodyKnowsAreMistakes) {
    const auto event = findEventName({.name = "setings"});
    ASSERT_FALSE(event);
    EXPECT_EQ(event.error().description,
              "there is no event setings; --exact sends it all the same");
    EXPECT_EQ(statusOf(event.error()), ExitStatus::usage);
    const auto stream = findEventName({.name = "settings", .stream = "notify"});
    ASSERT_FALSE(stream);
    EXPECT_EQ(stream.error().description,
              "there is no stream notify; --exact sends it all the same");
}

} // namespace
} // namespace kstctl
