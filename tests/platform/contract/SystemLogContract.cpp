#include "tests/platform/contract/SystemLogContract.h"

#include <gmock/gmock.h>

#include <algorithm>
#include <cerrno>
#include <string>
#include <thread>
#include <vector>

namespace contract {

namespace {

using platform::LogLevel;
using testing::ElementsAre;

} // namespace

TEST_P(SystemLogContract, NothingWrittenIsNoLine) {
    EXPECT_THAT(fixture().lines(), ElementsAre());
}

TEST_P(SystemLogContract, EachCallIsOneLineInItsTurn) {
    write("first\n");
    write("second\n");
    EXPECT_THAT(fixture().lines(), ElementsAre("first", "second"));
}

TEST_P(SystemLogContract, FinalNewlineMakesNoDifference) {
    write("text");
    write("text\n");
    EXPECT_THAT(fixture().lines(), ElementsAre("text", "text"));
}

TEST_P(SystemLogContract, EmptyTextIsAnEmptyLine) {
    write("");
    write("\n");
    EXPECT_THAT(fixture().lines(), ElementsAre("", ""));
}

TEST_P(SystemLogContract, TextCannotForgeALine) {
    write("name = evil\nkstd: main: forged\n");
    EXPECT_THAT(fixture().lines(), ElementsAre("name = evil\\nkstd: main: forged"));
}

TEST_P(SystemLogContract, ControlCharactersAreShown) {
    write(std::string_view("a\tb\rc\0d\x1b[31me\x7f\n", 14));
    EXPECT_THAT(fixture().lines(), ElementsAre("a\\tb\\rc\\x00d\\x1b[31me\\x7f"));
}

TEST_P(SystemLogContract, CharactersBeyondAsciiStayAsTheyAre) {
    write("Schl\xc3\xbcssel\n");
    EXPECT_THAT(fixture().lines(), ElementsAre("Schl\xc3\xbcssel"));
}

TEST_P(SystemLogContract, WhatDeceivesAReaderIsShown) {
    write("a\xc2\x85 b\xe2\x80\xae c\xff\n");
    EXPECT_THAT(fixture().lines(), ElementsAre("a\\u{85} b\\u{202e} c\\xff"));
}

TEST_P(SystemLogContract, EveryLevelIsWritten) {
    for (const LogLevel level :
         {LogLevel::debug, LogLevel::info, LogLevel::notice, LogLevel::warning, LogLevel::error}) {
        fixture().log().write(level, "line\n", {"kstd/KSTService", 7, "main"});
    }
    EXPECT_THAT(fixture().lines(), ElementsAre("line", "line", "line", "line", "line"));
}

TEST_P(SystemLogContract, ErrorNumberStaysAsItIs) {
    errno = EXFULL;
    write("text\n");
    EXPECT_EQ(errno, EXFULL);
}

TEST_P(SystemLogContract, LinesOfSeveralThreadsStayWhole) {
    constexpr int kThreads = 4;
    constexpr int kLines = 200;
    std::vector<std::thread> threads;
    for (int number = 0; number < kThreads; ++number) {
        threads.emplace_back([this, number] {
            const std::string text(100, static_cast<char>('a' + number));
            for (int line = 0; line < kLines; ++line) {
                write(text);
            }
        });
    }
    for (std::thread& thread : threads) {
        thread.join();
    }
    const std::vector<std::string> lines = fixture().lines();
    for (int number = 0; number < kThreads; ++number) {
        const std::string text(100, static_cast<char>('a' + number));
        EXPECT_EQ(std::count(lines.begin(), lines.end(), text), kLines);
    }
    EXPECT_EQ(lines.size(), std::size_t{kThreads * kLines});
}

} // namespace contract
