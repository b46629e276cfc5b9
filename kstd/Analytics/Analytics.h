#pragma once

#include "base/NotCopied.h"
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

/// The time in which analytics may use the host. A program holds one from before its first event to
/// after its last, and ends it before the host.
///
/// The loggers, their stores and the cached system version are there once in a process and refer to
/// the host; the end of the lifetime releases them. A logger that somebody still holds then goes
/// with its last holder.
class AnalyticsLifetime : private base::NotCopied {
  public:
    ~AnalyticsLifetime();
};

} // namespace kstd
