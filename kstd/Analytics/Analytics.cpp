#include "kstd/Analytics/Analytics.h"

#include "kstd/Analytics/KSTDAnalyticsLogger.h"
#include "kstd/Analytics/TQAnalyticsLoggerSQLiteStore.h"

namespace kstd {

std::shared_ptr<Analytics> Analytics::logger(const platform::Host& host) {
    return instanceOf<Analytics>(host);
}

std::optional<std::string> Analytics::databasePath() {
    return kAnalyticsDatabasePath;
}

void Analytics::logPolicyEventWithAttributes(const platform::ValueMap& attributes) {
    logEventNamed("policy", &attributes);
}

void Analytics::logTimerRestartedEventWithAttributes(const platform::ValueMap& attributes) {
    logEventNamed("timerRestarted", &attributes);
}

AnalyticsLifetime::~AnalyticsLifetime() {
    // The loggers first, since they hold their stores.
    LoggerInstances::release();
    TQAnalyticsLoggerSQLiteStore::releaseStores();
    OSVersion::release();
}

} // namespace kstd
