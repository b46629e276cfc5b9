// HTTPS clients that do not behave, and what one that does gets to see.

#include "base/Concat.h"
#include "platform/linux/RemoteHTTPExchange.h"
#include "platform/linux/RemoteHTTPSessions.h"
#include "tests/platform/linux/ScriptedHTTPSClient.h"
#include "tests/support/HTTPRequests.h"
#include "tests/support/TemporaryDirectory.h"
#include "tests/support/TerminationSignal.h"

#include <gtest/gtest.h>

#include <future>
#include <limits>
#include <vector>

namespace {

using namespace std::chrono_literals;
using platform::Error;
using platform::HTTPReply;
using platform::HTTPRequest;
using platform::RemoteHTTPSessions;
using support::acceptingDelegate;
using support::fetch;
using support::get;
using support::outcomeOf;
using support::post;
using support::ScriptedDelegate;
using wire::HTTPConnection;
using wire::HTTPMessage;
using wire::HTTPVerdict;
using State = wire::HTTPConnectionState;
using Bytes = std::vector<std::uint8_t>;

constexpr char kLink[] = "https://collector.example/2/kst";
constexpr char kNotAllowed[] = "transfer failed: the HTTPS client sent what it must not";
constexpr char kNoAnswer[] = "transfer failed: the HTTPS client ended without an answer";

Bytes bytesOf(std::string_view text) {
    return {text.begin(), text.end()};
}

Bytes piece(std::string_view text) {
    const auto header = wire::encodeHTTPHeader(
        {wire::HTTPMessageType::piece, static_cast<std::uint32_t>(text.size())});
    Bytes message(header.begin(), header.end());
    message.insert(message.end(), text.begin(), text.end());
    return message;
}

Bytes response(std::uint64_t bodySize, std::optional<int> status = 200) {
    return *wire::encodeHTTPResponse({status, bodySize, "HTTPResponse"});
}

Bytes failure(std::int64_t code, const char* domain = platform::kTransportErrorDomain) {
    return *wire::encodeHTTPFailure({code, domain, "words"});
}

Bytes challenge(std::uint32_t evaluation = 4, std::string_view method = "ServerTrust",
                std::uint32_t previousFailures = 0) {
    return *wire::encodeHTTPChallenge({method, previousFailures, evaluation, "collector.example"});
}

Bytes joined(std::initializer_list<Bytes> parts) {
    Bytes all;
    for (const Bytes& part : parts) {
        all.insert(all.end(), part.begin(), part.end());
    }
    return all;
}

void awaitHangUp(HTTPConnection& connection) {
    HTTPMessage message;
    while (connection.receive(message) == State::open) {
    }
}

class RemoteHTTPClientTest : public testing::Test {
  protected:
    using Script = std::function<void(HTTPConnection&)>;
    using Delegate = std::shared_ptr<platform::HTTPSessionDelegate>;

    /// The reply to the request when the client has taken it and then does what the script says.
    HTTPReply replyWhen(const Script& script, const HTTPRequest& request = get(kLink),
                        const Delegate& delegate = nullptr) {
        const support::ScriptedHTTPSClient client(
            socket(), [&](HTTPConnection& connection, int /*socket*/) {
                HTTPMessage message;
                EXPECT_EQ(connection.receive(message), State::open);
                EXPECT_EQ(message.type, wire::HTTPMessageType::request);
                script(connection);
            });
        RemoteHTTPSessions sessions({.socket = socket(),
                                     .silenceLimit = silenceLimit_,
                                     .limits = limits_,
                                     .grace = 5ms,
                                     .stop = stop_});
        return fetch(sessions, request, delegate);
    }

    /// The reply when the client sends that and hangs up.
    HTTPReply replyTo(const Bytes& bytes, const HTTPRequest& request = get(kLink),
                      const Delegate& delegate = nullptr) {
        return replyWhen(
            [&](HTTPConnection& connection) { static_cast<void>(connection.send(bytes)); }, request,
            delegate);
    }

    [[nodiscard]] std::string socket() const { return directory_.file("https.sock"); }

