#include "kstd/Analytics/AnalyticsConfiguration.h"

#include "base/Concat.h"
#include "platform/ConfigurationResource.h"
#include "platform/MessageClasses.h"
#include "platform/SystemLog.h"
#include "platform/UserDefaults.h"
#include "platform/Value.h"

#include <algorithm>
#include <iterator>
#include <string_view>
#include <utility>

namespace kstd {

namespace {

using platform::Link;

constexpr char kComponent[] = "Keystrand";
constexpr char kResource[] = "KSTDAnalyticsLogging";
constexpr char kDomain[] = "com.zerva.keystrand.analytics";

constexpr char kTopic[] = "splunk_topic";
constexpr char kUploadURL[] = "splunk_uploadURL";
constexpr char kBagURL[] = "splunk_bagURL";
constexpr char kAllowInsecureCertificate[] = "splunk_allowInsecureCertificate";
constexpr const char* kSettings[] = {kTopic, kUploadURL, kBagURL, kAllowInsecureCertificate};

std::string inLowerCase(std::string_view text) {
    std::string lower(text);
    std::transform(lower.begin(), lower.end(), lower.begin(), [](char c) {
        return c >= 'A' && c <= 'Z' ? static_cast<char>(c - 'A' + 'a') : c;
    });
    return lower;
}

/// Why the text is no link that counts.
const char* faultOf(std::string_view text) {
    if (platform::namesUser(text)) {
        return "a user or a password in it";
    }
    const std::size_t colon = text.find(':');
    return colon == std::string_view::npos || !platform::link_text::isScheme(text.substr(0, colon))
               ? "no scheme"
               : "blanks or other characters that no link holds";
}

/// Why nothing can be sent to the link, or nothing safely; null when all is well.
const char* doubtAbout(const Link& link) {
    const std::string scheme = inLowerCase(link.scheme());
    if (scheme != "http" && scheme != "https") {
        return "neither https nor http: nothing can be sent there";
    }
    const std::string_view authority = link.authority();
    if (authority.empty() || authority.front() == ':') {
        return "no host: nothing can be sent there";
    }
    return scheme == "http" ? "plain http, which anybody on the way can read and change" : nullptr;
}

/// Reads the settings of one place, and takes down what is wrong with them.
class Reader {
  public:
    Reader(const platform::ValueMap& settings, const char* place,
           std::vector<std::string>& problems)
        : settings_(settings), place_(place), problems_(problems) {}

    void noteStrangers() {
        for (const auto& [key, value] : settings_) {
            if (std::find(std::begin(kSettings), std::end(kSettings), key) == std::end(kSettings)) {
                note(key, "no setting of this name", "ignored");
            }
        }
    }

    template <typename Kind>
    std::optional<Kind> value(const char* key, const char* fault) {
        const auto found = settings_.find(key);
        if (found == settings_.end()) {
            return std::nullopt;
        }
        const auto* const content = found->second.as<Kind>();
        if (content == nullptr) {
            note(key, fault, "ignored");
            return std::nullopt;
        }
        return *content;
    }

    std::optional<std::string> text(const char* key) {
        return value<std::string>(key, "not a text");
    }

    std::optional<Link> link(const char* key) {
        const auto written = text(key);
        if (!written) {
            return std::nullopt;
        }
        auto link = platform::linkFromText(*written);
        if (!link || platform::namesUser(*written)) {
            note(key, faultOf(*written), "ignored");
            return std::nullopt;
        }
        if (const char* const doubt = doubtAbout(*link)) {
            note(key, doubt, "used");
        }
        return link;
    }

    bool isTrue(const char* key) { return value<bool>(key, "not a boolean").value_or(false); }

  private:
    void note(std::string_view key, const char* what, const char* consequence) {
        problems_.push_back(base::concat(key, " in ", place_, ": ", what, "; ", consequence));
    }

    const platform::ValueMap& settings_;
    const char* place_;
    std::vector<std::string>& problems_;
};

void readFrom(Reader reader, AnalyticsConfiguration& configuration) {
    const auto replace = [](auto& delivered, auto set) {
        if (set) {
            delivered = std::move(set);
        }
    };
    reader.noteStrangers();
    replace(configuration.splunkTopicName, reader.text(kTopic));
    replace(configuration.splunkUploadURL, reader.link(kUploadURL));
    replace(configuration.splunkBagURL, reader.link(kBagURL));
    // Either place can switch it on, and neither off.
    configuration.allowInsecureSplunkCert |= reader.isTrue(kAllowInsecureCertificate);
}

} // namespace

AnalyticsConfiguration AnalyticsConfiguration::read(platform::ConfigurationResource& resources,
                                                    platform::UserDefaults& defaults) {
    AnalyticsConfiguration configuration;
    const auto resource = resources.load(kComponent, kResource).value_or(platform::ValueMap());
    readFrom({resource, "the configuration resource", configuration.problems}, configuration);
    const platform::ValueMap set = defaults.load(kDomain);
    readFrom({set, "the user defaults", configuration.problems}, configuration);
    return configuration;
}

void AnalyticsConfiguration::report(platform::SystemLog& log) const {
    for (const std::string& problem : problems) {
        log.write(platform::LogLevel::warning,
                  base::concat("kstd: AnalyticsConfiguration: ", problem, ".\n"),
                  {.messageId = platform::message::kUploadSettingInDoubt});
    }
}

} // namespace kstd
