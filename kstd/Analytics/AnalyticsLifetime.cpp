#include "kstd/Analytics/AnalyticsLifetime.h"

#include "kstd/Analytics/LoggerInstances.h"
#include "kstd/Analytics/OSVersion.h"
#include "kstd/Analytics/TQAnalyticsLoggerSQLiteStore.h"

namespace kstd {

AnalyticsLifetime::~AnalyticsLifetime() {
    LoggerInstances::release();
    TQAnalyticsLoggerSQLiteStore::releaseStores();
    OSVersion::release();
}

} // namespace kstd
