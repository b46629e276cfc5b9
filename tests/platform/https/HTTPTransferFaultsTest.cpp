// Servers that do not behave.

#include "tests/platform/https/HTTPTransferFixture.h"
#include "tests/platform/https/ServerFaults.h"

namespace {

using platform::HTTPReply;
using support::get;
using support::outcomeOf;
using support::post;
using namespace std::chrono_literals;

class HTTPTransferFaultsTest : public support::HTTPTransferFixture {
  protected:
    [[nodiscard]] HTTPReply fetchWithin(const platform::HTTPLimits& limits,
                                        const platform::HTTPRequest& request) const {
        return support::transfer(request, {.options = options(limits)});
    }
};

TEST_F(HTTPTransferFaultsTest, ExchangesEndAsTheyShouldAndTheNextOneWorks) {
    const std::string document(5'000'000, 'd');
    // A body that is sent byte by byte takes a quarter of an hour.
    control("body-size 1000");
    for (const auto& [fault, ofAPost, ofAGet, isSlow] : support::kServerFaults) {
        SCOPED_TRACE(fault);
        control(base::concat("fault ", fault));
        const HTTPReply reply = postIt(document);
        EXPECT_EQ(outcomeOf(reply), ofAPost);
        EXPECT_NE(reply.error.has_value(), reply.response.has_value());
        EXPECT_TRUE(!reply.error || reply.error->description.size() > 16);
        EXPECT_EQ(reply.body, "");
        EXPECT_EQ(outcomeOf(isSlow ? fetchWithin({.fetching = 200ms}, get(link())) : getIt()),
                  ofAGet);
        control("fault none");
        EXPECT_EQ(outcomeOf(getIt()), "200");
    }
}

TEST_F(HTTPTransferFaultsTest, WhatBefallsTheBodyOfAnAnswerLeavesItsStatus) {
    const std::string document(5'000'000, 'd');
    control("body-size 1000");
    for (const char* fault : {"reset-in-response", "hang-up-in-response", "byte-a-second-body"}) {
        SCOPED_TRACE(fault);
        control(base::concat("fault ", fault));
        for (const int status : {200, 299, 500}) {
            control(base::concat("status ", status));
            const HTTPReply reply = postIt(document);
            EXPECT_EQ(outcomeOf(reply), std::to_string(status));
            EXPECT_EQ(reply.body, "");
        }
    }
    EXPECT_EQ(collector_.body(1).size(), document.size());
}

TEST_F(HTTPTransferFaultsTest, AnswerBeforeTheDocumentIsWhole) {
    const std::string document(20'000'000, 'd');
    control("fault early-answer");
    control("status 413");
    EXPECT_EQ(outcomeOf(postIt(document)), "413");
    control("status 200");
    EXPECT_EQ(outcomeOf(postIt(document)), "200") << "it says so, and says all of it";
    control("framing close");
    EXPECT_EQ(outcomeOf(fetchWithin({.sending = 20ms}, post(link(), document))), "transport 3");
}

TEST_F(HTTPTransferFaultsTest, ServersThatAreTooSlowAreGivenUp) {
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
    for (const auto& [fault, request, description] : kCases) {
        SCOPED_TRACE(fault);
        control(base::concat("fault ", fault));
        EXPECT_EQ(
            fetchWithin(kOne, request).error,
            (platform::Error{platform::kTransportErrorDomain, platform::kTimedOut, description}));
    }
}

TEST_F(HTTPTransferFaultsTest, DocumentThatIsNotTakenInTimeIsGivenUp) {
    control("fault reads-nothing");
    // More than the system keeps for a server; twice the limit for two full steps, and once more.
    const std::string document(2 * platform::HTTPLimits::kSendingStep, 'd');
    EXPECT_EQ(fetchWithin({.sending = 20ms, .answering = 1ms}, post(link(), document)).error,
              (platform::Error{platform::kTransportErrorDomain, platform::kTimedOut,
                               "timed out: not sent within 60 ms"}));
}

TEST_F(HTTPTransferFaultsTest, SlowAnswerIsWaitedForAndNoHandshakeIsNot) {
    control("fault byte-a-second");
    control("pace 0.001");
    control("body hallo");
    EXPECT_EQ(getIt().body, "hallo");

    control("fault no-handshake");
    EXPECT_EQ(outcomeOf(fetchWithin({.connecting = 50ms}, get(link()))), "transport 3");
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
