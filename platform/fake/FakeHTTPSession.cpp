#include "platform/fake/FakeHTTPSession.h"

#include "platform/shared/Challenges.h"
#include "platform/shared/HTTPRequestCheck.h"

#include <string>
#include <string_view>
#include <utility>

namespace platform {

namespace {

class FakeServerTrust final : public ServerTrust {
  public:
    explicit FakeServerTrust(TrustResult result) : result_(result) {}

    [[nodiscard]] TrustResult evaluate() override { return result_; }

  private:
    TrustResult result_;
};

bool isRaised(const std::optional<FakeHTTPChallenge>& challenge, const Link& link) {
    return challenge && (isSecure(link) || challenge->method != kServerTrustMethod);
}

std::string hostOf(const Link& link) {
    constexpr std::string_view kBeforeHost = "://";
    const std::string_view text(link.text);
    const std::string_view place = text.substr(text.find(kBeforeHost) + kBeforeHost.size());
    return std::string(place.substr(0, place.find_first_of(":/?#")));
}

} // namespace

FakeHTTPSession::FakeHTTPSession(FakeHTTPSessions& script,
                                 std::map<std::string, std::string> headers,
                                 std::weak_ptr<HTTPSessionDelegate> delegate)
    : script_(script), headers_(std::move(headers)), delegate_(std::move(delegate)) {}

void FakeHTTPSession::start(const HTTPRequest& request, HTTPCompletion completion) {
    FakeHTTPSessions::Taken taken =
        script_.take({request.method, request.link, std::string(request.body),
                      request.maximumAnswerSize, headers_});
    if (!threads_.start([this, request, taken = std::move(taken), completion] {
            run(request, taken, completion);
        })) {
        completion(failedReply(kTransferFailed, "no thread for the request"));
    }
}

void FakeHTTPSession::run(const HTTPRequest& request, const FakeHTTPSessions::Taken& taken,
                          const HTTPCompletion& completion) {
    if (taken.answer.held) {
        script_.waitForRelease();
    }
    const HTTPReply reply = replyTo(request, taken);
    if (taken.answer.completesLate) {
        script_.keep(completion, reply);
    }
    completion(reply);
    if (taken.answer.completesTwice) {
        completion(reply);
    }
}

HTTPReply FakeHTTPSession::replyTo(const HTTPRequest& request,
                                   const FakeHTTPSessions::Taken& taken) {
    const FakeHTTPAnswer& answer = taken.answer;
    if (request.link && isRaised(answer.challenge, *request.link) &&
        !passes(*answer.challenge, *request.link)) {
        return failedReply(kTrustRefused, "server not trusted");
    }
    if (answer.reply.response) {
        script_.noteArrival(taken.number);
    }
    if (request.method == "POST") {
        return {answer.reply.error, answer.reply.response, {}};
    }
    if (answer.reply.body.size() > request.maximumAnswerSize) {
        return failedReply(kAnswerTooLarge, describeTooLarge(request.maximumAnswerSize));
    }
    return answer.reply;
}

bool FakeHTTPSession::passes(const FakeHTTPChallenge& challenge, const Link& link) const {
    FakeServerTrust trust(challenge.trust);
    const bool isTrust = challenge.method == kServerTrustMethod;
    switch (askDelegate(delegate_, {challenge.method, challenge.previousFailureCount,
                                    isTrust ? &trust : nullptr, hostOf(link)})) {
    case ChallengeOutcome::accepted:
        return true;
    case ChallengeOutcome::refused:
        return false;
    case ChallengeOutcome::leftToEvaluation:
        break;
    }
    return !isTrust || isTrusted(trust.evaluate());
}

} // namespace platform