    support::TemporaryDirectory directory_;
    std::chrono::milliseconds silenceLimit_ = 30s;
    platform::HTTPLimits limits_;
    const platform::StopRequest* stop_ = nullptr;
};

TEST_F(RemoteHTTPClientTest, RequestAsItArrives) {
    wire::HTTPMessageBytes expected = *wire::encodeHTTPRequest({.method = "POST",
                                                                .link = kLink,
                                                                .headers = {{"A", "1"}, {"B", ""}},
                                                                .bodySize = 4,
                                                                .maximumAnswerSize = 77,
                                                                .hasDelegate = true});
    expected.erase(expected.begin(), expected.begin() + wire::kHTTPHeaderSize);
    Bytes arrived;
    {
        const support::ScriptedHTTPSClient client(
            socket(), [&](HTTPConnection& connection, int /*socket*/) {
                HTTPMessage message;
                EXPECT_EQ(connection.receive(message), State::open);
                arrived.assign(message.fields.begin(), message.fields.end());
                static_cast<void>(connection.send(response(0)));
            });
        RemoteHTTPSessions sessions({.socket = socket()});
        HTTPRequest request = post(kLink, "body");
        request.maximumAnswerSize = 77;
        support::ReplyKeeper keeper;
        const auto delegate = acceptingDelegate();
        sessions.makeEphemeral({{"B", ""}, {"A", "1"}}, delegate)
            ->start(request, keeper.completion());
        EXPECT_EQ(outcomeOf(keeper.reply()), "200");
    }
    EXPECT_EQ(arrived, expected);
}

TEST_F(RemoteHTTPClientTest, BodyOfAGetIsNotSentAndAnAnswerBeyondMeasureNotAskedFor) {
    HTTPRequest request{"GET", platform::Link{kLink}, "body", ~std::size_t{0}};
    std::optional<std::uint64_t> bodySize;
    std::optional<std::uint64_t> answerSize;
    {
        const support::ScriptedHTTPSClient client(
            socket(), [&](HTTPConnection& connection, int /*socket*/) {
                HTTPMessage message;
                EXPECT_EQ(connection.receive(message), State::open);
                const auto fields = wire::decodeHTTPRequest(message.fields);
                bodySize = fields->bodySize;
                answerSize = fields->maximumAnswerSize;
                static_cast<void>(connection.send(response(0)));
            });
        RemoteHTTPSessions sessions({.socket = socket()});
        EXPECT_EQ(outcomeOf(fetch(sessions, request)), "200");
    }
    EXPECT_EQ(bodySize, 0U);
    EXPECT_EQ(answerSize, wire::kHTTPMaxBodySize);
}

TEST_F(RemoteHTTPClientTest, AnswersAreGivenAsTheyCome) {
    const HTTPReply reply =
        replyTo(joined({wire::encodeHTTPWorking(), wire::encodeHTTPWorking(), response(5, 503),
                        piece("ha"), piece("llo"), bytesOf("what follows is not read")}));
    EXPECT_EQ(outcomeOf(reply), "503");
    EXPECT_EQ(reply.response->className, "HTTPResponse");
    EXPECT_EQ(reply.body, "hallo");
    const HTTPReply other = replyTo(response(0, std::nullopt));
    EXPECT_EQ(other.error, std::nullopt);
    EXPECT_EQ(other.response->status, std::nullopt);
    for (const std::int64_t code : {1, 2, 3, 4, 5, 6}) {
        EXPECT_EQ(replyTo(failure(code)).error,
                  (Error{platform::kTransportErrorDomain, code, "words"}));
    }
}

TEST_F(RemoteHTTPClientTest, WhatAClientMustNotSend) {
    const Bytes cases[] = {
        bytesOf("HTTP/1.1 200 OK\r\n\r\n"),
        Bytes(12, 0xff),
        wire::encodeHTTPVerdict(HTTPVerdict::accept),
        *wire::encodeHTTPRequest({.method = "GET", .link = kLink}),
        piece("x"),
        wire::encodeHTTPBodyWanted(1),
        challenge(),
        failure(0),
        failure(7),
        failure(-1),
        failure(1, "system"),
        joined({response(2), piece("abc")}),
        joined({response(2), piece("a"), piece("bc")}),
        joined({response(2), wire::encodeHTTPWorking()}),
        joined({response(2), response(2)}),
    };
    for (const Bytes& bytes : cases) {
        SCOPED_TRACE(testing::PrintToString(bytes));
        EXPECT_EQ(replyTo(bytes).error,
                  (Error{platform::kTransportErrorDomain, platform::kTransferFailed, kNotAllowed}));
    }
}

TEST_F(RemoteHTTPClientTest, ClientThatHangsUpBeforeTheAnswerIsWhole) {
    const Bytes half = response(0);
    for (const Bytes& bytes :
         {Bytes(), Bytes(half.begin(), half.begin() + 3), Bytes(half.begin(), half.end() - 1),
          response(1), joined({response(3), piece("ab")}), wire::encodeHTTPWorking()}) {
        SCOPED_TRACE(testing::PrintToString(bytes));
        const HTTPReply reply = replyTo(bytes);
        EXPECT_EQ(reply.error,
                  (Error{platform::kTransportErrorDomain, platform::kTransferFailed, kNoAnswer}));
        EXPECT_EQ(reply.body, "");
    }
}

TEST_F(RemoteHTTPClientTest, AnswerBeyondTheLimitIsNotTaken) {
    HTTPRequest request = get(kLink);
    request.maximumAnswerSize = 3;
    EXPECT_EQ(replyTo(joined({response(2), piece("ab")}), request).body, "ab");
    EXPECT_EQ(replyTo(joined({response(3), piece("abc")}), request).body, "abc");
    for (const std::uint64_t size : {std::uint64_t{4}, wire::kHTTPMaxBodySize}) {
        EXPECT_EQ(replyTo(response(size), request).error,
                  (Error{platform::kTransportErrorDomain, platform::kAnswerTooLarge,
                         "answer longer than 3 bytes"}));
    }
}

TEST_F(RemoteHTTPClientTest, OfTheAnswerToAPostOnlyTheStatusIsTaken) {
    HTTPRequest request = post(kLink, "body");
    request.maximumAnswerSize = 3;
    for (const Bytes& bytes :
         {response(0), response(3), response(4), response(wire::kHTTPMaxBodySize),
          joined({response(2), piece("a")}), joined({response(2), piece("abc")}),
          joined({response(2), bytesOf("HTTP/1.1 200 OK\r\n\r\n")})}) {
        SCOPED_TRACE(testing::PrintToString(bytes));
        const HTTPReply reply = replyTo(bytes, request);
        EXPECT_EQ(outcomeOf(reply), "200");
        EXPECT_EQ(reply.body, "");
    }
    silenceLimit_ = 20ms;
    EXPECT_EQ(outcomeOf(replyWhen(
                  [](HTTPConnection& connection) {
                      static_cast<void>(connection.send(response(2, 503)));
                      awaitHangUp(connection);
                  },
                  request)),
              "503");
}

TEST_F(RemoteHTTPClientTest, ClientThatWorksForEverIsGivenUp) {
    limits_ = {.connecting = 4ms, .fetching = 8ms, .sending = 10ms, .answering = 6ms};
    const auto workForEver = [](HTTPConnection& connection) {
        while (connection.send(wire::encodeHTTPWorking()) == State::open) {
        }
    };
    const auto timedOut = [](int limit) {
        return Error{platform::kTransportErrorDomain, platform::kTimedOut,
                     base::concat("timed out: the HTTPS client took longer than ", limit, " ms")};
    };
    EXPECT_EQ(replyWhen(workForEver).error, timedOut(8 + 5));
    const std::string document(platform::HTTPLimits::kSendingStep, 'd');
    for (const auto& [size, limit] : {std::pair(document.size() - 1, 4 + 10 + 6 + 5),
                                      std::pair(document.size(), 4 + 20 + 6 + 5)}) {
        EXPECT_EQ(
            replyWhen(workForEver, post(kLink, std::string_view(document).substr(0, size))).error,
            timedOut(limit));
    }
    EXPECT_EQ(replyWhen([](HTTPConnection& connection) { awaitHangUp(connection); }).error,
              timedOut(8 + 5))
        << "silence that is not over yet";
}

TEST_F(RemoteHTTPClientTest, AnswerThatIsGivenByAndByIsBoundedToo) {
    limits_.fetching = 10ms;
    const HTTPReply reply = replyWhen([](HTTPConnection& connection) {
        State state = connection.send(response(1024UL * 1024));
        while (state == State::open) {
            state = connection.send(piece("x"));
            std::this_thread::yield();
        }
    });
    EXPECT_EQ(outcomeOf(reply), "transport 3");
}

TEST_F(RemoteHTTPClientTest, ClientThatFallsSilentIsGivenUp) {
    silenceLimit_ = 20ms;
    const Bytes half = response(1);
    for (const Bytes& bytes :
         {Bytes(), Bytes(half.begin(), half.end() - 1), response(1), wire::encodeHTTPWorking()}) {
        SCOPED_TRACE(testing::PrintToString(bytes));
        const HTTPReply reply = replyWhen([&](HTTPConnection& connection) {
            static_cast<void>(connection.send(bytes));
            awaitHangUp(connection);
        });
        EXPECT_EQ(reply.error, (Error{platform::kTransportErrorDomain, platform::kTimedOut,
                                      "timed out: the HTTPS client was silent for 20 ms"}));
    }
}

TEST_F(RemoteHTTPClientTest, ClientThatCannotBeReached) {
    const auto errorOf = [](const std::string& path) {
        RemoteHTTPSessions sessions({.socket = path});
        return fetch(sessions, get(kLink)).error;
    };
    const auto unreachable = [](const std::string& path, const char* reason) {
        return Error{platform::kTransportErrorDomain, platform::kCannotConnect,
                     base::concat("cannot connect: no HTTPS client at ", path, ": ", reason)};
    };
    EXPECT_EQ(errorOf(socket()), unreachable(socket(), "No such file or directory"));
    const std::string tooLong(108, 'x');
    EXPECT_EQ(errorOf(tooLong), unreachable(tooLong, "File name too long"));
    {
        const support::ScriptedHTTPSClient gone(socket(), [](HTTPConnection&, int) {});
    }
    EXPECT_EQ(errorOf(socket()), unreachable(socket(), "Connection refused"));
}

TEST_F(RemoteHTTPClientTest, WhatIsNotToBeTriedReachesNoClient) {
    // The socket is not there, which would show.
    RemoteHTTPSessions sessions({.socket = socket()});
    EXPECT_EQ(fetch(sessions, get("file:///")).error->description, "unsupported URL");
    EXPECT_EQ(fetch(sessions, {"BREW", platform::Link{kLink}, {}}).error->description,
              "unsupported method BREW");
}

TEST_F(RemoteHTTPClientTest, RequestThatDoesNotFitIntoAMessage) {
    const auto outcome = [this](const std::string& link, const std::string& header) {
        const support::ScriptedHTTPSClient client(
            socket(), [](HTTPConnection& connection, int /*socket*/) {
                HTTPMessage message;
                if (connection.receive(message) == State::open) {
                    static_cast<void>(connection.send(response(0)));
                }
            });
        support::ReplyKeeper keeper;
        RemoteHTTPSessions({.socket = socket()})
            .makeEphemeral({{"A", header}}, {})
            ->start(get(link), keeper.completion());
        return keeper.reply().error ? keeper.reply().error->description : outcomeOf(keeper.reply());
    };
    const std::string tooLarge = "transfer failed: the request does not fit into a message";
    std::string link = "https://a/";
    link.resize(wire::kHTTPMaxLinkLength, 'x');
    EXPECT_EQ(outcome(link, "v"), "200");
    EXPECT_EQ(outcome(link + 'x', "v"), tooLarge);
    EXPECT_EQ(outcome(kLink, "a\r\nB: c"), tooLarge);
}

TEST_F(RemoteHTTPClientTest, BodyIsGivenAsItIsAskedFor) {
    std::string body;
    for (int i = 0; body.size() < 200'000; ++i) {
        base::append(body, i);
    }
    std::string arrived;
    std::vector<std::size_t> sizes;
    const auto take = [&](HTTPConnection& connection, std::uint32_t most) {
        HTTPMessage message;
        if (connection.send(wire::encodeHTTPBodyWanted(most)) == State::open &&
            connection.receive(message) == State::open) {
            EXPECT_EQ(message.type, wire::HTTPMessageType::piece);
            sizes.push_back(message.fields.size());
            arrived.append(message.fields.begin(), message.fields.end());
        }
    };
    const HTTPReply reply = replyWhen(
        [&](HTTPConnection& connection) {
            for (const std::uint32_t most : {1U, 65535U, 65536U, 65537U, 0xffffffffU}) {
                take(connection, most);
            }
            static_cast<void>(connection.send(response(0)));
        },
        post(kLink, body));
    EXPECT_EQ(outcomeOf(reply), "200");
    EXPECT_EQ(sizes, (std::vector<std::size_t>{1, 65535, 65536, 65536, body.size() - 196608}));
    EXPECT_TRUE(arrived == body);

    const HTTPReply greedy = replyWhen(
        [&](HTTPConnection& connection) {
            take(connection, 4);
            take(connection, 1);
        },
        post(kLink, "body"));
    EXPECT_EQ(greedy.error->description, kNotAllowed);
    const HTTPReply early = replyWhen(
        [&](HTTPConnection& connection) {
            take(connection, 4);
            static_cast<void>(connection.send(response(0, 413)));
        },
        post(kLink, body));
    EXPECT_EQ(outcomeOf(early), "413") << "an answer before the whole body is an answer";
}

TEST_F(RemoteHTTPClientTest, ClientThatReadsNothingIsGivenUp) {
    silenceLimit_ = 20ms;
    const std::string body(10'000'000, 'b');
    const HTTPReply reply = replyWhen(
        [](HTTPConnection& connection) {
            for (int i = 0; i < 100; ++i) {
                static_cast<void>(connection.send(wire::encodeHTTPBodyWanted(65536)));
            }
            while (!connection.isHungUp()) {
                std::this_thread::yield();
            }
        },
        post(kLink, body));
    EXPECT_EQ(outcomeOf(reply), "transport 3");
}

TEST_F(RemoteHTTPClientTest, DelegateGetsTheFactsAndTheClientTheVerdict) {
    struct Seen {
        std::string method;
        std::string host;
        int previousFailures = 0;
        std::optional<platform::TrustResult> evaluation;
    };
    using platform::ChallengeDisposition;
    const struct {
        ChallengeDisposition disposition;
        HTTPVerdict verdict;
    } kCases[] = {
        {ChallengeDisposition::useCredential, HTTPVerdict::accept},
        {ChallengeDisposition::performDefaultHandling, HTTPVerdict::leaveToEvaluation},
        {ChallengeDisposition::cancel, HTTPVerdict::refuse},
    };
    for (const auto& [disposition, expected] : kCases) {
        std::vector<Seen> seen;
        const auto delegate = std::make_shared<ScriptedDelegate>(
            [&, answer = disposition](const auto& asked, const auto& completion) {
                seen.push_back(
                    {asked.method, asked.host, asked.previousFailureCount,
                     asked.trust ? std::optional(asked.trust->evaluate()) : std::nullopt});
                completion(answer, platform::ServerTrustCredential{asked.trust});
            });
        std::vector<std::optional<HTTPVerdict>> verdicts;
        const HTTPReply reply = replyWhen(
            [&](HTTPConnection& connection) {
                for (const Bytes& question :
                     {challenge(1), challenge(4), challenge(77, "ServerTrust", 3),
                      challenge(1, "Basic", 0xffffffff)}) {
                    HTTPMessage message;
                    static_cast<void>(connection.send(question));
                    EXPECT_EQ(connection.receive(message), State::open);
                    EXPECT_EQ(message.type, wire::HTTPMessageType::verdict);
                    verdicts.push_back(wire::decodeHTTPVerdict(message.fields));
                }
                static_cast<void>(connection.send(response(0)));
            },
            get(kLink), delegate);
        EXPECT_EQ(outcomeOf(reply), "200");
        ASSERT_EQ(seen.size(), 4U);
        EXPECT_EQ(seen[0].host, "collector.example");
        EXPECT_EQ(seen[0].method, platform::kServerTrustMethod);
        EXPECT_EQ(seen[0].evaluation, platform::TrustResult::proceed);
        EXPECT_EQ(seen[1].evaluation, platform::TrustResult::unspecified);
        EXPECT_EQ(seen[2].evaluation, static_cast<platform::TrustResult>(77));
        EXPECT_EQ(seen[2].previousFailures, 3);
        EXPECT_EQ(seen[3].evaluation, std::nullopt) << "another method has no trust";
        EXPECT_EQ(seen[3].method, "Basic");
        EXPECT_EQ(seen[3].previousFailures, std::numeric_limits<int>::max());
        EXPECT_EQ(verdicts, (std::vector<std::optional<HTTPVerdict>>(4, expected)));
    }
}

TEST_F(RemoteHTTPClientTest, ChallengesAreBounded) {
    const auto delegate = acceptingDelegate();
    const HTTPReply reply = replyWhen(
        [](HTTPConnection& connection) {
            HTTPMessage message;
            while (connection.send(challenge()) == State::open &&
                   connection.receive(message) == State::open) {
            }
        },
        get(kLink), delegate);
    EXPECT_EQ(reply.error->description, kNotAllowed);
    EXPECT_EQ(delegate->challenges(), platform::kMaximumChallenges);
}

TEST_F(RemoteHTTPClientTest, DelegateThatGoesMeanwhileLeavesItToTheEvaluation) {
    auto delegate = acceptingDelegate();
    std::optional<HTTPVerdict> verdict;
    support::ReplyKeeper keeper;
    std::promise<void> taken;
    std::promise<void> gone;
    {
        const support::ScriptedHTTPSClient client(
            socket(), [&](HTTPConnection& connection, int /*socket*/) {
                HTTPMessage message;
                EXPECT_EQ(connection.receive(message), State::open);
                taken.set_value();
                gone.get_future().wait();
                static_cast<void>(connection.send(challenge(5)));
                EXPECT_EQ(connection.receive(message), State::open);
                verdict = wire::decodeHTTPVerdict(message.fields);
                static_cast<void>(connection.send(response(0)));
            });
        RemoteHTTPSessions sessions({.socket = socket()});
        const auto session = sessions.makeEphemeral({}, delegate);
        session->start(get(kLink), keeper.completion());
        taken.get_future().wait();
        delegate.reset();
        gone.set_value();
    }
    EXPECT_EQ(outcomeOf(keeper.reply()), "200");
    EXPECT_EQ(verdict, HTTPVerdict::leaveToEvaluation);
}

/// Requests of a process that gets SIGTERM.
class StoppedHTTPClientTest : public RemoteHTTPClientTest {
  protected:
    StoppedHTTPClientTest() { stop_ = &request_; }

