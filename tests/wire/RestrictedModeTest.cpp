#include "wire/RestrictedMode.h"

#include <gtest/gtest.h>

#include <iterator>
#include <set>
#include <string>
#include <string_view>

namespace {

using namespace wire::rm;

} // namespace

TEST(RestrictedModeLayout, Numbers) {
    EXPECT_EQ(kKSTRMNotificationTimerRestarted, 1U);
    EXPECT_EQ(kKSTRMNotificationAnalyticsCollected, 2U);
    EXPECT_EQ(kKSTRMNotificationSaveAnalytics, 3U);
    EXPECT_EQ(kKSTRMNotificationTimerRestartedAnalyticsCollected, 4U);
    EXPECT_EQ(kKSTKernelControlRMDaemonStarted, 3U);
    EXPECT_EQ(kKSTKernelControlRMSetAllowed, 5U);
    EXPECT_EQ(kKSTKernelControlRMRestoreAnalytics, 6U);
    EXPECT_EQ(kKSTKernelControlRMNotificationAck, 7U);
}

TEST(RestrictedModeLayout, StateBlob) {
    EXPECT_EQ(kStateVersionOffset, 0U);
    EXPECT_EQ(kStateStandardModeStartOffset, 4U);
    EXPECT_EQ(kStateLockedOffset, 12U);
    EXPECT_EQ(kStateBlobSize, 13U);
    EXPECT_EQ(kAnalyticsBlobSize, 32U);
}

TEST(RestrictedModeLayout, Notification) {
    EXPECT_EQ(kNotificationTypeOffset, 0U);
    EXPECT_EQ(kNotificationBodyOffset, 4U);
    EXPECT_EQ(kNotificationSize, 36U);
}

TEST(RestrictedModeLayout, TimerRestarted) {
    EXPECT_EQ(kAlarmTimestampOffset, 4U);
    EXPECT_EQ(kStateBlobOffset, 12U);
    EXPECT_EQ(kStateBlobOffset + kStateVersionOffset, 12U);
    EXPECT_EQ(kStateBlobOffset + kStateStandardModeStartOffset, 16U);
    EXPECT_EQ(kStateBlobOffset + kStateLockedOffset, 24U);
    EXPECT_EQ(kStateBlobOffset + kStateBlobSize + 11, kNotificationSize);
}

TEST(RestrictedModeLayout, AnalyticsCollected) {
    EXPECT_EQ(kEventPeriodDurationOffset, 4U);
    EXPECT_EQ(kRestrictedModeDurationOffset, 8U);
    EXPECT_EQ(kRestrictedModeOffset, 16U);
    EXPECT_EQ(kPolicyDisabledByPasscodeNotSetOffset, 17U);
    EXPECT_EQ(kPolicyDisabledByBootArgOffset, 18U);
    EXPECT_EQ(kPolicyDisabledByQuorvaneOffset, 19U);
    EXPECT_EQ(kPolicyDisabledByQuorvaneOffset + 1 + 16, kNotificationSize);
}

TEST(RestrictedModeLayout, SaveAnalyticsAndTotals) {
    EXPECT_EQ(kAnalyticsBlobOffset, 4U);
    EXPECT_EQ(kAnalyticsBlobOffset + kAnalyticsBlobSize, kNotificationSize);
    EXPECT_EQ(kTotalRestrictedModeDurationOffset, 4U);
}

TEST(RestrictedModeLayout, RequestPayloads) {
    EXPECT_EQ(kDaemonStartedAllowedOffset, 0U);
    EXPECT_EQ(kDaemonStartedStateOffset, 3U);
    EXPECT_EQ(kDaemonStartedPayloadSize, 16U);
    EXPECT_EQ(kSetAllowedPayloadSize, 1U);
    EXPECT_EQ(kNotificationAckPayloadSize, 64U);
}

TEST(RestrictedModeLayout, Names) {
    EXPECT_EQ(std::string_view(kTimerRestartedProperty), "KSTRMTimerRestarted");
    EXPECT_EQ(std::string_view(kAnalyticsCollectedProperty), "KSTRMAnalyticsCollected");
    EXPECT_EQ(std::string_view(kSaveAnalyticsProperty), "KSTRMSaveAnalytics");
    EXPECT_EQ(std::string_view(kTimerRestartedAnalyticsCollectedProperty),
              "KSTRMTimerRestartedAnalyticsCollected");
    EXPECT_EQ(std::string_view(kNotificationNamePrefix), "com.zerva.Keystrand.");
    EXPECT_EQ(std::string_view(kKernelServicePath), "IOService:/IOResources/Keystrand");
    EXPECT_EQ(std::string_view(kKernelServiceClass), "Keystrand");
}

TEST(NotificationKinds, EveryTypeHasARowUnderNamesOfItsOwn) {
    std::set<std::string> names;
    std::uint32_t type = 0;
    for (const NotificationKind& kind : kNotificationKinds) {
        EXPECT_EQ(kind.type, ++type);
        EXPECT_EQ(findNotificationKind(type), &kind);
        names.insert({kind.property, kind.shortName, kind.description});
        EXPECT_LT(std::string_view(kind.property).size(), kNotificationAckPayloadSize);
    }
    EXPECT_EQ(names.size(), 3 * std::size(kNotificationKinds));
    EXPECT_EQ(findNotificationKind(0), nullptr);
    EXPECT_EQ(findNotificationKind(type + 1), nullptr);
}

TEST(NotificationKinds, FieldsLieInTheBodyOneBehindTheOther) {
    for (const NotificationKind& kind : kNotificationKinds) {
        std::size_t end = kNotificationBodyOffset;
        for (const NotificationField& field : kind.fields) {
            EXPECT_GE(field.offset, end) << field.name;
            end = field.offset + field.size;
        }
        EXPECT_GT(end, kNotificationBodyOffset);
        EXPECT_LE(end, kNotificationSize);
    }
}
