#include "kstd/Analytics/AnalyticsConfiguration.h"

#include "platform/ConfigurationResource.h"
#include "platform/UserDefaults.h"
#include "platform/Value.h"

#include <functional>

namespace kstd {

namespace {

constexpr char kComponent[] = "Keystrand";
constexpr char kResource[] = "KSTDAnalyticsLogging";
constexpr char kDomain[] = "com.zerva.keystrand.analytics";

constexpr char kTopic[] = "splunk_topic";
constexpr char kUploadURL[] = "splunk_uploadURL";
constexpr char kBagURL[] = "splunk_bagURL";
constexpr char kAllowInsecureCertificate[] = "splunk_allowInsecureCertificate";

/// Finds a setting in one of the places, or none.
using Source = std::function<std::optional<platform::Value>(const char* key)>;

std::optional<std::string> text(const std::optional<platform::Value>& value) {
    const auto* const text = value ? value->as<std::string>() : nullptr;
    return text != nullptr ? std::optional(*text) : std::nullopt;
}

std::optional<platform::Link> link(const std::optional<platform::Value>& value) {
    const auto written = text(value);
    return written ? platform::linkFromText(*written) : std::nullopt;
}

bool isTrue(const std::optional<platform::Value>& value) {
    const auto* const flag = value ? value->as<bool>() : nullptr;
    return flag != nullptr && *flag;
}

AnalyticsConfiguration readFrom(const Source& source) {
    return {.splunkTopicName = text(source(kTopic)),
            .splunkUploadURL = link(source(kUploadURL)),
            .splunkBagURL = link(source(kBagURL)),
            .allowInsecureSplunkCert = isTrue(source(kAllowInsecureCertificate))};
}

template <typename Setting>
void replace(std::optional<Setting>& delivered, const std::optional<Setting>& set) {
    if (set) {
        delivered = set;
    }
}

} // namespace

AnalyticsConfiguration AnalyticsConfiguration::read(platform::ConfigurationResource& resources,
                                                    platform::UserDefaults& defaults) {
    const auto resource = resources.load(kComponent, kResource).value_or(platform::ValueMap());
    AnalyticsConfiguration configuration =
        readFrom([&resource](const char* key) -> std::optional<platform::Value> {
            const auto found = resource.find(key);
            return found != resource.end() ? std::optional(found->second) : std::nullopt;
        });
    const AnalyticsConfiguration set =
        readFrom([&defaults](const char* key) { return defaults.value(kDomain, key); });
    replace(configuration.splunkTopicName, set.splunkTopicName);
    replace(configuration.splunkUploadURL, set.splunkUploadURL);
    replace(configuration.splunkBagURL, set.splunkBagURL);
    configuration.allowInsecureSplunkCert |= set.allowInsecureSplunkCert;
    return configuration;
}

} // namespace kstd
