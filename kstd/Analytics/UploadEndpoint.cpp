#include "base/Concat.h"
#include "kstd/Analytics/EndpointBag.h"
#include "kstd/Analytics/KSTDAnalyticsLogger.h"
#include "platform/JSON.h"
#include "platform/SystemLog.h"

namespace kstd {

using platform::Link;
using platform::LogLevel;

namespace {

constexpr std::uint64_t kMillisecondsPerSecond = 1000;

} // namespace

std::optional<Link> KSTDAnalyticsLogger::splunkUploadURL() {
    return fields.splunkUploadURL ? fields.splunkUploadURL : fetchUploadURL();
}

std::optional<Link> KSTDAnalyticsLogger::fetchUploadURL() {
    const auto reply = replyTo({.method = "GET", .link = fields.splunkBagURL});
    if (reply.error) {
        host_.log.write(LogLevel::error,
                        base::concat("Unable to fetch splunk endpoint at URL: ",
                                     fields.splunkBagURL ? fields.splunkBagURL->text : "(null)",
                                     " -- error: ", reply.error->description),
                        {});
        return std::nullopt;
    }
    const auto JSON = host_.json.read(reply.body);
    const auto bag = JSON ? EndpointBag::fromValue(JSON.value()) : std::nullopt;
    if (bag && !ignoreServerDisablingMessages() && !takeOverSwitches(*bag)) {
        host_.log.write(LogLevel::info, "not returning a splunk URL because uploads are disabled",
                        {});
        return std::nullopt;
    }
    auto link = bag ? takeOverMetrics(*bag) : std::nullopt;
    if (!link) {
        host_.log.write(LogLevel::error, "Malformed Ombrix config payload!", {});
    }
    return link;
}

/// Whether uploads are wanted. If not, all but `disableLogging` stays as it was.
bool KSTDAnalyticsLogger::takeOverSwitches(const EndpointBag& bag) {
    fields.disableLogging = bag.disabled;
    if (bag.disabled || bag.sendDisabled) {
        return false;
    }
    if (bag.postFrequency && *bag.postFrequency >= kMillisecondsPerSecond) {
        fields.secondsBetweenUploads =
            static_cast<std::int64_t>(*bag.postFrequency / kMillisecondsPerSecond);
    }
    fields.blacklistedEvents = bag.blacklistedEvents;
    fields.blacklistedFields = bag.blacklistedFields;
    return true;
}

std::optional<Link> KSTDAnalyticsLogger::takeOverMetrics(const EndpointBag& bag) {
    fields.metricsBase = bag.metricsBase;
    if (!bag.metricsUrl) {
        return std::nullopt;
    }
    if (platform::namesUser(*bag.metricsUrl)) {
        return std::nullopt;
    }
    const std::string text =
        base::concat(*bag.metricsUrl, "/2/", fields.splunkTopicName.value_or("(null)"));
    host_.log.write(LogLevel::info, base::concat("got metrics endpoint: ", text), {});
    const auto link = platform::linkFromText(text);
    // Only this spelling of the scheme is a link that was meant.
    return link && link->scheme() == "https" ? link : std::nullopt;
}

} // namespace kstd
