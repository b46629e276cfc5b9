#include "kstd/Analytics/Analytics.h"

namespace kstd {

namespace {

constexpr char kDatabasePath[] = "/var/root/.usbrestrictedmode_analytics_v2.db";

} // namespace

std::shared_ptr<Analytics> Analytics::logger(const platform::Host& host) {
    return instanceOf<Analytics>(host);
}

std::optional<std::string> Analytics::databasePath() {
    return kDatabasePath;
}

void Analytics::logPolicyEventWithAttributes(const platform::ValueMap& attributes) {
    logEventNamed("policy", &attributes);
}

void Analytics::logTimerRestartedEventWithAttributes(const platform::ValueMap& attributes) {
    logEventNamed("timerRestarted", &attributes);
}

} // namespace kstd
