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
    /// Options under which a server that stands still is given up after a second.
    [[nodiscard]] LinuxHTTPOptions impatient() const {
        LinuxHTTPOptions options = this->options();
        options.slowLimit = 1s;
        return options;
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
        {"reset-in-response", "transport 6"},       {"hang-up-in-response", "transport 6"},
        {"garbage-instead-of-http", "transport 6"}, {"huge-headers", "transport 5"},
        {"huge-header-line", "transport 6"},        {"endless-headers", "transport 5"},
        {"endless-interim", "transport 5"},         {"endless-body", "transport 5"},
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

TEST_F(LinuxHTTPFaultsTest, ServersThatStandStillAreGivenUp) {
    const char* const kFaults[] = {"never-answers", "byte-a-second", "byte-a-second-body"};
    control("pace 0.1");
    control("body-size 1000");
    LinuxHTTPSessions sessions(impatient());
    support::ReplyKeeper keepers[std::size(kFaults)];
    {
        const auto session = sessions.makeEphemeral({}, {});
        for (std::size_t i = 0; i < std::size(kFaults); ++i) {
            control(base::concat("fault ", kFaults[i]));
            session->start(post(link(), "x"), keepers[i].completion());
            control(base::concat("await-requests ", i + 1));
        }
    }
    for (std::size_t i = 0; i < std::size(kFaults); ++i) {
        const HTTPReply& reply = keepers[i].reply();
        EXPECT_EQ(outcomeOf(reply), "transport 3") << kFaults[i];
        EXPECT_EQ(reply.error->description.rfind("timed out: ", 0), 0U) << reply.error->description;
    }
}

TEST_F(LinuxHTTPFaultsTest, SlowAnswerIsWaitedForAndNoHandshakeIsNot) {
    control("fault byte-a-second");
    control("pace 0.001");
    control("body hallo");
    EXPECT_EQ(getIt().body, "hallo");

    LinuxHTTPOptions options = this->options();
    options.connectLimit = 50ms;
    LinuxHTTPSessions sessions(options);
    control("fault no-handshake");
    EXPECT_EQ(outcomeOf(fetch(sessions, get(link()))), "transport 3");
}

} // namespace
