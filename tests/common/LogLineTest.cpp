#include "common/LibraryLog.h"
#include "tests/support/RecordingLog.h"

#include <gtest/gtest.h>

#include <string>

namespace {

using support::RecordingLog;

} // namespace

TEST(LogLine, FormatsWithItsPlace) {
    RecordingLog log;
    kst::writeLogLine(&log, {"a/b", 3, "main"}, "%s: %d.\n", "kstd", -1);
    ASSERT_EQ(log.lines().size(), 1U);
    EXPECT_EQ(log.lines()[0].text, "kstd: -1.\n");
    EXPECT_EQ(log.lines()[0].level, platform::LogLevel::info);
    EXPECT_EQ(log.lines()[0].file, "a/b");
    EXPECT_EQ(log.lines()[0].line, 3);
    EXPECT_EQ(log.lines()[0].function, "main");
}

TEST(LogLine, NoLog) {
    kst::writeLogLine(nullptr, {}, "%s\n", "nowhere");
}

TEST(LogLine, LengthAtItsLimit) {
    for (const std::size_t length :
         {std::size_t{1022}, kst::kMaxLogLineLength, std::size_t{1024}}) {
        RecordingLog log;
        const std::string text(length, 'x');
        kst::writeLogLine(&log, {}, "%s", text.c_str());
        const std::string expected = length <= 1023 ? text : text.substr(0, 1023) + "...";
        EXPECT_EQ(log.texts().front(), expected) << length;
    }
}

TEST(LogLine, NewlineAtTheEndIsNoPartOfTheLength) {
    const std::string text(kst::kMaxLogLineLength, 'x');
    RecordingLog log;
    kst::writeLogLine(&log, {}, "%s\n", text.c_str());
    kst::writeLogLine(&log, {}, "%sx\n", text.c_str());
    EXPECT_EQ(log.texts()[0], text + "\n");
    EXPECT_EQ(log.texts()[1], text + "...");
}
