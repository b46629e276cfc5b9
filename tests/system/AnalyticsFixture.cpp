#include "tests/system/AnalyticsFixture.h"

#include "base/Concat.h"

#include <filesystem>
#include <fstream>
#include <regex>

namespace system_tests {

namespace {

/// Lines of the service, the run loop and the library. Those of the analytics have no name before
/// them.
bool isOfAnotherPart(const std::string& line) {
    return line.starts_with("kstd: ") || line.starts_with("KSTLib: ") || line.starts_with("KST: ");
}

std::string setting(const std::string& key, const std::string& value) {
    return value.empty() ? std::string()
                         : base::concat("<key>", key, "</key><string>", value, "</string>");
}

} // namespace

void AnalyticsFixture::launch(const std::vector<std::string>& options) {
    // The event socket is the next one's from here on.
    daemon.reset();
    daemon = startDaemon(options);
    taken_ = 0;
}

void AnalyticsFixture::configure(const UploadSettings& settings) {
    const std::string path = real("/etc/kstd/com.zerva.keystrand.analytics.plist");
    std::ofstream(path) << R"(<?xml version="1.0" encoding="UTF-8"?><plist version="1.0"><dict>)"
                        << setting("splunk_topic", "kst")
                        << setting("splunk_uploadURL", settings.uploadURL)
                        << setting("splunk_bagURL", settings.bagURL)
                        << "<key>splunk_allowInsecureCertificate</key>"
                        << (settings.allowInsecureCertificate ? "<true/>" : "<false/>")
                        << "</dict></plist>\n";
    std::filesystem::permissions(path, std::filesystem::perms::owner_read |
                                           std::filesystem::perms::owner_write);
}

Lines AnalyticsFixture::publishEvent() {
    return publish("timer-restarted-analytics total=60", "KSTRMTimerRestartedAnalyticsCollected");
}

Lines AnalyticsFixture::publishPolicyEvent() {
    return publish("analytics-collected period=86400 restricted=3600 mode=1",
                   "KSTRMAnalyticsCollected");
}

Lines AnalyticsFixture::publish(const std::string& record, const std::string& property) {
    kernel("publish " + record);
    kernel("wait acks=" + std::to_string(++acknowledgements_));
    const std::string acknowledgement = "SENDING ACK " + property;
    EXPECT_TRUE(daemon->awaitLine(acknowledgement));
    Lines lines;
    const Lines& all = daemon->lines();
    for (; taken_ < all.size() && all[taken_].find(acknowledgement) == std::string::npos;
         ++taken_) {
        if (!isOfAnotherPart(all[taken_])) {
            lines.push_back(all[taken_]);
        }
    }
    ++taken_;
    return lines;
}

void AnalyticsFixture::makeUploadDue() {
    EXPECT_EQ(OtherConnection(database())
                  .run("update Properties set value = "
                       "'2001-01-01T00:00:00Z' where key = 'upload_date'"),
              SQLITE_OK);
    EXPECT_EQ(uploadDate(), 978307200);
}

std::int64_t AnalyticsFixture::uploadDate() const {
    return std::stoll(OtherConnection(database())
                          .one("select strftime('%s', value) from Properties where key = "
                               "'upload_date'"));
}

int AnalyticsFixture::storedEvents() const {
    return std::stoi(OtherConnection(database()).one("select count(*) from all_events"));
}

Lines AnalyticsFixture::withoutReasons(Lines lines) {
    static const std::regex kReason("(cannot connect|transfer failed|timed out): .*");
    for (std::string& line : lines) {
        line = std::regex_replace(line, kReason, "$1");
    }
    return lines;
}

} // namespace system_tests
