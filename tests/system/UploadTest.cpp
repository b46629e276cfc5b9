// Uploads of the real daemon to a real server that is in order, and what the server tells it.

#include "base/Concat.h"
#include "tests/support/EnvironmentVariable.h"
#include "tests/system/UploadFixture.h"

#include <algorithm>
#include <chrono>
#include <fstream>
#include <list>
#include <regex>

namespace system_tests {
namespace {

using base::concat;

constexpr char kInsteadOfLink[] = "failed to get a splunk upload endpoint - using bag URL instead";
constexpr char kMalformed[] = "Malformed Ombrix config payload!";
constexpr std::size_t kLargestBag = 1024UL * 1024;

std::int64_t now() {
    return std::chrono::duration_cast<std::chrono::seconds>(
               std::chrono::system_clock::now().time_since_epoch())
        .count();
}

/// A document with a T for each of its times.
std::string withoutTimes(const std::string& document) {
    return std::regex_replace(document, std::regex(R"(Time":[0-9]{13}\.[0-9]+)"), "Time\":T");
}

std::size_t count(const std::string& text, const std::string& part) {
    std::size_t found = 0;
    for (auto at = text.find(part); at != std::string::npos; at = text.find(part, at + 1)) {
        ++found;
    }
    return found;
}

class UploadTest : public UploadFixture {
  protected:
    void serveBag(const std::string& bag) {
        const std::string file = root.path() / "bag.json";
        std::ofstream(file, std::ios::binary) << bag;
        control("bag " + file);
    }

    /// The next event is uploaded to where the bag says.
    void expectUploadByBag() {
        const Lines lines = publishWhenDue();
        EXPECT_EQ(lines,
                  joined({"Splunk upload challenge", "got metrics endpoint: " + uploadLink()},
                         acceptedLines()));
    }

    /// The next upload is due that long after an upload that began at `begin`.
    void expectIntervalSince(std::int64_t begin, std::int64_t interval) const {
        EXPECT_GE(uploadDate(), begin + interval);
        EXPECT_LE(uploadDate(), now() + interval);
    }

    /// Every header of the request with that number, in any order behind the first line.
    [[nodiscard]] Lines requestHead(std::size_t number) const {
        Lines lines;
        std::string rest = collector.head(number);
        for (auto end = rest.find("\r\n"); end != std::string::npos; end = rest.find("\r\n")) {
            lines.push_back(rest.substr(0, end));
            rest.erase(0, end + 2);
        }
        std::sort(lines.begin() + 1, lines.end());
        return lines;
    }

