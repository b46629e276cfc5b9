#include "platform/fake/FakeHTTPSessions.h"

#include "base/Concat.h"
#include "platform/host/HTTPRequests.h"

#include <string>
#include <string_view>
#include <utility>

namespace platform {

FakeHTTPAnswer FakeHTTPAnswer::status(int status, std::string body) {
    return {{std::nullopt, HTTPResponse{status, "HTTPResponse"}, std::move(body)}};
}

FakeHTTPAnswer FakeHTTPAnswer::failure(std::int64_t code, std::string description) {
    return {failedReply(code, std::move(description)), std::nullopt};
}

FakeHTTPAnswer FakeHTTPAnswer::notHTTP(std::string className) {
    return {{std::nullopt, HTTPResponse{std::nullopt, std::move(className)}, {}}};
}

FakeHTTPAnswer FakeHTTPAnswer::with(FakeHTTPChallenge other) && {
    challenge = std::move(other);
    return std::move(*this);
}

std::unique_ptr<HTTPSession>
FakeHTTPSessions::makeEphemeral(const std::map<std::string, std::string>& headers,
                                std::weak_ptr<HTTPSessionDelegate> delegate) {
    {
        const std::lock_guard lock(mutex_);
        ++sessionCount_;
    }
    return std::make_unique<FakeHTTPSession>(*this, headers, std::move(delegate));
}

void FakeHTTPSessions::setAnswer(const std::string& method, const std::string& link,
                                 FakeHTTPAnswer answer) {
    const std::lock_guard lock(mutex_);
    answers_[{method, link}] = std::move(answer);
}

void FakeHTTPSessions::pushAnswer(FakeHTTPAnswer answer) {
    const std::lock_guard lock(mutex_);
    pushed_.push_back(std::move(answer));
}

std::vector<FakeHTTPRequest> FakeHTTPSessions::requests() const {
    const std::lock_guard lock(mutex_);
    return requests_;
}

std::size_t FakeHTTPSessions::sessionCount() const {
    const std::lock_guard lock(mutex_);
    return sessionCount_;
}

void FakeHTTPSessions::awaitRequests(std::size_t count) {
    std::unique_lock lock(mutex_);
    changed_.wait(lock, [&] { return requests_.size() >= count; });
}

void FakeHTTPSessions::release() {
    {
        const std::lock_guard lock(mutex_);
        released_ = true;
    }
    changed_.notify_all();
}

void FakeHTTPSessions::completeLate() {
    std::vector<std::pair<HTTPCompletion, HTTPReply>> kept;
    {
        const std::lock_guard lock(mutex_);
        kept.swap(kept_);
    }
    for (const auto& [completion, reply] : kept) {
        completion(reply);
    }
}

FakeHTTPSessions::Taken FakeHTTPSessions::take(FakeHTTPRequest request) {
    const std::lock_guard lock(mutex_);
    requests_.push_back(std::move(request));
    changed_.notify_all();
    return {requests_.size() - 1, answerTo(requests_.back())};
}

FakeHTTPAnswer FakeHTTPSessions::answerTo(const FakeHTTPRequest& request) {
    if (const auto refusal = refusalOf({request.method, request.link, {}})) {
        return {*refusal, std::nullopt};
    }
    if (!pushed_.empty()) {
        FakeHTTPAnswer answer = std::move(pushed_.front());
        pushed_.pop_front();
        return answer;
    }
    const auto set = answers_.find({request.method, request.link->text});
    return set != answers_.end()
               ? set->second
               : FakeHTTPAnswer::failure(
                     kCannotConnect,
                     base::concat("cannot connect: nobody listens at ", request.link->text));
}

void FakeHTTPSessions::noteArrival(std::size_t number) {
    const std::lock_guard lock(mutex_);
    requests_[number].arrived = true;
}

void FakeHTTPSessions::waitForRelease() {
    std::unique_lock lock(mutex_);
    changed_.wait(lock, [this] { return released_; });
}

void FakeHTTPSessions::keep(HTTPCompletion completion, HTTPReply reply) {
    const std::lock_guard lock(mutex_);
    kept_.emplace_back(std::move(completion), std::move(reply));
}

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

/// As much of it as can be had.
std::string bodyOf(const HTTPRequest& request) {
    std::string body(request.body);
    while (request.pieces != nullptr && body.size() < request.pieces->size()) {
        const std::string_view piece = request.pieces->next(1000);
        if (piece.empty()) {
            break;
        }
        body.append(piece);
    }
    return body;
}

} // namespace

FakeHTTPSession::FakeHTTPSession(FakeHTTPSessions& script,
                                 std::map<std::string, std::string> headers,
                                 std::weak_ptr<HTTPSessionDelegate> delegate)
    : script_(script), headers_(std::move(headers)), delegate_(std::move(delegate)) {}

void FakeHTTPSession::start(const HTTPRequest& request, HTTPCompletion completion) {
    std::string body = bodyOf(request);
    const bool isWhole = body.size() == request.bodySize();
    FakeHTTPSessions::Taken taken = script_.take({request.method, request.link, std::move(body),
                                                  request.maximumAnswerSize, isWhole, headers_});
    if (!isWhole) {
        completion(failedReply(kTransferFailed, "transfer failed: the body cannot be read"));
        return;
    }
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
