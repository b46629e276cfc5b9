#include "kstctl/status/UploadSection.h"

#include "base/Concat.h"
#include "kstctl/Output.h"
#include "kstctl/RecordingLog.h"
#include "kstctl/status/DaemonSockets.h"
#include "kstctl/status/Section.h"
#include "platform/formats/PropertyListCodec.h"
#include "platform/linux/LinuxConfiguration.h"

#include <algorithm>
#include <optional>
#include <sys/stat.h>
#include <utility>

namespace kstctl {

namespace {

Report::Datum datumOf(const std::optional<std::string>& text) {
    return text ? Report::Datum(*text) : Report::None();
}

Report::Datum datumOf(const std::optional<platform::Link>& link) {
    return link ? Report::Datum(link->text) : Report::None();
}

/// Its own look: a connection would launch a client.
void addHTTPSSocket(Section& section, const Environment& environment, bool isNeeded) {
    const std::string path = environment.paths.httpsSocket();
    struct stat status {};
    const bool isPresent = ::stat(path.c_str(), &status) == 0;
    const auto sockets = socketsBoundTo(path);
    const bool isOpen = std::any_of(sockets.begin(), sockets.end(),
                                    [](const auto& socket) { return socket.isListening; });
    Report report;
    report.add("path", path).add("isPresent", isPresent);
    if (isPresent) {
        report.add("owner", status.st_uid).add("mode", octalMode(status.st_mode));
    }
    report.add("isOpen", isOpen, isOpen ? "" : "nobody starts the HTTPS client");
    section.report.add("httpsSocket", std::move(report));
    if (isNeeded && !isOpen) {
        section.note(
            failure(ExitStatus::missing,
                    base::concat("nobody listens at ", path, "; uploads need kstd-https.socket")));
    }
}

} // namespace

UploadConfiguration UploadConfiguration::read(const platform::Paths& paths) {
    RecordingLog log;
    platform::PropertyListCodec propertyLists;
    platform::LinuxConfigurationResource resources(paths, propertyLists, log);
    platform::LinuxUserDefaults defaults(paths, propertyLists, log);
    UploadConfiguration configuration{.analytics =
                                          kstd::AnalyticsConfiguration::read(resources, defaults)};
    if (!log.lines().empty()) {
        configuration.status = ExitStatus::malformed;
    } else if (!configuration.analytics.problems.empty()) {
        configuration.status = ExitStatus::misconfigured;
    }
    configuration.analytics.report(log);
    configuration.remarks = log.lines();
    return configuration;
}

Section uploadSection(const Environment& environment) {
    const auto [analytics, remarks, status] = UploadConfiguration::read(environment.paths);
    const bool isConfigured = analytics.splunkUploadURL || analytics.splunkBagURL;
    Section section;
    section.report
        .add("isConfigured", isConfigured,
             isConfigured ? "" : "no upload address: events stay, nothing is sent")
        .add("uploadURL", datumOf(analytics.splunkUploadURL))
        .add("bagURL", datumOf(analytics.splunkBagURL))
        .add("topic", datumOf(analytics.splunkTopicName))
        .add("allowInsecureCertificate", analytics.allowInsecureSplunkCert);
    // Under another root the daemon starts the client itself.
    addHTTPSSocket(section, environment, isConfigured && environment.paths.isSystemRoot());
    addLastUpload(section, environment);
    if (!remarks.empty()) {
        section.report.add("problems", Data(remarks.begin(), remarks.end()));
        section.note(failure(status, remarks.front()));
    }
    return section;
}

} // namespace kstctl
