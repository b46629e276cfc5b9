#pragma once

#include "platform/Link.h"

#include <optional>
#include <string>
#include <vector>

namespace platform {
class ConfigurationResource;
class SystemLog;
class UserDefaults;
} // namespace platform

namespace kstd {

/// Where events go: as the system was delivered, with what the administrator has set over it.
struct AnalyticsConfiguration {
    std::optional<std::string> splunkTopicName;
    std::optional<platform::Link> splunkUploadURL;
    std::optional<platform::Link> splunkBagURL;
    bool allowInsecureSplunkCert = false;
    /// What is wrong with the settings, each in words that name neither an address nor a value:
    ///
    ///     splunk_uploadURL in the user defaults: no scheme; ignored
    std::vector<std::string> problems = {};

    /// A setting that is missing, of another kind, or a link that is none or names a user, counts
    /// as not made. A link to which nothing can be sent for another reason, or nothing safely, is
    /// used. All but what is missing is a problem, and so is what is no setting.
    [[nodiscard]] static AnalyticsConfiguration read(platform::ConfigurationResource& resources,
                                                     platform::UserDefaults& defaults);

    /// Writes a warning for each problem.
    void report(platform::SystemLog& log) const;
};

} // namespace kstd
