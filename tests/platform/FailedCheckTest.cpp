#include "platform/FailedCheck.h"

#include "tests/support/RecordingLog.h"

#include <gtest/gtest.h>

#include <cstdio>
#include <string>

namespace {

using support::RecordingLog;

/// A log that a death test can see.
class StandardErrorLog : public platform::SystemLog {
  public:
    void write(platform::LogLevel /*level*/, std::string_view text,
               const platform::LogFields& /*fields*/) override {
        std::fwrite(text.data(), 1, text.size(), stderr);
        std::fflush(stderr);
    }
};

} // namespace

TEST(LogLine, FormatsWithItsPlace) {
    RecordingLog log;
    platform::writeLogLine(&log, {"a/b", 3, "main"}, "%s: %d.\n", "kstd", -1);
    ASSERT_EQ(log.lines().size(), 1U);
    EXPECT_EQ(log.lines()[0].text, "kstd: -1.\n");
    EXPECT_EQ(log.lines()[0].level, platform::LogLevel::info);
    EXPECT_EQ(log.lines()[0].file, "a/b");
    EXPECT_EQ(log.lines()[0].line, 3);
    EXPECT_EQ(log.lines()[0].function, "main");
}

TEST(LogLine, NoLog) {
    platform::writeLogLine(nullptr, {}, "%s\n", "nowhere");
}

TEST(LogLine, LengthAtItsLimit) {
    for (const std::size_t length :
         {std::size_t{1022}, platform::kMaxLogLineLength, std::size_t{1024}}) {
        RecordingLog log;
        const std::string text(length, 'x');
        platform::writeLogLine(&log, {}, "%s", text.c_str());
        const std::string expected = length <= 1023 ? text : text.substr(0, 1023) + "...";
        EXPECT_EQ(log.texts().front(), expected) << length;
    }
}

TEST(LogLine, NewlineAtTheEndIsNoPartOfTheLength) {
    const std::string text(platform::kMaxLogLineLength, 'x');
    RecordingLog log;
    platform::writeLogLine(&log, {}, "%s\n", text.c_str());
    platform::writeLogLine(&log, {}, "%sx\n", text.c_str());
    EXPECT_EQ(log.texts()[0], text + "\n");
    EXPECT_EQ(log.texts()[1], text + "...");
}

TEST(AssertLineDeathTest, StopWritesTheLineFirst) {
    StandardErrorLog log;
    EXPECT_EXIT(platform::stop({&log, "KST", "common/LibCall"}, "a == b", {"x", 7}),
                testing::KilledBySignal(SIGABRT),
                "KST: AssertMacros: a == b \\(value: 0x0\\),  file: common/LibCall:7\n");
}

TEST(AssertLineDeathTest, StopNeedsNoLog) {
    EXPECT_EXIT(platform::stop({nullptr, "KST", "common/LibCall"}, "a == b"),
                testing::KilledBySignal(SIGABRT), "");
}
