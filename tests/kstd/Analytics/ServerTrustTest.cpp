#include "tests/kstd/Analytics/LoggerFixture.h"
#include "tests/support/HostWith.h"

#include <cstdio>

namespace kstd {
namespace {

using platform::AuthenticationChallenge;
using platform::ChallengeDisposition;
using platform::TrustResult;
using Lines = std::vector<std::string>;

class ScriptedTrust final : public platform::ServerTrust {
  public:
    explicit ScriptedTrust(TrustResult result) : result_(result) {}
    [[nodiscard]] TrustResult evaluate() override {
        ++evaluations;
        return result_;
    }

    int evaluations = 0;

  private:
    TrustResult result_;
};

const Lines kChallenged = {"info: Splunk upload challenge"};
const Lines kForced = {"info: Splunk upload challenge", "info: Force Accepting Splunk Credential"};

class ServerTrustTest : public LoggerFixture {
  protected:
    void challenge(const AuthenticationChallenge& challenge) {
        disposition.reset();
        logger().didReceiveChallenge(challenge, [this](auto given, const auto& credential) {
            EXPECT_FALSE(disposition) << "completed twice";
            disposition = given;
            trusted = credential ? credential->trust : nullptr;
        });
    }

    std::optional<ChallengeDisposition> disposition;
    const platform::ServerTrust* trusted = nullptr;
};

struct Verdict {
    int result;
    bool accepted;
};

TEST_F(ServerTrustTest, TheEvaluationDecides) {
    logger();
    for (const Verdict& verdict : {Verdict{0, false},
                                   {1, true},
                                   {2, false},
                                   {3, false},
                                   {4, true},
                                   {5, false},
                                   {6, false},
                                   {7, false}}) {
        SCOPED_TRACE(verdict.result);
        ScriptedTrust trust{static_cast<TrustResult>(verdict.result)};
        challenge({platform::kServerTrustMethod, 0, &trust});
        EXPECT_EQ(disposition, verdict.accepted ? ChallengeDisposition::useCredential
                                                : ChallengeDisposition::cancel);
        EXPECT_EQ(trusted, verdict.accepted ? &trust : nullptr);
        EXPECT_EQ(trust.evaluations, 1);
        EXPECT_EQ(takeLines(), kChallenged);
    }
}

TEST_F(ServerTrustTest, InsecureServersAreAcceptedWhenThatIsAllowed) {
    logger().setAllowsInsecureSplunkCert(true);
    for (const int result : {0, 1, 3, 4, 5}) {
        SCOPED_TRACE(result);
        ScriptedTrust trust{static_cast<TrustResult>(result)};
        challenge({platform::kServerTrustMethod, 0, &trust});
        EXPECT_EQ(disposition, ChallengeDisposition::useCredential);
        EXPECT_EQ(trusted, &trust);
        EXPECT_EQ(trust.evaluations, 1);
        EXPECT_EQ(takeLines(), kForced);
    }
}

TEST_F(ServerTrustTest, AChallengeThatFailedBeforeIsCancelled) {
    logger().setAllowsInsecureSplunkCert(true);
    for (const char* const method : {platform::kServerTrustMethod, "Basic"}) {
        for (const int failures : {1, 2, 1000}) {
            ScriptedTrust trust{TrustResult::unspecified};
            challenge({method, failures, &trust});
            EXPECT_EQ(disposition, ChallengeDisposition::cancel) << method << failures;
            EXPECT_EQ(trusted, nullptr);
            EXPECT_EQ(trust.evaluations, 0);
            EXPECT_EQ(takeLines(), kChallenged);
        }
    }
}

TEST_F(ServerTrustTest, OtherMethodsAreHandledByDefault) {
    logger().setAllowsInsecureSplunkCert(true);
    for (const char* const method : {"Basic", "", "servertrust"}) {
        challenge({method, 0, nullptr});
        EXPECT_EQ(disposition, ChallengeDisposition::performDefaultHandling) << method;
        EXPECT_EQ(trusted, nullptr);
        EXPECT_EQ(takeLines(), kChallenged);
    }
}

TEST_F(ServerTrustTest, NothingWaitsForTheQueue) {
    ScriptedTrust trust{TrustResult::unspecified};
    onQueue([&] { challenge({platform::kServerTrustMethod, 0, &trust}); });
    EXPECT_EQ(disposition, ChallengeDisposition::useCredential);
}

/// A log whose lines outlive the process.
class StandardErrorLog final : public platform::SystemLog {
  public:
    void write(platform::LogLevel /*level*/, std::string_view text,
               const platform::LogFields& /*fields*/) override {
        std::fprintf(stderr, "%.*s", static_cast<int>(text.size()), text.data());
    }
};

TEST_F(ServerTrustTest, MissingCompletionStopsTheProcess) {
    ScriptedTrust trust{TrustResult::unspecified};
    EXPECT_DEATH(
        {
            StandardErrorLog log;
            TestLogger::logger(support::hostWith(fake.host(), {.log = &log}))
                ->didReceiveChallenge({platform::kServerTrustMethod, 0, &trust}, nullptr);
        },
        "kstd: AssertMacros: completion \\(value: 0x0\\),  file: "
        "kstd/Analytics/KSTDAnalyticsLogger:[0-9]+");
}

/// One request through a session, which asks its delegate.
TEST_F(ServerTrustTest, RefusedServerFailsTheUpload) {
    configureUploadLink();
    fake.https.setAnswer("POST", kUploadLink,
                         platform::FakeHTTPAnswer::status(200).with(
                             {platform::kServerTrustMethod, 0, TrustResult::recoverableFailure}));
    logger();
    EXPECT_FALSE(logger().forceUploadWithError());
    EXPECT_EQ(takeLines(),
              (Lines{"info: Splunk upload start", "info: Splunk upload challenge",
                     "error: Error in uploading the events to splunk: server not trusted"}));
    logger().setAllowsInsecureSplunkCert(true);
    EXPECT_TRUE(logger().forceUploadWithError());
}

TEST_F(ServerTrustTest, TheBagsServerIsChallengedToo) {
    configureBagLink();
    fake.https.setAnswer("GET", kBagLink,
                         platform::FakeHTTPAnswer::status(200, "{}").with(
                             {platform::kServerTrustMethod, 0, TrustResult::recoverableFailure}));
    logger();
    onQueue([this] { EXPECT_EQ(logger().splunkUploadURL(), std::nullopt); });
    EXPECT_EQ(takeLines(), (Lines{"info: Splunk upload challenge",
                                  "error: Unable to fetch splunk endpoint at URL: "
                                  "https://bag.example/bag.json -- error: server not trusted"}));
}

} // namespace
} // namespace kstd
