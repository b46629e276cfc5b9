#include "kstd/Analytics/Analytics.h"

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

} // namespace kstd
