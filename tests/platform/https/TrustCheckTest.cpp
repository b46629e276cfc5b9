// Which servers are trusted, and what the delegate changes about that.

#include "tests/platform/https/HTTPTransferFixture.h"

#include <filesystem>
#include <fstream>

namespace {

using platform::ChallengeDisposition;
using platform::HTTPReply;
using platform::TrustResult;
using support::acceptingDelegate;
using support::answeringDelegate;
using support::get;
using support::outcomeOf;
using support::ScriptedDelegate;

class TrustCheckTest : public support::HTTPTransferFixture {
  protected:
    [[nodiscard]] HTTPReply getWithAnchors(const std::string& anchors,
                                           const Delegate& delegate = nullptr) {
        return support::transfer(get(link()), {.delegate = delegate, .options = {anchors}});
    }
};

TEST_F(TrustCheckTest, WhatIsWrongWithACertificateIsOneVerdict) {
    const struct {
        const char* name;
        const char* finding;
    } kCases[] = {
        {"expired", "certificate has expired"},
        {"not-yet-valid", "certificate is not yet valid"},
        {"self-signed", "self-signed certificate"},
        {"wrong-name", "IP address mismatch"},
        {"unknown-issuer", "unable to get local issuer certificate"},
        {"client-only", "unsuitable certificate purpose"},
    };
    for (const auto& [name, finding] : kCases) {
        SCOPED_TRACE(name);
        control(base::concat("certificate ", name));
        const std::string refusal = base::concat("server not trusted: ", finding);
        for (const auto& delegate :
             {Delegate(), Delegate(answeringDelegate(ChallengeDisposition::cancel)),
              Delegate(answeringDelegate(ChallengeDisposition::performDefaultHandling))}) {
            const HTTPReply reply = getIt(delegate);
            EXPECT_EQ(reply.error, (platform::Error{platform::kTransportErrorDomain,
                                                    platform::kTrustRefused, refusal}));
        }
        EXPECT_EQ(outcomeOf(getIt(acceptingDelegate())), "200");
        auto result = TrustResult::proceed;
        EXPECT_EQ(outcomeOf(getIt(std::make_shared<ScriptedDelegate>(
                      [&](const auto& challenge, const auto& completion) {
                          result = challenge.trust->evaluate();
                          completion(ChallengeDisposition::useCredential,
                                     platform::ServerTrustCredential{challenge.trust});
                      }))),
                  "200")
            << "accepted although it was found bad";
        EXPECT_EQ(result, TrustResult::recoverableFailure);
    }
    control("certificate good");
    const HTTPReply reply = getIt(answeringDelegate(ChallengeDisposition::cancel));
    EXPECT_EQ(reply.error->description, "server not trusted: refused by the delegate");
    // Six times two accepted ones; no other connection came as far as a request.
    EXPECT_EQ(collector_.requestCount(), 12U);
}

TEST_F(TrustCheckTest, HostIsTheOneOfTheLink) {
    const struct {
        const char* name;
        const char* host;
        bool trusted;
    } kCases[] = {
        {"good", "127.0.0.1", true},         {"good", "localhost", true},
        {"good", "LOCALHOST", true},         {"good", "127.1", true},
        {"good", "127.0.0.2", false},        {"name-only", "localhost", true},
        {"name-only", "127.0.0.1", false},   {"address-only", "localhost", false},
        {"address-only", "127.0.0.1", true}, {"common-name", "localhost", false},
        {"wrong-name", "localhost", false},  {"wrong-name", "127.0.0.1", false},
    };
    for (const auto& [name, host, trusted] : kCases) {
        SCOPED_TRACE(base::concat(name, " for ", host));
        control(base::concat("certificate ", name));
        const std::string outcome = outcomeOf(getFrom(collector_.link("/", host)));
        if (host == std::string("127.0.0.2")) {
            EXPECT_EQ(outcome, "transport 2") << "the collector listens on one address";
        } else {
            EXPECT_EQ(outcome, trusted ? "200" : "transport 4");
        }
    }
}

TEST_F(TrustCheckTest, EveryConnectionIsCheckedAnew) {
    const auto delegate = acceptingDelegate();
    for (int i = 1; i <= 3; ++i) {
        EXPECT_EQ(outcomeOf(getIt(delegate)), "200");
        EXPECT_EQ(delegate->challenges(), i);
    }
    EXPECT_EQ(collector_.connectionCount(), 3U);
    control("certificate expired");
    EXPECT_EQ(outcomeOf(getIt()), "transport 4") << "what was good before counts for nothing";
}

TEST_F(TrustCheckTest, AnchorsAreAFileOrADirectory) {
    const std::string directory = collector_.certificate("hashed");
    std::filesystem::create_directory(directory);
    EXPECT_EQ(outcomeOf(getWithAnchors(directory)), "transport 4") << "an empty one";
    support::Program hash(
        {"/usr/bin/openssl", "x509", "-noout", "-hash", "-in", collector_.authority()});
    ASSERT_EQ(hash.awaitEnd(), 0);
    std::filesystem::copy_file(collector_.authority(),
                               base::concat(directory, '/', hash.lines().at(0), ".0"));
    EXPECT_EQ(outcomeOf(getWithAnchors(directory)), "200");

    const std::string file = collector_.certificate("bundle");
    const std::string note = base::concat(" (no trust anchors in ", file, ')');
    for (const char* content : {"", "rubbish\n"}) {
        std::ofstream(file) << content;
        const HTTPReply reply = getWithAnchors(file);
        EXPECT_EQ(reply.error->code, platform::kTrustRefused);
        EXPECT_TRUE(reply.error->description.ends_with(note)) << reply.error->description;
        EXPECT_EQ(outcomeOf(getWithAnchors(file, acceptingDelegate())), "200");
    }
    std::filesystem::remove(file);
    EXPECT_TRUE(getWithAnchors(file).error->description.ends_with(note));
    control("certificate self-signed");
    EXPECT_EQ(outcomeOf(getWithAnchors(collector_.certificate("self-signed.pem"))), "200")
        << "an anchor of its own";
}

} // namespace
