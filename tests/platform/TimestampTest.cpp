#include "platform/Date.h"

#include <gtest/gtest.h>

namespace {

using platform::Date;
using platform::kDistantFuture;
using platform::millisecondsSince1970;
using platform::Timestamp;
using platform::timestampOf;

constexpr std::int64_t kSecond = platform::kNanosecondsPerSecond;

TEST(TimestampTest, SecondsSince2001) {
    EXPECT_EQ(timestampOf(Date{978'307'200 * kSecond}), Timestamp{0});
    EXPECT_EQ(timestampOf(Date{978'307'201 * kSecond}), Timestamp{1});
    EXPECT_EQ(timestampOf(Date{978'307'199 * kSecond}), Timestamp{-1});
    EXPECT_EQ(timestampOf(Date{0}), Timestamp{-978'307'200});
    EXPECT_EQ(timestampOf(Date{1'700'000'000 * kSecond}), Timestamp{721'692'800});
    EXPECT_NE(Timestamp{0}, Timestamp{1});
}

TEST(TimestampTest, SecondsHaveAFraction) {
    EXPECT_EQ(timestampOf(Date{978'307'200 * kSecond + kSecond / 4}), Timestamp{0.25});
    EXPECT_EQ(timestampOf(Date{978'307'200 * kSecond - kSecond / 4}), Timestamp{-0.25});
    EXPECT_EQ(timestampOf(Date{-kSecond / 2}), Timestamp{-978'307'200.5});
}

TEST(TimestampTest, SecondsOfTheEndsOfTime) {
    EXPECT_DOUBLE_EQ(timestampOf(kDistantFuture).secondsSince2001, 8'245'064'836.854776);
    EXPECT_DOUBLE_EQ(timestampOf(Date{INT64_MIN}).secondsSince2001, -10'201'679'236.854776);
}

TEST(TimestampTest, Milliseconds) {
    EXPECT_EQ(millisecondsSince1970(Date{0}), 0.0);
    EXPECT_EQ(millisecondsSince1970(Date{1'700'000'000 * kSecond}), 1'700'000'000'000.0);
    EXPECT_EQ(millisecondsSince1970(Date{1'700'000'000 * kSecond + 500'250'000}),
              1'700'000'000'500.25);
    EXPECT_EQ(millisecondsSince1970(Date{1}), 1e-6);
    EXPECT_EQ(millisecondsSince1970(Date{-1}), -1e-6);
    EXPECT_EQ(millisecondsSince1970(Date{-1'500'000}), -1.5);
    EXPECT_DOUBLE_EQ(millisecondsSince1970(kDistantFuture), 9'223'372'036'854.7758);
}

} // namespace
