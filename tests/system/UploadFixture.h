#pragma once

#include "tests/support/Collector.h"
#include "tests/system/AnalyticsFixture.h"

#include <string>

namespace system_tests {

/// The daemon and a collector that it may upload to.
class UploadFixture : public AnalyticsFixture {
  protected:
    void SetUp() override { startKernel(); }

    void control(const std::string& line) { static_cast<void>(collector.control(line)); }

    /// Starts a daemon, which trusts the collector's authority, and gives it its first event: the
    /// database is there, and nothing is due.
    void launchFor(const UploadSettings& settings, const std::vector<std::string>& options = {}) {
        configure(settings);
        launch(joined({"--trust-anchors", collector.authority()}, options));
        EXPECT_EQ(publishEvent(), Lines());
    }

    /// Gives the daemon an event that finds the upload due, which a former one may have left so.
    Lines publishWhenDue() {
        makeUploadDue();
        return publishEvent();
    }

    /// The lines of an upload that was accepted as it came to the collector last.
    [[nodiscard]] Lines acceptedLines() {
        return {"Splunk upload start", "Splunk upload challenge", "Splunk upload success",
                "uploading oracle statistics: " + collector.body(collector.requestCount()),
                "uploaded oracle statistics"};
    }

    [[nodiscard]] static Lines joined(Lines lines, const Lines& more) {
        lines.insert(lines.end(), more.begin(), more.end());
        return lines;
    }

    /// The next event is uploaded with all that were kept, and none is left.
    void expectNextUploadIsAccepted() {
        const Lines lines = publishWhenDue();
        EXPECT_EQ(lines, acceptedLines());
        EXPECT_EQ(storedEvents(), 0);
    }

    [[nodiscard]] std::string uploadLink() const { return collector.link("/2/kst"); }
    [[nodiscard]] std::string bagLink() const { return collector.link("/bag"); }

    support::Collector collector;
};

} // namespace system_tests
