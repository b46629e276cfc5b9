#pragma once

#include <cstddef>
#include <cstdint>
#include <span>

/// The bytes that the kernel service and the restricted-mode service exchange: notification
/// records, the two blobs kept on disk, and the inputs of the kernel-control requests.
/// All integers are little-endian; there are no gaps.
namespace wire::rm {

enum NotificationType : std::uint32_t {
    kKSTRMNotificationTimerRestarted = 1,
    kKSTRMNotificationAnalyticsCollected = 2,
    kKSTRMNotificationSaveAnalytics = 3,
    kKSTRMNotificationTimerRestartedAnalyticsCollected = 4,
};

/// Control codes carried by the kernel-control command.
enum ControlCode : std::uint32_t {
    kKSTKernelControlRMDaemonStarted = 3,
    kKSTKernelControlRMSetAllowed = 5,
    kKSTKernelControlRMRestoreAnalytics = 6,
    kKSTKernelControlRMNotificationAck = 7,
};

/// KSTRMStateBlob: version u32, standardModeStartTimestamp u64, lockedInRestrictedMode u8.
inline constexpr std::size_t kStateVersionOffset = 0;
inline constexpr std::size_t kStateStandardModeStartOffset = kStateVersionOffset + 4;
inline constexpr std::size_t kStateLockedOffset = kStateStandardModeStartOffset + 8;
inline constexpr std::size_t kStateBlobSize = kStateLockedOffset + 1;

/// KSTRMAnalyticsBlob: opaque outside the kernel service.
inline constexpr std::size_t kAnalyticsBlobSize = 32;

/// KSTDRMDeamonNotification: type u32, then a body that depends on the type.
inline constexpr std::size_t kNotificationTypeOffset = 0;
inline constexpr std::size_t kNotificationBodyOffset = kNotificationTypeOffset + 4;
inline constexpr std::size_t kNotificationSize = kNotificationBodyOffset + 32;

/// Type 1, timer restarted: alarmTimestamp u64, then a KSTRMStateBlob, 11 bytes unused.
inline constexpr std::size_t kAlarmTimestampOffset = kNotificationBodyOffset;
inline constexpr std::size_t kStateBlobOffset = kAlarmTimestampOffset + 8;

/// Type 2, analytics collected: two durations u32, 4 bytes unused, four flags u8, 16 bytes unused.
inline constexpr std::size_t kEventPeriodDurationOffset = kNotificationBodyOffset;
inline constexpr std::size_t kRestrictedModeDurationOffset = kEventPeriodDurationOffset + 4;
inline constexpr std::size_t kRestrictedModeOffset = kRestrictedModeDurationOffset + 4 + 4;
inline constexpr std::size_t kPolicyDisabledByPasscodeNotSetOffset = kRestrictedModeOffset + 1;
inline constexpr std::size_t kPolicyDisabledByBootArgOffset =
    kPolicyDisabledByPasscodeNotSetOffset + 1;
inline constexpr std::size_t kPolicyDisabledByQuorvaneOffset = kPolicyDisabledByBootArgOffset + 1;

/// Type 3, save analytics: a KSTRMAnalyticsBlob.
inline constexpr std::size_t kAnalyticsBlobOffset = kNotificationBodyOffset;

/// Type 4, timer restarted, analytics collected: totalRestrictedModeDuration u32, 28 bytes unused.
inline constexpr std::size_t kTotalRestrictedModeDurationOffset = kNotificationBodyOffset;

/// KSTRMDaemonStartedPayload, input of request 3: restrictedModeAllowed u8, 2 zero bytes, then a
/// KSTRMStateBlob.
inline constexpr std::size_t kDaemonStartedAllowedOffset = 0;
inline constexpr std::size_t kDaemonStartedStateOffset = kDaemonStartedAllowedOffset + 1 + 2;
inline constexpr std::size_t kDaemonStartedPayloadSize = kDaemonStartedStateOffset + kStateBlobSize;

/// Input of request 5: 1 allowed, 0 not allowed.
inline constexpr std::size_t kSetAllowedPayloadSize = 1;

/// Input of request 7: a registry property name, zero-filled; a name of this size or more fills it
/// without a terminating zero.
inline constexpr std::size_t kNotificationAckPayloadSize = 64;

inline constexpr char kTimerRestartedProperty[] = "KSTRMTimerRestarted";
inline constexpr char kAnalyticsCollectedProperty[] = "KSTRMAnalyticsCollected";
inline constexpr char kSaveAnalyticsProperty[] = "KSTRMSaveAnalytics";
inline constexpr char kTimerRestartedAnalyticsCollectedProperty[] =
    "KSTRMTimerRestartedAnalyticsCollected";

/// What a field of a record is, and so how it is shown.
enum class FieldForm { number, seconds, stateBlob, analyticsBlob };

/// One field of a record's body.
struct NotificationField {
    const char* name;
    std::size_t offset;
    std::size_t size;
    FieldForm form = FieldForm::number;
};

inline constexpr NotificationField kTimerRestartedFields[] = {
    {"alarmTimestamp", kAlarmTimestampOffset, 8, FieldForm::seconds},
    {"state", kStateBlobOffset, kStateBlobSize, FieldForm::stateBlob},
};
inline constexpr NotificationField kAnalyticsCollectedFields[] = {
    {"eventPeriodDuration", kEventPeriodDurationOffset, 4},
    {"restrictedModeDuration", kRestrictedModeDurationOffset, 4},
    {"restrictedMode", kRestrictedModeOffset, 1},
    {"policyDisabledByPasscodeNotSet", kPolicyDisabledByPasscodeNotSetOffset, 1},
    {"policyDisabledByBootArg", kPolicyDisabledByBootArgOffset, 1},
    {"policyDisabledByQuorvane", kPolicyDisabledByQuorvaneOffset, 1},
};
inline constexpr NotificationField kSaveAnalyticsFields[] = {
    {"figures", kAnalyticsBlobOffset, kAnalyticsBlobSize, FieldForm::analyticsBlob},
};
inline constexpr NotificationField kTimerRestartedAnalyticsCollectedFields[] = {
    {"totalRestrictedModeDuration", kTotalRestrictedModeDurationOffset, 4},
};

/// A type of notification, in every name that it has.
struct NotificationKind {
    NotificationType type;
    const char* property;
    /// For commands.
    const char* shortName;
    /// For people.
    const char* description;
    std::span<const NotificationField> fields;
};

/// Every type that there is. Who adds one adds its row here and what is done with it in the
/// service.
inline constexpr NotificationKind kNotificationKinds[] = {
    {kKSTRMNotificationTimerRestarted, kTimerRestartedProperty, "timer-restarted",
     "timer restarted", kTimerRestartedFields},
    {kKSTRMNotificationAnalyticsCollected, kAnalyticsCollectedProperty, "analytics-collected",
     "analytics collected", kAnalyticsCollectedFields},
    {kKSTRMNotificationSaveAnalytics, kSaveAnalyticsProperty, "save-analytics", "save analytics",
     kSaveAnalyticsFields},
    {kKSTRMNotificationTimerRestartedAnalyticsCollected, kTimerRestartedAnalyticsCollectedProperty,
     "timer-restarted-analytics", "timer restarted, analytics collected",
     kTimerRestartedAnalyticsCollectedFields},
};

/// Null for a type that there is not.
[[nodiscard]] constexpr const NotificationKind* findNotificationKind(std::uint32_t type) {
    for (const NotificationKind& kind : kNotificationKinds) {
        if (kind.type == type) {
            return &kind;
        }
    }
    return nullptr;
}

/// A platform notification is this prefix followed by the name of the property that it announces.
inline constexpr char kNotificationNamePrefix[] = "com.zerva.Keystrand.";

/// The kernel service's registry entry and its class.
inline constexpr char kKernelServicePath[] = "IOService:/IOResources/Keystrand";
inline constexpr char kKernelServiceClass[] = "Keystrand";

} // namespace wire::rm
