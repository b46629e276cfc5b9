#pragma once

#include "kstd/Analytics/KSTDAnalyticsLogger.h"

namespace kstd {

/// Where the logger of the restricted-mode service keeps its events.
inline constexpr char kAnalyticsDatabasePath[] = "/var/root/.usbrestrictedmode_analytics_v2.db";

/// The logger of the restricted-mode service.
class Analytics final : public KSTDAnalyticsLogger {
  public:
    [[nodiscard]] static std::shared_ptr<Analytics> logger(const platform::Host& host);

    static std::optional<std::string> databasePath();

    Analytics(Creation creation, const platform::Host& host)
        : KSTDAnalyticsLogger(creation, host) {}

    void logPolicyEventWithAttributes(const platform::ValueMap& attributes);
    void logTimerRestartedEventWithAttributes(const platform::ValueMap& attributes);
};

} // namespace kstd
