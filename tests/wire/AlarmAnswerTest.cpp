#include "wire/AlarmAnswer.h"

#include <gtest/gtest.h>

#include <limits>

namespace wire {
namespace {

using Bytes = std::vector<std::uint8_t>;
using Timer = AlarmAnswer::Timer;

TEST(AlarmAnswerTest, AnswerIsTheseBytes) {
    const AlarmAnswer answer{Timer::failed, false, 0x0102030405060708, "no"};
    EXPECT_EQ(encodeAlarmAnswer(answer), (Bytes{1, 2, 0, 8, 7, 6, 5, 4, 3, 2, 1, 'n', 'o'}));
    EXPECT_EQ(encodeAlarmAnswer({}), (Bytes{1, 0, 1, 0, 0, 0, 0, 0, 0, 0, 0}));
}

TEST(AlarmAnswerTest, WhatIsWrittenIsRead) {
    for (const Timer timer : {Timer::none, Timer::waits, Timer::failed}) {
        for (const std::int64_t date : {std::numeric_limits<std::int64_t>::min(), std::int64_t{0},
                                        std::numeric_limits<std::int64_t>::max()}) {
            const AlarmAnswer answer{timer, date == 0, date, date == 0 ? "" : "Access denied"};
            EXPECT_EQ(decodeAlarmAnswer(encodeAlarmAnswer(answer)), answer);
        }
    }
}

TEST(AlarmAnswerTest, ReasonIsCutWhereItIsTooLong) {
    for (const std::size_t size : {kAlarmReasonMaxSize - 1, kAlarmReasonMaxSize}) {
        const AlarmAnswer answer{Timer::failed, true, 1, std::string(size, 'x')};
        EXPECT_EQ(decodeAlarmAnswer(encodeAlarmAnswer(answer)), answer);
    }
    const AlarmAnswer tooLong{Timer::failed, true, 1, std::string(kAlarmReasonMaxSize + 1, 'x')};
    const Bytes bytes = encodeAlarmAnswer(tooLong);
    EXPECT_EQ(bytes.size(), kAlarmAnswerMaxSize);
    EXPECT_EQ(decodeAlarmAnswer(bytes).value().reason, std::string(kAlarmReasonMaxSize, 'x'));
}

TEST(AlarmAnswerTest, OtherBytesAreNoAnswer) {
    Bytes whole = encodeAlarmAnswer({Timer::waits, true, 1, ""});
    ASSERT_TRUE(decodeAlarmAnswer(whole));
    for (std::size_t size = 0; size < whole.size(); ++size) {
        EXPECT_FALSE(decodeAlarmAnswer({whole.data(), size})) << size;
    }
    const std::pair<std::size_t, std::uint8_t> wrong[] = {{0, 0}, {0, 2}, {1, 3}, {2, 2}};
    for (const auto& [place, value] : wrong) {
        Bytes bytes = whole;
        bytes[place] = value;
        EXPECT_FALSE(decodeAlarmAnswer(bytes)) << place;
    }
    whole.resize(kAlarmAnswerMaxSize + 1);
    EXPECT_FALSE(decodeAlarmAnswer(whole));
}

} // namespace
} // namespace wire
