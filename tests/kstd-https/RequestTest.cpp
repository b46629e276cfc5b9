// Requests that are none, daemons that break the rules, and daemons that go away.

#include "tests/kstd-https/ClientProgram.h"
#include "tests/support/Collector.h"
#include "tests/support/EnvironmentVariable.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <fstream>
#include <list>

namespace {

using support::Collector;
using support::ConnectedClient;
using wire::HTTPConnection;
using wire::HTTPMessage;
using wire::HTTPRequestFields;
using wire::HTTPVerdict;
using State = wire::HTTPConnectionState;
using Type = wire::HTTPMessageType;
using Bytes = std::vector<std::uint8_t>;
using Lines = std::vector<std::string>;

Bytes requestOf(const HTTPRequestFields& fields) {
    return *wire::encodeHTTPRequest(fields);
}

/// The next message that says more than that the program is at work.
State receive(HTTPConnection& connection, HTTPMessage& message) {
    State state = State::open;
    do {
        state = connection.receive(message);
    } while (state == State::open && message.type == Type::working);
    return state;
}

/// The most memory that a process has had, in KiB.
long peakMemory(pid_t process) {
    std::ifstream status(base::concat("/proc/", process, "/status"));
    for (std::string line; std::getline(status, line);) {
        if (line.starts_with("VmHWM:")) {
            return std::stol(line.substr(6));
        }
    }
    ADD_FAILURE() << "no figure";
    return 0;
}

class HTTPSRequestTest : public testing::Test {
  protected:
    /// A program that trusts the collector and has got the request.
    void start(const HTTPRequestFields& fields) {
        client_.emplace(Lines{"--trust-anchors", collector_.authority()});
        ASSERT_EQ(connection().send(requestOf(fields)), State::open);
    }

    void control(const std::string& line) { static_cast<void>(collector_.control(line)); }

    [[nodiscard]] HTTPConnection& connection() { return client_->connection(); }

    void expect(Type type) {
        ASSERT_EQ(receive(connection(), message_), State::open);
        ASSERT_EQ(message_.type, type);
    }

    void expectFailure(std::int64_t code, const std::string& description) {
        expect(Type::failure);
        const auto failure = wire::decodeHTTPFailure(message_.fields);
        ASSERT_TRUE(failure);
        EXPECT_EQ(failure->domain, "transport");
        EXPECT_EQ(failure->code, code);
        EXPECT_EQ(failure->description, description);
        expectEnd();
    }

    void expectResponse(std::int32_t status, std::uint64_t bodySize) {
        expect(Type::response);
        EXPECT_EQ(wire::decodeHTTPResponse(message_.fields),
                  (wire::HTTPResponseFields{status, bodySize, "HTTPResponse"}));
    }

    void expectEnd() {
        EXPECT_EQ(receive(connection(), message_), State::hungUp);
        EXPECT_EQ(client_->awaitEnd(), 0);
        EXPECT_EQ(client_->lines(), Lines());
    }