    static Error stopped() {
        return {platform::kTransportErrorDomain, platform::kTransferFailed,
                "transfer failed: the daemon is asked to end"};
    }

  private:
    const support::TerminationSignal signal_;
    const platform::StopRequest request_;
};

TEST_F(StoppedHTTPClientTest, ARequestWithoutAnAnswerEndsAtOnce) {
    silenceLimit_ = 1h;
    const HTTPReply reply = replyWhen([](HTTPConnection& connection) {
        support::TerminationSignal::send();
        awaitHangUp(connection);
    });
    EXPECT_EQ(reply.error, stopped());
}

TEST_F(StoppedHTTPClientTest, NoMoreOfABodyIsGivenAway) {
    silenceLimit_ = 1h;
    const std::string body(100, 'b');
    const HTTPReply reply = replyWhen(
        [](HTTPConnection& connection) {
            HTTPMessage message;
            EXPECT_EQ(connection.send(wire::encodeHTTPBodyWanted(50)), State::open);
            EXPECT_EQ(connection.receive(message), State::open);
            support::TerminationSignal::send();
            static_cast<void>(connection.send(wire::encodeHTTPBodyWanted(50)));
            EXPECT_EQ(connection.receive(message), State::hungUp);
        },
        post(kLink, body));
    EXPECT_EQ(reply.error, stopped());
}

TEST_F(StoppedHTTPClientTest, AClientThatNeverPausesIsLeftAlone) {
    const HTTPReply reply = replyWhen([](HTTPConnection& connection) {
        EXPECT_EQ(connection.send(wire::encodeHTTPWorking()), State::open);
        support::TerminationSignal::send();
        while (connection.send(wire::encodeHTTPWorking()) == State::open) {
        }
    });
    EXPECT_EQ(reply.error, stopped());
}

TEST_F(StoppedHTTPClientTest, AnAnswerThatHasComeCounts) {
    const HTTPReply reply = replyWhen([](HTTPConnection& connection) {
        EXPECT_EQ(connection.send(joined({response(4), piece("body")})), State::open);
        support::TerminationSignal::send();
        awaitHangUp(connection);
    });
    EXPECT_EQ(outcomeOf(reply), "200");
    EXPECT_EQ(reply.body, "body");
}

TEST_F(StoppedHTTPClientTest, NothingIsStartedAfterIt) {
    support::TerminationSignal::send();
    bool wasReached = false;
    const support::ScriptedHTTPSClient client(
        socket(), [&](HTTPConnection& /*connection*/, int /*socket*/) { wasReached = true; });
    RemoteHTTPSessions sessions({.socket = socket(), .stop = stop_});
    EXPECT_EQ(fetch(sessions, get(kLink)).error, stopped());
    EXPECT_FALSE(wasReached);
}

} // namespace
