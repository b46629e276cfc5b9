#include "tests/platform/contract/HTTPSessionContract.h"

#include "tests/support/HTTPRequests.h"

#include <gtest/gtest.h>

#include <atomic>
#include <thread>

namespace contract {

namespace {

using platform::AuthenticationChallenge;
using platform::ChallengeCompletion;
using platform::ChallengeDisposition;
using platform::HTTPReply;
using platform::HTTPRequest;
using platform::Link;
using platform::ServerTrust;
using platform::ServerTrustCredential;
using platform::TrustResult;
using support::acceptingDelegate;
using support::answeringDelegate;
using support::fetch;
using support::get;
using support::outcomeOf;
using support::post;
using support::ReplyKeeper;
using support::ScriptedDelegate;

using Outcomes = std::vector<std::string>;

constexpr char kRefused[] = "transport 4";

class OtherTrust final : public ServerTrust {
  public:
    [[nodiscard]] TrustResult evaluate() override { return TrustResult::proceed; }
};

} // namespace

std::string
HTTPSessionContract::outcome(const std::shared_ptr<platform::HTTPSessionDelegate>& delegate) {
    return outcomeOf(fetch(fixture().sessions(), get(fixture().link()), delegate));
}

Outcomes
HTTPSessionContract::outcomes(const std::shared_ptr<platform::HTTPSessionDelegate>& delegate) {
    Outcomes outcomes;
    for (const bool trusted : {true, false}) {
        fixture().setTrusted(trusted);
        outcomes.push_back(outcome(delegate));
    }
    return outcomes;
}

TEST_P(HTTPSessionContract, RequestArrivesAndItsAnswerComesBack) {
    for (const int status : {200, 204, 301, 400, 404, 503}) {
        SCOPED_TRACE(status);
        const std::string body = status == 204 ? "" : "hallo";
        fixture().answer(status, body);
        const HTTPReply reply = fetch(fixture().sessions(), get(fixture().link()));
        EXPECT_EQ(reply.error, std::nullopt);
        ASSERT_TRUE(reply.response);
        EXPECT_EQ(reply.response->status, status);
        EXPECT_EQ(reply.response->className, "HTTPResponse");
        EXPECT_EQ(reply.body, body);
    }
    for (const std::string& body :
         {std::string(), std::string("a\0b", 3), std::string(70000, 'x')}) {
        EXPECT_EQ(outcomeOf(fetch(fixture().sessions(), post(fixture().link(), body))), "503");
        EXPECT_EQ(fixture().requests().back(),
                  (HTTPSessionFixture::Request{"POST", body, "kstd/1.0"}));
    }
    EXPECT_EQ(fixture().requests().front(), (HTTPSessionFixture::Request{"GET", "", "kstd/1.0"}));
    EXPECT_EQ(fixture().requests().size(), 9U);
}

TEST_P(HTTPSessionContract, LinksThatLeadNowhere) {
    const auto delegate = acceptingDelegate();
    for (const char* text : {"file:///etc/hostname", "ftp://127.0.0.1/", "httpss://127.0.0.1/",
                             "http", "https:", "https:/", "https://", "https:///path",
                             "https://?query", "https://:443/", "https:127.0.0.1", "data:,x", ""}) {
        SCOPED_TRACE(text);
        const HTTPReply reply = fetch(fixture().sessions(), get(text), delegate);
        EXPECT_EQ(reply.error, (platform::Error{platform::kTransportErrorDomain,
                                                platform::kUnsupportedLink, "unsupported URL"}));
        EXPECT_FALSE(reply.response);
    }
    const HTTPReply none = fetch(fixture().sessions(), {"POST", std::nullopt, "x"}, delegate);
    EXPECT_EQ(outcomeOf(none), "transport 1");
    const HTTPReply method =
        fetch(fixture().sessions(), {"BREW", Link{fixture().link()}, {}}, delegate);
    EXPECT_EQ(outcomeOf(method), "transport 6");
    EXPECT_EQ(method.error->description, "unsupported method BREW");
    const HTTPReply dead = fetch(fixture().sessions(), get(fixture().deadLink()), delegate);
    EXPECT_EQ(outcomeOf(dead), "transport 2") << "nobody listens";
    EXPECT_FALSE(dead.response);
    EXPECT_EQ(delegate->challenges(), 0);
    EXPECT_EQ(fixture().requests().size(), 0U);
}

TEST_P(HTTPSessionContract, WithoutADelegateTheEvaluationDecides) {
    EXPECT_EQ(outcomes(nullptr), (Outcomes{"200", kRefused}));
    EXPECT_EQ(fixture().requests().size(), 1U) << "a server that is not trusted is told nothing";
    auto delegate = answeringDelegate(ChallengeDisposition::cancel);
    auto session = fixture().sessions().makeEphemeral({}, delegate);
    delegate.reset();
    fixture().setTrusted(true);
    ReplyKeeper keeper;
    session->start(get(fixture().link()), keeper.completion());
    session.reset();
    EXPECT_EQ(outcomeOf(keeper.reply()), "200") << "a delegate that is gone is as none";
}

TEST_P(HTTPSessionContract, DelegateDecides) {
    const auto answers = [this](ScriptedDelegate::Script script) {
        const auto delegate = std::make_shared<ScriptedDelegate>(std::move(script));
        Outcomes seen = outcomes(delegate);
        EXPECT_EQ(delegate->challenges(), 2) << "once for each connection";
        return seen;
    };
    EXPECT_EQ(outcomes(acceptingDelegate()), (Outcomes{"200", "200"}));
    EXPECT_EQ(outcomes(answeringDelegate(ChallengeDisposition::performDefaultHandling)),
              (Outcomes{"200", kRefused}));
    EXPECT_EQ(outcomes(answeringDelegate(ChallengeDisposition::cancel)),
              (Outcomes{kRefused, kRefused}));
    EXPECT_EQ(outcomes(answeringDelegate(ChallengeDisposition::useCredential)),
              (Outcomes{kRefused, kRefused}))
        << "no credential";
    OtherTrust other;
    EXPECT_EQ(answers([&](const auto&, const auto& completion) {
                  completion(ChallengeDisposition::useCredential, ServerTrustCredential{&other});
              }),
              (Outcomes{kRefused, kRefused}));
    EXPECT_EQ(answers([](const auto&, const auto&) {}), (Outcomes{kRefused, kRefused}))
        << "no answer";
    std::vector<TrustResult> results;
    EXPECT_EQ(answers([&](const AuthenticationChallenge& challenge, const auto& completion) {
                  EXPECT_EQ(challenge.method, platform::kServerTrustMethod);
                  EXPECT_EQ(challenge.previousFailureCount, 0);
                  EXPECT_NE(challenge.host, "");
                  EXPECT_EQ(fixture().link().find(base::concat("://", challenge.host)), 5U);
                  results.push_back(challenge.trust->evaluate());
                  EXPECT_EQ(challenge.trust->evaluate(), results.back());
                  completion(ChallengeDisposition::useCredential,
                             ServerTrustCredential{challenge.trust});
              }),
              (Outcomes{"200", "200"}));
    EXPECT_EQ(results, (std::vector{TrustResult::unspecified, TrustResult::recoverableFailure}));
}

TEST_P(HTTPSessionContract, OnlyTheFirstAnswerOfADelegateCounts) {
    fixture().setTrusted(false);
    ChallengeCompletion kept;
    const auto accept = [](const auto& challenge, const auto& completion) {
        completion(ChallengeDisposition::useCredential, ServerTrustCredential{challenge.trust});
    };
    const auto cancel = [](const auto& completion) {
        completion(ChallengeDisposition::cancel, std::nullopt);
    };
    EXPECT_EQ(outcome(std::make_shared<ScriptedDelegate>(
                  [&](const auto& challenge, const auto& completion) {
                      accept(challenge, completion);
                      cancel(completion);
                      kept = completion;
                  })),
              "200");
    cancel(kept);
    EXPECT_EQ(outcome(std::make_shared<ScriptedDelegate>(
                  [&](const auto& challenge, const auto& completion) {
                      cancel(completion);
                      accept(challenge, completion);
                  })),
              kRefused);
}

TEST_P(HTTPSessionContract, DelegateMayAnswerOnAnotherThread) {
    fixture().setTrusted(false);
    for (const bool answers : {true, false}) {
        std::thread other;
        const auto delegate = std::make_shared<ScriptedDelegate>(
            [&](const AuthenticationChallenge& challenge, const ChallengeCompletion& completion) {
                other = std::thread([answers, trust = challenge.trust, completion] {
                    std::this_thread::yield();
                    if (answers) {
                        completion(ChallengeDisposition::useCredential,
                                   ServerTrustCredential{trust});
                    }
                });
            });
        EXPECT_EQ(outcome(delegate), answers ? "200" : kRefused);
        other.join();
    }
}

TEST_P(HTTPSessionContract, BodyBeyondTheLimitIsAnError) {
    HTTPRequest request = get(fixture().link());
    for (const std::size_t limit : {std::size_t{0}, std::size_t{1}, std::size_t{100000}}) {
        request.maximumAnswerSize = limit;
        fixture().answer(200, std::string(limit, 'b'));
        EXPECT_EQ(fetch(fixture().sessions(), request).body, std::string(limit, 'b'));
        fixture().answer(200, std::string(limit + 1, 'b'));
        const HTTPReply reply = fetch(fixture().sessions(), request);
        EXPECT_EQ(reply.error,
                  (platform::Error{platform::kTransportErrorDomain, platform::kAnswerTooLarge,
                                   base::concat("answer longer than ", limit, " bytes")}));
        EXPECT_EQ(reply.body, "");
    }
}

TEST_P(HTTPSessionContract, BodyOfTheAnswerToAPostIsNotKept) {
    HTTPRequest request = post(fixture().link(), "document");
    request.maximumAnswerSize = 1;
    for (const std::size_t size : {0UL, 1UL, 2UL, 2UL * 1024 * 1024}) {
        SCOPED_TRACE(size);
        for (const int status : {200, 503}) {
            fixture().answer(status, std::string(size, 'b'));
            const HTTPReply reply = fetch(fixture().sessions(), request);
            EXPECT_EQ(outcomeOf(reply), std::to_string(status));
            EXPECT_EQ(reply.body, "");
        }
    }
    EXPECT_EQ(fixture().requests().back().body, "document");
}

/// A body whose pieces are short, and of which no more than `most` bytes can be had.
class BodyInPieces final : public platform::HTTPBody {
  public:
    BodyInPieces(std::string text, std::size_t most) : text_(std::move(text)), left_(most) {}

