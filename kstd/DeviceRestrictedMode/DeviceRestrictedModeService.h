#pragma once

#include "KSTLib/Status.h"
#include "kstd/DeviceRestrictedMode/KSTDRMDeamonNotification.h"
#include "kstd/KSTService.h"
#include "platform/FailedCheck.h"

#include <cstdint>
#include <memory>
#include <optional>
#include <span>
#include <string>
#include <string_view>
#include <vector>

namespace kstd {

/// The KSTRMStateBlob of the last timer notification, 13 bytes; what follows them is an older,
/// longer record's rest and means nothing.
inline constexpr char kStateFilePath[] = "/var/root/.usbrestrictedmode_v2";

/// The KSTRMAnalyticsBlob of the last save-analytics notification, 32 bytes; what follows them
/// means nothing.
inline constexpr char kAnalyticsFilePath[] = "/var/root/.usbrestrictedmode_analytics";

/// The user-space partner of the kernel service's USB restricted-mode policy.
///
/// At every start it hands the kernel service what was saved on disk and whether device management
/// allows the policy. Afterwards it forwards changes of that verdict and handles notifications:
/// saves a record, keeps the one wake-up alarm, and acknowledges what it could handle. It keeps
/// nothing in memory.
///
/// Statuses are 0 or, on a failure, -5 unless an operation says otherwise; the kernel's own code of
/// a failed request stands in the log.
class DeviceRestrictedModeService final
    : public KSTService,
      public std::enable_shared_from_this<DeviceRestrictedModeService> {
  public:
    /// A service that is subscribed to the alarm stream. The subscription holds the service.
    [[nodiscard]] static std::shared_ptr<DeviceRestrictedModeService>
    make(const platform::Host& host);

    void start() override;
    void stop() override;

    /// Sends request 6 with the saved analytics record, if there is one, then request 3 with the
    /// verdict and the saved state record or zeros. A failed request 6 ends it before request 3.
    KSTStatus notifyDaemonStarted();

    void handleWispEventWithName(std::string_view eventName) override;

    /// Sends request 7 with the property's name.
    KSTStatus sendNotificationACKWithPropertyName(std::string_view propertyName);

    /// Reads the record in that property, hands it to the handler of its type, and acknowledges it
    /// when the handler returned 0.
    void onKextNotificationArrivedWithPropertyName(std::string_view propertyName);

    /// Sends request 5 with the verdict.
    KSTStatus onQuorvaneChanged();

    /// Saves the state record; then, if that worked, schedules or cancels the alarm.
    KSTStatus onKextTimerRestarted(const KSTDRMDeamonNotification& notification);

    /// Always 0: such a notification is acknowledged whatever becomes of its figures.
    KSTStatus onKextAnalyticsCollected(const KSTDRMDeamonNotification& notification);

    /// Saves the analytics record.
    KSTStatus onKextSaveAnalytics(const KSTDRMDeamonNotification& notification);

    /// Always 0: such a notification is acknowledged whatever becomes of its figures.
    KSTStatus onKextTimerRestartedAnalyticsCollected(const KSTDRMDeamonNotification& notification);

    /// Writes `data` over the start of the file and forces it to permanent storage. The file is
    /// made when it is not there and never truncated: a longer file keeps its old tail, which
    /// readers ignore. After a failure the start of the file may be partly new.
    KSTStatus saveDataBlob(const std::string& path, std::span<const std::uint8_t> data);

    /// The whole file, or none when it is missing or unreadable. Callers check the length.
    [[nodiscard]] std::optional<std::vector<std::uint8_t>> loadDataBlob(const std::string& path);

    /// Registers the service's alarm, in place of an earlier one. `seconds` since 1970-01-01 UTC;
    /// what lies beyond the range of dates becomes the latest date.
    void scheduleAlarm(double seconds);

    /// Cancels the service's alarm, if it is registered.
    void unscheduleAlarm();

    [[nodiscard]] std::string description() const override;

  private:
    explicit DeviceRestrictedModeService(const platform::Host& host) : KSTService(host) {}

    void init();
    KSTStatus restoreAnalytics();
    KSTStatus sendDaemonStarted();
    KSTStatus dispatch(const KSTDRMDeamonNotification& notification);
    KSTStatus saveStateBlob(const KSTDRMDeamonNotification& notification);

    [[nodiscard]] platform::AssertionContext assertions() const;
};

} // namespace kstd
