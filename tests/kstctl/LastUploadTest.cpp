#include "kstctl/status/UploadSection.h"

#include <gtest/gtest.h>

#include <algorithm>

namespace kstctl {
namespace {

TEST(LastUploadTest, LinesThatEndAnUpload) {
    const std::pair<std::string, UploadOutcome> kLines[] = {
        {"Splunk upload start", UploadOutcome::begun},
        {"Splunk upload success", UploadOutcome::accepted},
        {"failed to get a splunk upload endpoint - not uploading", UploadOutcome::noAddress},
        {"Error in uploading the events to splunk: timed out: x", UploadOutcome::failed},
        {"Error in uploading the events to splunk: server not trusted: x", UploadOutcome::failed},
        {"Received the wrong kind of response: NSURLResponse", UploadOutcome::failed},
        {"Splunk upload unexpected status to URL: https://x -- status: 503", UploadOutcome::failed},
        {"TQAnalytics: failed to upload json to analytics server with error: x",
         UploadOutcome::failed},
    };
    for (const auto& [line, outcome] : kLines) {
        EXPECT_EQ(uploadOutcomeOf(line), outcome) << line;
    }
}

TEST(LastUploadTest, LinesThatEndNone) {
    for (const std::string line :
         {"", "Splunk upload challenge", "Splunk upload success.", "Splunk upload start ",
          "failed to get a splunk upload endpoint - using bag URL instead",
          "Unable to fetch splunk endpoint at URL: https://x -- error: server not trusted: y",
          "Malformed Ombrix config payload!", "uploaded oracle statistics",
          " Splunk upload success"}) {
        EXPECT_FALSE(uploadOutcomeOf(line)) << line;
    }
}

} // namespace
} // namespace kstctl
