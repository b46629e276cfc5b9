// What goes over the wire: requests, answers, and what the environment may not change about them.

#include "tests/platform/https/HTTPTransferFixture.h"
#include "tests/platform/linux/OpenDescriptors.h"
#include "tests/support/EnvironmentVariable.h"
#include "tests/support/UnusedPort.h"

#include <fcntl.h>
#include <fstream>
#include <future>
#include <malloc.h>

namespace {

using platform::HTTPOptions;
using platform::HTTPReply;
using platform::HTTPRequest;
using support::acceptingDelegate;
using support::Collector;
using support::EnvironmentVariable;
using support::get;
using support::outcomeOf;
using support::post;
using support::transfer;

class HTTPTransferTest : public support::HTTPTransferFixture {};

TEST_F(HTTPTransferTest, EveryStatusIsGivenAsItIsAndNoRedirectFollowed) {
    control("header Location: /elsewhere");
    for (const int status : {199, 200, 201, 204, 299, 300, 301, 302, 303, 304, 307,
                             308, 400, 401, 407, 413, 429, 500, 503, 599, 999}) {
        control(base::concat("status ", status));
        EXPECT_EQ(outcomeOf(getIt()), std::to_string(status));
        EXPECT_EQ(outcomeOf(postIt("x")), std::to_string(status));
    }
    EXPECT_EQ(collector_.connectionCount(), 42U);

    control("reset");
    control("fault interim-first");
    control("body hallo");
    const HTTPReply reply = getIt();
    EXPECT_EQ(outcomeOf(reply), "200") << "an interim answer is not the answer";
    EXPECT_EQ(reply.body, "hallo");
}

TEST_F(HTTPTransferTest, HeaderBlockHoldsNothingElse) {
    const std::string host = base::concat("Host: 127.0.0.1:", collector_.port());
    using Lines = std::vector<std::string>;
    EXPECT_EQ(outcomeOf(getIt()), "200");
    EXPECT_EQ(collector_.lastHead(),
              (Lines{"GET /2/kst HTTP/1.1", host, "User-Agent: kstd/1.0", ""}));
    for (const std::size_t size : {0UL, 1UL, 1024UL * 1024 + 1}) {
        EXPECT_EQ(outcomeOf(postIt(std::string(size, 'x'))), "200");
        EXPECT_EQ(collector_.lastHead(),
                  (Lines{"POST /2/kst HTTP/1.1", host, "User-Agent: kstd/1.0",
                         base::concat("Content-Length: ", size), ""}));
    }
    std::string withUser = collector_.link("/%28null%29/(null)?a=b&c#part");
    withUser.insert(withUser.find("127"), "user:secret@");
    EXPECT_EQ(outcomeOf(getFrom(withUser)), "200");
    EXPECT_EQ(collector_.lastHead(),
              (Lines{"GET /%28null%29/(null)?a=b&c HTTP/1.1", host, "User-Agent: kstd/1.0", ""}));
    EXPECT_EQ(outcomeOf(transfer(get(link()), {.options = options()})), "200");
    EXPECT_EQ(collector_.lastHead(), (Lines{"GET /2/kst HTTP/1.1", host, ""}));
}

TEST_F(HTTPTransferTest, CookiesAreNotSentBack) {
    control("header Set-Cookie: a=b; Path=/");
    const platform::HTTPTransferSettings settings{.options = options()};
    for (int i = 1; i <= 2; ++i) {
        EXPECT_EQ(outcomeOf(transfer(get(link()), settings)), "200");
        EXPECT_EQ(collector_.lastHead().size(), 3U) << "request line, host, empty line";
    }
}

TEST_F(HTTPTransferTest, LargeDocumentArrivesWhole) {
    std::string document;
    for (int i = 0; document.size() < 5'000'000; ++i) {
        base::append(document, i);
        document.push_back(static_cast<char>(i));
    }
    EXPECT_EQ(outcomeOf(postIt(document)), "200");
    EXPECT_TRUE(collector_.body(1) == document);
}

TEST_F(HTTPTransferTest, BodyIsBoundedHoweverItIsFramed) {
    constexpr std::size_t kLimit = 100'000;
    HTTPRequest request = get(link());
    request.maximumAnswerSize = kLimit;
    for (const char* framing : {"length", "chunked", "close"}) {
        SCOPED_TRACE(framing);
        control(base::concat("framing ", framing));
        for (const std::size_t size : {std::size_t{0}, kLimit - 1, kLimit, kLimit + 1}) {
            control(base::concat("body-size ", size));
            const HTTPReply reply = fetch(request);
            EXPECT_EQ(outcomeOf(reply), size > kLimit ? "transport 5" : "200");
            EXPECT_EQ(reply.body.size(), size > kLimit ? 0 : size);
        }
    }
    control("fault endless-body");
    EXPECT_EQ(outcomeOf(fetch(request)), "transport 5");
    request.maximumAnswerSize = 0;
    EXPECT_EQ(outcomeOf(fetch(request)), "transport 5");
}

TEST_F(HTTPTransferTest, EnvironmentChangesNothing) {
    const support::UnusedPort unused;
    const std::string proxy = base::concat("http://127.0.0.1:", unused.number());
    const std::string elsewhere = collector_.certificate("nothing");
    const std::string keys = collector_.certificate("keys");
    const EnvironmentVariable variables[] = {
        {"http_proxy", proxy},       {"https_proxy", proxy},        {"HTTPS_PROXY", proxy},
        {"ALL_PROXY", proxy},        {"all_proxy", proxy},          {"SSL_CERT_FILE", elsewhere},
        {"SSL_CERT_DIR", elsewhere}, {"CURL_CA_BUNDLE", elsewhere}, {"SSLKEYLOGFILE", keys}};
    EXPECT_EQ(outcomeOf(getIt()), "200");
    EXPECT_EQ(std::ifstream(keys).get(), std::ifstream::traits_type::eof());
    Collector plain(Collector::Protocol::http);
    EXPECT_EQ(outcomeOf(getFrom(plain.link("/"))), "200");

    const EnvironmentVariable file("SSL_CERT_FILE", collector_.authority());
    const EnvironmentVariable bundle("CURL_CA_BUNDLE", collector_.authority());
    HTTPOptions others;
    others.trustAnchors = collector_.certificate("self-signed.pem");
    EXPECT_EQ(outcomeOf(transfer(get(link()), {.options = others})), "transport 4");
}

TEST_F(HTTPTransferTest, SchemesInCapitalsAndWithoutTLS) {
    std::string loud = link();
    EXPECT_EQ(outcomeOf(getFrom(loud.replace(0, 5, "HTTPS"))), "200");
    Collector plain(Collector::Protocol::http);
    const auto delegate = acceptingDelegate();
    EXPECT_EQ(outcomeOf(getFrom(plain.link("/"), delegate)), "200");
    EXPECT_EQ(outcomeOf(getFrom(plain.link("/").replace(0, 4, "HTTP"), delegate)), "200");
    EXPECT_EQ(delegate->challenges(), 0);
    EXPECT_EQ(outcomeOf(getFrom(base::concat("http://127.0.0.1:", collector_.port()))),
              "transport 6")
        << "TLS where none is asked for";
    EXPECT_EQ(outcomeOf(getFrom("https://127.0.0.1:65536/")), "transport 1") << "no such port";
}

struct Usage {
    std::size_t descriptors = support::countOpenDescriptors();
    std::size_t threads = static_cast<std::size_t>(
        std::distance(std::filesystem::directory_iterator("/proc/self/task"), {}));
    std::size_t memory = ::mallinfo2().uordblks;
};

TEST_F(HTTPTransferTest, NothingIsLeftBehind) {
    control("body-size 100000");
    const std::string document(100'000, 'd');
    const auto round = [&] {
        EXPECT_EQ(outcomeOf(postIt(document)), "200");
        EXPECT_EQ(outcomeOf(getFrom("http://127.0.0.1:1/")), "transport 2");
    };
    for (int i = 0; i < 10; ++i) {
        round();
    }
    const Usage before;
    for (int i = 0; i < 50; ++i) {
        round();
    }
    const Usage after;
    EXPECT_EQ(after.descriptors, before.descriptors);
    EXPECT_EQ(after.threads, before.threads);
    EXPECT_LT(after.memory, before.memory + 50'000) << "less than a thousandth of what was moved";
}

TEST_F(HTTPTransferTest, ConnectionsAreClosedInProgramsThatAreStarted) {
    control("hold");
    auto reply = std::async(std::launch::async, [this] { return getIt(); });
    control("await-requests 1");
    int connections = 0;
    for (int descriptor = 3; descriptor < 100; ++descriptor) {
        int family = 0;
        socklen_t size = sizeof family;
        if (::getsockopt(descriptor, SOL_SOCKET, SO_DOMAIN, &family, &size) == 0 &&
            family == AF_INET) {
            ++connections;
            EXPECT_NE(::fcntl(descriptor, F_GETFD) & FD_CLOEXEC, 0);
        }
    }
    EXPECT_EQ(connections, 1);
    control("release");
    EXPECT_EQ(outcomeOf(reply.get()), "200");
}

} // namespace