    Collector collector_;
    std::string link_ = collector_.link("/2/kst");
    std::optional<ConnectedClient> client_;
    HTTPMessage message_;
};

TEST(HTTPSStrangeRequestTest, WhatIsNoRequestIsNotAnswered) {
    Bytes otherVersion = requestOf({.method = "GET", .link = "http://127.0.0.1:1/"});
    otherVersion[4] = 2;
    Bytes cut = requestOf({.method = "GET", .link = "http://127.0.0.1:1/"});
    cut.pop_back();
    const std::string text = "GET / HTTP/1.1\r\nHost: localhost\r\n\r\n";
    const Bytes cases[] = {
        Bytes(text.begin(), text.end()),
        Bytes(100, 0),
        otherVersion,
        cut,
        wire::encodeHTTPWorking(),
        wire::encodeHTTPVerdict(HTTPVerdict::accept),
        requestOf({.method = "GET", .link = "http://127.0.0.1:1/", .bodySize = 1}),
    };
    for (const Bytes& bytes : cases) {
        SCOPED_TRACE(testing::PrintToString(bytes));
        ConnectedClient client;
        EXPECT_EQ(client.connection().send(bytes), State::open);
        HTTPMessage message;
        if (bytes != cut) {
            EXPECT_EQ(client.connection().receive(message), State::hungUp);
        }
        client.hangUp();
        EXPECT_EQ(client.awaitEnd(), 1);
        EXPECT_EQ(client.lines(), (Lines{"kstd-https: what came is no request"}));
    }
}

TEST_F(HTTPSRequestTest, RequestsThatAreNotTried) {
    for (const char* const link :
         {"file:///etc/hostname", "x", "https://", "https://127.0.0.1:65536/"}) {
        SCOPED_TRACE(link);
        start({.method = "GET", .link = link, .hasDelegate = true});
        expectFailure(1, "unsupported URL");
    }
    start({.method = "BREW", .link = link_});
    expectFailure(6, "unsupported method BREW");
    start({.method = "POST", .link = "https://", .bodySize = wire::kHTTPMaxBodySize});
    expectFailure(1, "unsupported URL");
    EXPECT_EQ(collector_.connectionCount(), 0U);
}

TEST_F(HTTPSRequestTest, WholeRequestStepByStep) {
    control("body hallo");
    start({.method = "POST",
           .link = link_,
           .headers = {{"A", "1"}, {"Empty", ""}},
           .bodySize = 7,
           .maximumAnswerSize = 5,
           .hasDelegate = true});
    expect(Type::challenge);
    EXPECT_EQ(wire::decodeHTTPChallenge(message_.fields),
              (wire::HTTPChallengeFields{"ServerTrust", 0, 4, "127.0.0.1"}));
    ASSERT_EQ(connection().send(wire::encodeHTTPVerdict(HTTPVerdict::accept)), State::open);
    expect(Type::bodyWanted);
    EXPECT_EQ(wire::decodeHTTPBodyWanted(message_.fields), 7U);
    const std::string body = "1234567";
    const std::span<const std::uint8_t> bytes(reinterpret_cast<const std::uint8_t*>(body.data()),
                                              body.size());
    ASSERT_EQ(connection().sendPiece(bytes.first(3)), State::open);
    expect(Type::bodyWanted);
    EXPECT_EQ(wire::decodeHTTPBodyWanted(message_.fields), 4U);
    ASSERT_EQ(connection().sendPiece(bytes.subspan(3)), State::open);
    expectResponse(200, 0);
    expectEnd();
    EXPECT_EQ(collector_.body(1), body);
    EXPECT_EQ(collector_.lastHead(),
              (Lines{"POST /2/kst HTTP/1.1", base::concat("Host: 127.0.0.1:", collector_.port()),
                     "A: 1", "Empty:", "Content-Length: 7", ""}));
}

TEST_F(HTTPSRequestTest, AnswerOfAGetIsHandedOnWithItsBody) {
    control("body hallo");
    start({.method = "GET", .link = link_, .maximumAnswerSize = 5});
    expectResponse(200, 5);
    expect(Type::piece);
    EXPECT_EQ(std::string(message_.fields.begin(), message_.fields.end()), "hallo");
    expectEnd();
}

TEST_F(HTTPSRequestTest, NoMoreThanAPartOfADocumentIsHeld) {
    const Bytes bytes(wire::kHTTPMaxPieceSize, 'd');
    std::vector<long> peaks;
    for (const std::size_t size : {std::size_t{1}, std::size_t{20'000'000}}) {
        control("hold");
        start({.method = "POST", .link = link_, .bodySize = size});
        for (std::size_t left = size; left > 0;) {
            expect(Type::bodyWanted);
            const auto wanted = wire::decodeHTTPBodyWanted(message_.fields);
            const std::size_t given = std::min<std::size_t>({*wanted, left, bytes.size()});
            ASSERT_EQ(connection().sendPiece(std::span(bytes).first(given)), State::open);
            left -= given;
        }
        control(base::concat("await-requests ", peaks.size() + 1));
        peaks.push_back(peakMemory(client_->pid()));
        control("release");
        expectResponse(200, 0);
        expectEnd();
        EXPECT_EQ(collector_.body(peaks.size()).size(), size);
    }
    // The whole of it has 19,531 KiB. A sanitizer keeps what was freed for a while.
    EXPECT_LT(peaks[1], peaks[0] + 14'000);
}

TEST_F(HTTPSRequestTest, VerdictsAndWhatIsNone) {
    const struct {
        const char* certificate;
        Bytes answer;
        const char* refusal;
    } kCases[] = {
        {"good", wire::encodeHTTPVerdict(HTTPVerdict::accept), nullptr},
        {"expired", wire::encodeHTTPVerdict(HTTPVerdict::accept), nullptr},
        {"good", wire::encodeHTTPVerdict(HTTPVerdict::leaveToEvaluation), nullptr},
        {"expired", wire::encodeHTTPVerdict(HTTPVerdict::leaveToEvaluation),
         "server not trusted: certificate has expired"},
        {"good", wire::encodeHTTPVerdict(HTTPVerdict::refuse),
         "server not trusted: refused by the delegate"},
        {"good", wire::encodeHTTPWorking(), "server not trusted: refused by the delegate"},
        {"good",
         {'K', 'S', 'T', 'H', 1, 2, 0, 0, 1, 0, 0, 0, 4},
         "server not trusted: refused by the delegate"},
    };
    for (const auto& [certificate, answer, refusal] : kCases) {
        SCOPED_TRACE(testing::PrintToString(answer));
        control(base::concat("certificate ", certificate));
        start({.method = "GET", .link = link_, .hasDelegate = true});
        expect(Type::challenge);
        EXPECT_EQ(wire::decodeHTTPChallenge(message_.fields)->evaluation,
                  certificate == std::string("good") ? 4U : 5U);
        ASSERT_EQ(connection().send(answer), State::open);
        if (refusal != nullptr) {
            expectFailure(4, refusal);
        } else {
            expectResponse(200, 0);
            expectEnd();
        }
    }
}

TEST_F(HTTPSRequestTest, WithoutADelegateNothingIsAsked) {
    start({.method = "GET", .link = link_});
    expectResponse(200, 0);
    expectEnd();
    control("certificate expired");
    start({.method = "GET", .link = link_});
    expectFailure(4, "server not trusted: certificate has expired");
}

TEST_F(HTTPSRequestTest, BodyThatIsNotGivenAsItIsAskedForEndsTheRequest) {
    const Bytes tooMuch(8, 'x');
    for (const bool isPiece : {true, false}) {
        start({.method = "POST", .link = link_, .bodySize = 7});
        expect(Type::bodyWanted);
        ASSERT_EQ(isPiece ? connection().sendPiece(tooMuch)
                          : connection().send(wire::encodeHTTPVerdict(HTTPVerdict::accept)),
                  State::open);
        expect(Type::failure);
        EXPECT_EQ(wire::decodeHTTPFailure(message_.fields)->code, 6);
        expectEnd();
    }
    EXPECT_EQ(collector_.requestCount(), 0U);
}

TEST_F(HTTPSRequestTest, DaemonThatHangsUpEndsTheRequest) {
    const auto expectQuietEnd = [this] {
        client_->hangUp();
        EXPECT_EQ(client_->awaitEnd(), 0);
        EXPECT_EQ(client_->lines(), Lines());
    };
    start({.method = "GET", .link = link_, .hasDelegate = true});
    expect(Type::challenge);
    expectQuietEnd();
    start({.method = "POST", .link = link_, .bodySize = 7});
    expect(Type::bodyWanted);
    expectQuietEnd();
    EXPECT_EQ(collector_.requestCount(), 0U);

    control("hold");
    start({.method = "GET", .link = link_});
    control("await-requests 1");
    expectQuietEnd();
    control("release");
}

TEST_F(HTTPSRequestTest, EnvironmentIsNotObeyed) {
    std::list<support::EnvironmentVariable> variables;
    for (const char* const name : {"http_proxy", "https_proxy", "HTTPS_PROXY", "ALL_PROXY"}) {
        variables.emplace_back(name, "http://127.0.0.1:1");
    }
    for (const char* const name :
         {"SSL_CERT_FILE", "SSL_CERT_DIR", "CURL_CA_BUNDLE", "OPENSSL_CONF", "HOSTALIASES"}) {
        variables.emplace_back(name, "/nonsense");
    }
    start({.method = "GET", .link = link_});
    expectResponse(200, 0);
    expectEnd();
}

} // namespace