    [[nodiscard]] Lines expectedHead(const std::string& firstLine, std::size_t bodySize) const {
        Lines lines = {firstLine, "", concat("Host: 127.0.0.1:", collector.port()),
                       "User-Agent: kstd/1.0"};
        if (bodySize > 0) {
            lines.insert(lines.begin() + 2, concat("Content-Length: ", bodySize));
        }
        return lines;
    }
};

TEST_F(UploadTest, EveryStatus) {
    // With a link of its own the daemon never asks for the bag.
    launchFor({.uploadURL = uploadLink(), .bagURL = bagLink()});
    serveBag(R"({"disabled":true})");
    control("header Set-Cookie: identity=1; Path=/; Max-Age=1000");
    control("header Location: " + collector.link("/elsewhere"));
    int kept = 1;
    std::size_t requests = 0;
    for (const int status : {199, 300, 301, 302, 307, 400, 401, 413, 429, 500, 503}) {
        SCOPED_TRACE(status);
        control(concat("status ", status));
        EXPECT_EQ(publishWhenDue(), (Lines{"Splunk upload start", "Splunk upload challenge",
                                           concat("Splunk upload unexpected status to URL: ",
                                                  uploadLink(), " -- status: ", status)}));
        EXPECT_EQ(storedEvents(), ++kept);
        EXPECT_EQ(uploadDate(), 978307200);
        EXPECT_EQ(collector.requestCount(), ++requests);
    }
    for (const int status : {200, 204, 299}) {
        SCOPED_TRACE(status);
        control(concat("status ", status));
        const std::int64_t before = now();
        expectNextUploadIsAccepted();
        expectIntervalSince(before, 259200);
        const std::string document = collector.body(++requests);
        EXPECT_EQ(count(document, R"("eventType":"timerRestarted")"),
                  static_cast<std::size_t>(kept) + 1);
        kept = 0;
    }
    EXPECT_EQ(collector.requestCount(), requests);
    for (std::size_t i = 1; i <= requests; ++i) {
        EXPECT_EQ(requestHead(i), expectedHead("POST /2/kst HTTP/1.1", collector.body(i).size()));
    }
}

/// A bag that gives no link, and what is said about it.
struct UselessBag {
    std::string text;
    Lines lines;
};

TEST_F(UploadTest, BagsThatGiveNoLink) {
    launchFor({.bagURL = bagLink()});
    control("status 503");
    const std::string tooLong = concat("Unable to fetch splunk endpoint at URL: ", bagLink(),
                                       " -- error: answer longer than ", kLargestBag, " bytes");
    const UselessBag kBags[] = {
        {"", {kMalformed}},
        {"[]", {kMalformed}},
        {"7", {kMalformed}},
        {R"({"metricsUrl":"https://collector.example")", {kMalformed}},
        {"{}", {kMalformed}},
        {R"({"metricsUrl":7})", {kMalformed}},
        {R"({"metricsUrl":"http://collector.example"})",
         {"got metrics endpoint: http://collector.example/2/kst", kMalformed}},
        {R"({"metricsUrl":"HTTPS://collector.example"})",
         {"got metrics endpoint: HTTPS://collector.example/2/kst", kMalformed}},
        {R"({"sendDisabled":true,"metricsUrl":"https://collector.example"})",
         {"not returning a splunk URL because uploads are disabled"}},
        {std::string(kLargestBag, 'x'), {kMalformed}},
        {std::string(kLargestBag + 1, ' '), {tooLong}},
    };
    int kept = 1;
    const auto expectNoLink = [&](const Lines& about) {
        Lines expected = {"Splunk upload challenge"};
        expected.insert(expected.end(), about.begin(), about.end());
        expected.insert(
            expected.end(),
            {kInsteadOfLink, "Splunk upload start", "Splunk upload challenge",
             concat("Splunk upload unexpected status to URL: ", bagLink(), " -- status: 503")});
        EXPECT_EQ(withoutReasons(publishWhenDue()), expected);
        EXPECT_EQ(storedEvents(), ++kept);
    };
    for (const auto& [text, about] : kBags) {
        SCOPED_TRACE(text.substr(0, 80));
        serveBag(text);
        expectNoLink(about);
    }
    control("fault endless-body GET");
    expectNoLink({tooLong});
    control("fault hang-up GET");
    expectNoLink({concat("Unable to fetch splunk endpoint at URL: ", bagLink(),
                         " -- error: transfer failed")});
    // The address of the bag counts like any other that takes the document.
    control("reset");
    serveBag(R"({"sendDisabled":true})");
    EXPECT_EQ(publishWhenDue().back(), "uploaded oracle statistics");
    EXPECT_EQ(storedEvents(), 0);
    const std::string document = collector.body(collector.requestCount());
    EXPECT_EQ(requestHead(collector.requestCount()),
              expectedHead("POST /bag HTTP/1.1", document.size()));
    EXPECT_EQ(count(document, "timerRestarted"), static_cast<std::size_t>(kept) + 1);
}

TEST_F(UploadTest, SettingsOfTheBagHoldFromTheNextEventOn) {
    launchFor({.bagURL = bagLink()});
    // As large as a bag may be, with a status that nobody looks at.
    std::string bag =
        concat(R"({"metricsUrl":")", collector.link(""), R"(","postFrequency":7200999,)",
               R"("blacklistedEvents":["policy"],"blacklistedFields":["eventVersion"],)",
               R"("metricsBase":{"site":"lab"},"padding":")");
    bag.resize(kLargestBag - 2, 'x');
    serveBag(bag + "\"}");
    control("bag-status 404");

    const std::int64_t before = now();
    expectUploadByBag();
    expectIntervalSince(before, 7200);
    EXPECT_EQ(requestHead(1), expectedHead("GET /bag HTTP/1.1", 0));
    EXPECT_EQ(requestHead(2), expectedHead("POST /2/kst HTTP/1.1", collector.body(2).size()));

    EXPECT_EQ(publishPolicyEvent(), Lines());
    EXPECT_EQ(storedEvents(), 0);
    expectUploadByBag();
    EXPECT_EQ(
        withoutTimes(collector.body(4)),
        R"({"events":[{"eventTime":T,"eventType":"timerRestarted","site":"lab","topic":"kst",)"
        R"("totalRestrictedModeDurationMin":1},{"eventTime":T,)"
        R"("eventType":"accumulatedPolicyStats","topic":"kst"}],"postTime":T})");

    // What is of another type is as absent: the lists and the fields are gone, the interval stays.
    serveBag(concat(R"({"disabled":1,"sendDisabled":"true","postFrequency":"9000000",)",
                    R"("blacklistedEvents":"policy","blacklistedFields":["eventVersion",1],)",
                    R"("metricsBase":["site"],"metricsUrl":")", collector.link(""), R"("})"));
    const std::int64_t beforeThird = now();
    expectUploadByBag();
    expectIntervalSince(beforeThird, 7200);
    EXPECT_EQ(publishPolicyEvent(), Lines());
    expectUploadByBag();
    EXPECT_EQ(withoutTimes(collector.body(8)),
              R"({"events":[{"eventPeriodDuration":86400,"eventTime":T,"eventType":"policy",)"
              R"("eventVersion":3,"policyDisabledByBootArg":0,"policyDisabledByPasscodeNotSet":0,)"
              R"("policyDisabledByQuorvane":0,"policyEnabled":1,"restrictedMode":1,)"
              R"("restrictedModeDuration":3600,"topic":"kst"},{"eventTime":T,)"
              R"("eventType":"timerRestarted","eventVersion":4,"topic":"kst",)"
              R"("totalRestrictedModeDurationMin":1},{"eventTime":T,)"
              R"("eventType":"accumulatedPolicyStats","topic":"kst"}],"postTime":T})");
}

TEST_F(UploadTest, BagThatDisablesEverything) {
    launchFor({.bagURL = bagLink()});
    serveBag(R"({"disabled":true})");
    const Lines lines = publishWhenDue();
    EXPECT_EQ(lines,
              joined({"Splunk upload challenge",
                      "not returning a splunk URL because uploads are disabled", kInsteadOfLink},
                     acceptedLines()));
    EXPECT_EQ(storedEvents(), 0);
    EXPECT_EQ(publishWhenDue(), Lines());
    EXPECT_EQ(storedEvents(), 0);
    EXPECT_EQ(collector.requestCount(), 2U);
}

TEST_F(UploadTest, WhatTheEnvironmentSaysIsNotObeyed) {
    std::list<support::EnvironmentVariable> variables;
    for (const char* const name :
         {"http_proxy", "https_proxy", "HTTPS_PROXY", "all_proxy", "ALL_PROXY"}) {
        variables.emplace_back(name, "http://127.0.0.1:1");
    }
    for (const char* const name : {"SSL_CERT_FILE", "SSL_CERT_DIR", "CURL_CA_BUNDLE"}) {
        variables.emplace_back(name, "/nonsense");
    }
    launchFor({.uploadURL = uploadLink()});
    expectNextUploadIsAccepted();

    // Nor does it add an authority.
    variables.clear();
    for (const char* const name : {"SSL_CERT_FILE", "CURL_CA_BUNDLE"}) {
        variables.emplace_back(name, collector.authority());
    }
    launch({"--trust-anchors", collector.certificate("unknown-issuer.pem")});
    EXPECT_EQ(publishWhenDue(),
              (Lines{"Splunk upload start", "Splunk upload challenge",
                     "Error in uploading the events to splunk: server not trusted: unable to get "
                     "local issuer certificate"}));
    EXPECT_EQ(storedEvents(), 1);
}

} // namespace
} // namespace system_tests
