#include "kstd/DeviceRestrictedMode/KSTDRMDeamonNotification.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <numeric>
#include <vector>

namespace kstd {
namespace {

/// Byte i holds 0x10 + i, so that a field read at the wrong offset shows.
std::vector<std::uint8_t> bytesThatCount() {
    std::vector<std::uint8_t> bytes(36);
    std::iota(bytes.begin(), bytes.end(), std::uint8_t{0x10});
    return bytes;
}

TEST(KSTDRMDeamonNotificationTest, EveryFieldStandsAtItsOffset) {
    const auto record = KSTDRMDeamonNotification::fromBytes(bytesThatCount());
    ASSERT_TRUE(record);
    EXPECT_EQ(record->type(), 0x13121110U);
    EXPECT_EQ(record->alarmTimestamp(), 0x1b1a191817161514U);
    EXPECT_EQ(record->version(), 0x1f1e1d1cU);
    EXPECT_EQ(record->standardModeStartTimestamp(), 0x2726252423222120U);
    EXPECT_EQ(record->lockedInRestrictedMode(), 0x28U);
    EXPECT_EQ(record->eventPeriodDuration(), 0x17161514U);
    EXPECT_EQ(record->restrictedModeDuration(), 0x1b1a1918U);
    EXPECT_EQ(record->restrictedMode(), 0x20U);
    EXPECT_EQ(record->policyDisabledByPasscodeNotSet(), 0x21U);
    EXPECT_EQ(record->policyDisabledByBootArg(), 0x22U);
    EXPECT_EQ(record->policyDisabledByQuorvane(), 0x23U);
    EXPECT_EQ(record->totalRestrictedModeDuration(), 0x17161514U);
}

TEST(KSTDRMDeamonNotificationTest, BlobsAreBytes12To24AndBytes4To35) {
    const auto bytes = bytesThatCount();
    const auto record = KSTDRMDeamonNotification::fromBytes(bytes);
    ASSERT_TRUE(record);
    EXPECT_TRUE(std::equal(record->stateBlob().begin(), record->stateBlob().end(),
                           bytes.begin() + 12, bytes.begin() + 25));
    EXPECT_TRUE(std::equal(record->analyticsBlob().begin(), record->analyticsBlob().end(),
                           bytes.begin() + 4, bytes.end()));
}

TEST(KSTDRMDeamonNotificationTest, HighestValuesAreReadWhole) {
    const auto record =
        KSTDRMDeamonNotification::fromBytes(std::vector<std::uint8_t>(36, std::uint8_t{0xff}));
    ASSERT_TRUE(record);
    EXPECT_EQ(record->type(), UINT32_MAX);
    EXPECT_EQ(record->alarmTimestamp(), UINT64_MAX);
    EXPECT_EQ(record->lockedInRestrictedMode(), UINT8_MAX);
}

TEST(KSTDRMDeamonNotificationTest, AnyOtherLengthIsNoRecord) {
    for (const std::size_t length : {0U, 1U, 35U, 37U, 72U}) {
        EXPECT_FALSE(KSTDRMDeamonNotification::fromBytes(std::vector<std::uint8_t>(length)))
            << length;
    }
}

} // namespace
} // namespace kstd
