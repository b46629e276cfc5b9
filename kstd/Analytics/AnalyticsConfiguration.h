#pragma once

#include "platform/Link.h"

#include <optional>
#include <string>

namespace platform {
class ConfigurationResource;
class UserDefaults;
} // namespace platform

namespace kstd {

/// Where events go: as the system was delivered, with what the administrator has set over it.
struct AnalyticsConfiguration {
    std::optional<std::string> splunkTopicName;
    std::optional<platform::Link> splunkUploadURL;
    std::optional<platform::Link> splunkBagURL;
    bool allowInsecureSplunkCert = false;

    /// A setting that is missing, of another kind, or a link that is none, counts as not made.
    [[nodiscard]] static AnalyticsConfiguration read(platform::ConfigurationResource& resources,
                                                     platform::UserDefaults& defaults);
};

} // namespace kstd
