// Servers that do not behave.

#include "tests/platform/https/LinuxHTTPFixture.h"

namespace {

using platform::HTTPReply;
using platform::LinuxHTTPOptions;
using platform::LinuxHTTPSessions;
using support::fetch;
using support::get;
using support::outcomeOf;
using support::post;
using namespace std::chrono_literals;

class LinuxHTTPFaultsTest : public support::LinuxHTTPFixture {
  protected:
    /// The collector, with other limits.
    [[nodiscard]] LinuxHTTPSessions sessionsWithin(const platform::HTTPLimits& limits) const {
        LinuxHTTPOptions options = this->options();
        options.limits = limits;
        return LinuxHTTPSessions(options);
    }
};

TEST_F(LinuxHTTPFaultsTest, BrokenExchangesAreErrorsAndTheNextOneWorks) {
    const std::string document(5'000'000, 'd');
    control("body hallo");
    const struct {
        const char* fault;
        const char* outcome;
    } kCases[] = {
        {"reset-on-connect", "transport 2"},        {"garbage-instead-of-tls", "transport 2"},
        {"reset-in-request", "transport 6"},        {"hang-up", "transport 6"},
        {"garbage-instead-of-http", "transport 6"}, {"huge-headers", "transport 5"},
        {"huge-header-line", "transport 6"},        {"endless-headers", "transport 5"},
        {"endless-interim", "transport 5"},
    };
    for (const auto& [fault, outcome] : kCases) {
        SCOPED_TRACE(fault);
        control(base::concat("fault ", fault));
        const HTTPReply reply = postIt(document);
        EXPECT_EQ(outcomeOf(reply), outcome);
        EXPECT_GT(reply.error->description.size(), 16U);
        EXPECT_FALSE(reply.response);
        EXPECT_EQ(reply.body, "");
        EXPECT_EQ(outcomeOf(getIt()), outcome);
        control("fault none");
        EXPECT_EQ(outcomeOf(getIt()), "200");
    }
}

TEST_F(LinuxHTTPFaultsTest, WhatBefallsTheBodyConcernsTheAnswerToAGetOnly) {
    const std::string document(5'000'000, 'd');
    // A body that is sent byte by byte takes a quarter of an hour.
    control("body-size 1000");
    const struct {
        const char* fault;
        const char* ofAGet;
    } kCases[] = {
        {"reset-in-response", "transport 6"},
        {"hang-up-in-response", "transport 6"},
        {"endless-body", "transport 5"},
        {"byte-a-second-body", "transport 3"},
    };
    LinuxHTTPSessions sessions = sessionsWithin({.fetching = 200ms});
    for (const auto& [fault, ofAGet] : kCases) {
        SCOPED_TRACE(fault);
        control(base::concat("fault ", fault));
        for (const int status : {200, 299, 500}) {
            control(base::concat("status ", status));
            const HTTPReply reply = postIt(document);
            // The collector's endless body comes with a status of its own.
            const bool isSet = fault != std::string("endless-body");
            EXPECT_EQ(outcomeOf(reply), isSet ? std::to_string(status) : "200");
            EXPECT_EQ(reply.body, "");
        }
        EXPECT_EQ(outcomeOf(fault == std::string("byte-a-second-body")
                                ? fetch(sessions, get(link()))
                                : getIt()),
                  ofAGet);
    }
    EXPECT_EQ(collector_.body(1).size(), document.size());
}

TEST_F(LinuxHTTPFaultsTest, AnswerBeforeTheDocumentIsWhole) {
    const std::string document(20'000'000, 'd');
    control("fault early-answer");
    control("status 413");
    EXPECT_EQ(outcomeOf(postIt(document)), "413");
    control("status 200");
    EXPECT_EQ(outcomeOf(postIt(document)), "200") << "it says so, and says all of it";
    control("framing close");
    LinuxHTTPSessions sessions = sessionsWithin({.sending = 20ms});
    EXPECT_EQ(outcomeOf(fetch(sessions, post(link(), document))), "transport 3");
}

TEST_F(LinuxHTTPFaultsTest, ServersThatAreTooSlowAreGivenUp) {
    const platform::HTTPLimits kOne{.fetching = 100ms, .answering = 100ms};
    const struct {
        const char* fault;
        platform::HTTPRequest request;
        const char* description;
    } kCases[] = {
        {"never-answers", post(link(), "x"), "timed out: no answer within 100 ms"},
        {"never-answers", post(link(), ""), "timed out: no answer within 100 ms"},
        {"byte-a-second", post(link(), "x"), "timed out: no answer within 100 ms"},
        {"never-answers", get(link()), "timed out: not fetched within 100 ms"},
        {"byte-a-second", get(link()), "timed out: not fetched within 100 ms"},
        {"byte-a-second-body", get(link()), "timed out: not fetched within 100 ms"},
    };
    control("body-size 1000");
    LinuxHTTPSessions sessions = sessionsWithin(kOne);
    for (const auto& [fault, request, description] : kCases) {
        SCOPED_TRACE(fault);
        control(base::concat("fault ", fault));
        EXPECT_EQ(
            fetch(sessions, request).error,
            (platform::Error{platform::kTransportErrorDomain, platform::kTimedOut, description}));
    }
}

TEST_F(LinuxHTTPFaultsTest, DocumentThatIsNotTakenInTimeIsGivenUp) {
    control("fault reads-nothing");
    LinuxHTTPSessions sessions = sessionsWithin({.sending = 20ms, .answering = 1ms});
    // More than the system keeps for a server; twice the limit for two full steps, and once more.
    const std::string document(2 * platform::HTTPLimits::kSendingStep, 'd');
    EXPECT_EQ(fetch(sessions, post(link(), document)).error,
              (platform::Error{platform::kTransportErrorDomain, platform::kTimedOut,
                               "timed out: not sent within 60 ms"}));
}

TEST_F(LinuxHTTPFaultsTest, SlowAnswerIsWaitedForAndNoHandshakeIsNot) {
    control("fault byte-a-second");
    control("pace 0.001");
    control("body hallo");
    EXPECT_EQ(getIt().body, "hallo");

    LinuxHTTPSessions sessions = sessionsWithin({.connecting = 50ms});
    control("fault no-handshake");
    EXPECT_EQ(outcomeOf(fetch(sessions, get(link()))), "transport 3");
}

TEST(HTTPLimitsTest, TimeGrowsWithEachFullStepOfADocument) {
    const platform::HTTPLimits limits;
    constexpr std::uint64_t kStep = 4UL * 1024 * 1024;
    EXPECT_EQ(limits.toSend(0), 60s);
    EXPECT_EQ(limits.toSend(kStep - 1), 60s);
    EXPECT_EQ(limits.toSend(kStep), 120s);
    EXPECT_EQ(limits.toSend(kStep + 1), 120s);
    EXPECT_EQ(limits.toSend(2 * kStep - 1), 120s);
    EXPECT_EQ(limits.toSend(2 * kStep), 180s);
    EXPECT_EQ(limits.whole("GET", 0), 60s);
    EXPECT_EQ(limits.whole("POST", kStep - 1), 150s);
    EXPECT_EQ(limits.whole("POST", kStep), 210s);
}

} // namespace
