#include "platform/fake/FakeHTTPSessions.h"

#include "tests/support/HTTPRequests.h"

#include <gtest/gtest.h>

namespace {

using platform::ChallengeDisposition;
using platform::FakeHTTPAnswer;
using platform::FakeHTTPSessions;
using platform::HTTPReply;
using platform::TrustResult;
using support::answeringDelegate;
using support::fetch;
using support::get;
using support::outcomeOf;
using support::post;
using support::ReplyKeeper;
using support::ScriptedDelegate;

constexpr char kLink[] = "https://collector.example/bag";

class FakeHTTPSessionsTest : public testing::Test {
  protected:
    FakeHTTPSessions sessions_;
};

TEST_F(FakeHTTPSessionsTest, PushedAnswersComeBeforeThoseThatWereSet) {
    sessions_.setAnswer("GET", kLink, FakeHTTPAnswer::status(200, "set"));
    sessions_.pushAnswer(FakeHTTPAnswer::status(201));
    sessions_.pushAnswer(FakeHTTPAnswer::failure(platform::kTimedOut, "timed out: really"));
    EXPECT_EQ(outcomeOf(fetch(sessions_, get(kLink))), "201");
    EXPECT_EQ(fetch(sessions_, get(kLink)).error->description, "timed out: really");
    EXPECT_EQ(fetch(sessions_, get(kLink)).body, "set");
    EXPECT_EQ(fetch(sessions_, get(kLink)).body, "set");
    EXPECT_EQ(outcomeOf(fetch(sessions_, post(kLink, "x"))), "transport 2") << "another method";
    EXPECT_EQ(outcomeOf(fetch(sessions_, get("https://collector.example/"))), "transport 2");
}

TEST_F(FakeHTTPSessionsTest, EveryRequestIsRecordedAsItWasStarted) {
    sessions_.setAnswer("POST", kLink, FakeHTTPAnswer::status(200));
    static_cast<void>(fetch(sessions_, {"GET", std::nullopt, {}}));
    {
        const std::string body = "document";
        static_cast<void>(fetch(sessions_, post(kLink, body)));
    }
    const auto requests = sessions_.requests();
    ASSERT_EQ(requests.size(), 2U);
    EXPECT_EQ(requests[0].link, std::nullopt);
    EXPECT_FALSE(requests[0].arrived);
    EXPECT_EQ(requests[1].method, "POST");
    EXPECT_EQ(requests[1].link, platform::Link{kLink});
    EXPECT_EQ(requests[1].body, "document");
    EXPECT_EQ(requests[1].maximumAnswerSize, 1024U * 1024);
    EXPECT_EQ(requests[1].headers,
              (std::map<std::string, std::string>{{"User-Agent", "kstd/1.0"}}));
    EXPECT_TRUE(requests[1].arrived);
    EXPECT_EQ(sessions_.sessionCount(), 2U);
}

TEST_F(FakeHTTPSessionsTest, ChallengesOfAnyKind) {
    const auto ask = [this](platform::FakeHTTPChallenge challenge, ChallengeDisposition answer) {
        sessions_.pushAnswer(FakeHTTPAnswer::status(200).with(std::move(challenge)));
        return outcomeOf(fetch(sessions_, get(kLink), answeringDelegate(answer)));
    };
    const auto byDefault = ChallengeDisposition::performDefaultHandling;
    EXPECT_EQ(ask({"Password", 0, {}}, byDefault), "200");
    EXPECT_EQ(ask({"Password", 0, {}}, ChallengeDisposition::cancel), "transport 4");
    const auto trusting = [](std::uint32_t result) {
        return platform::FakeHTTPChallenge{platform::kServerTrustMethod, 3,
                                           static_cast<TrustResult>(result)};
    };
    for (const std::uint32_t result : {0U, 1U, 2U, 3U, 4U, 5U, 6U, 4294967295U}) {
        SCOPED_TRACE(result);
        EXPECT_EQ(ask(trusting(result), byDefault),
                  result == 1 || result == 4 ? "200" : "transport 4");
    }
    int failures = 0;
    sessions_.pushAnswer(FakeHTTPAnswer::status(200).with(trusting(1)));
    static_cast<void>(fetch(
        sessions_, get(kLink),
        std::make_shared<ScriptedDelegate>([&](const auto& challenge, const auto& /*completion*/) {
            failures = challenge.previousFailureCount;
        })));
    EXPECT_EQ(failures, 3);
}

TEST_F(FakeHTTPSessionsTest, PlainLinksAndFailuresToConnectRaiseNoChallenge) {
    const auto delegate = answeringDelegate(ChallengeDisposition::cancel);
    sessions_.pushAnswer(FakeHTTPAnswer::status(200));
    EXPECT_EQ(outcomeOf(fetch(sessions_, get("http://collector.example/"), delegate)), "200");
    EXPECT_EQ(outcomeOf(fetch(sessions_, get(kLink), delegate)), "transport 2");
    EXPECT_EQ(delegate->challenges(), 0);
}

TEST_F(FakeHTTPSessionsTest, AnswerThatIsNotHTTP) {
    sessions_.pushAnswer(FakeHTTPAnswer::notHTTP("FileResponse"));
    const HTTPReply reply = fetch(sessions_, get(kLink));
    EXPECT_EQ(outcomeOf(reply), "no HTTP");
    EXPECT_EQ(reply.response->className, "FileResponse");
}

TEST_F(FakeHTTPSessionsTest, CompletionsThatComeTwiceAndLate) {
    FakeHTTPAnswer answer = FakeHTTPAnswer::status(200);
    answer.completesTwice = true;
    answer.completesLate = true;
    sessions_.pushAnswer(answer);
    ReplyKeeper keeper;
    sessions_.makeEphemeral({}, {})->start(get(kLink), keeper.completion());
    EXPECT_EQ(keeper.calls(), 2);
    sessions_.completeLate();
    EXPECT_EQ(keeper.calls(), 3);
    sessions_.completeLate();
    EXPECT_EQ(keeper.calls(), 3);
}

} // namespace