    [[nodiscard]] std::uint64_t size() const override { return text_.size(); }
    [[nodiscard]] std::string_view next(std::size_t most) override {
        const std::size_t given = std::min({most, left_, kLongest});
        const std::string_view piece = std::string_view(text_).substr(given_, given);
        given_ += piece.size();
        left_ -= piece.size();
        return piece;
    }

  private:
    static constexpr std::size_t kLongest = 70'000;

    std::string text_;
    std::size_t given_ = 0;
    std::size_t left_;
};

std::string longText() {
    std::string text;
    while (text.size() < 1'000'000) {
        text += base::concat(text.size(), ' ');
    }
    return text;
}

TEST_P(HTTPSessionContract, BodyInPiecesArrivesWhole) {
    fixture().answer(200, "");
    for (const std::string& text : {std::string("short"), longText()}) {
        BodyInPieces body(text, text.size());
        HTTPRequest request = post(fixture().link(), "");
        request.pieces = &body;
        EXPECT_EQ(outcomeOf(fetch(fixture().sessions(), request)), "200");
        EXPECT_TRUE(fixture().requests().back().body == text);
    }
}

TEST_P(HTTPSessionContract, BodyThatCannotBeHadToItsEndIsAnError) {
    fixture().answer(200, "");
    const std::string text = longText();
    for (const std::size_t most : {std::size_t{0}, text.size() - 1}) {
        BodyInPieces body(text, most);
        HTTPRequest request = post(fixture().link(), "");
        request.pieces = &body;
        EXPECT_EQ(fetch(fixture().sessions(), request).error,
                  (platform::Error{platform::kTransportErrorDomain, platform::kTransferFailed,
                                   "transfer failed: the body cannot be read"}));
    }
}

TEST_P(HTTPSessionContract, DestructionWaitsForEveryRequest) {
    fixture().hold();
    auto session = fixture().sessions().makeEphemeral({}, {});
    std::atomic<int> completed{0};
    for (int i = 0; i < 4; ++i) {
        session->start(get(fixture().link()), [&](const HTTPReply& reply) {
            EXPECT_EQ(outcomeOf(reply), "200");
            ++completed;
        });
    }
    fixture().awaitRequests(4);
    EXPECT_EQ(completed, 0);
    std::thread releaser([this] { fixture().release(); });
    session.reset();
    EXPECT_EQ(completed, 4);
    releaser.join();
}

TEST_P(HTTPSessionContract, CompletionRunsOnAThreadOfTheSessionAndMayStartARequest) {
    auto session = fixture().sessions().makeEphemeral({}, {});
    const auto caller = std::this_thread::get_id();
    ReplyKeeper second;
    std::thread::id thread = caller;
    session->start(get(fixture().link()), [&, starter = session.get()](const HTTPReply&) {
        thread = std::this_thread::get_id();
        starter->start(get(fixture().link()), second.completion());
    });
    fixture().awaitRequests(2);
    session.reset();
    EXPECT_NE(thread, caller);
    EXPECT_EQ(second.calls(), 1);
    EXPECT_EQ(outcomeOf(second.reply()), "200");
}

} // namespace contract
