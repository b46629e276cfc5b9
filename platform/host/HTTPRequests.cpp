#include "platform/host/HTTPRequests.h"

#include "base/Concat.h"
#include "base/NotCopied.h"

#include <algorithm>
#include <condition_variable>
#include <mutex>
#include <string_view>
#include <utility>

namespace platform {

namespace {

bool equalsInAnyCase(std::string_view text, std::string_view lowerCase) {
    return std::equal(
        text.begin(), text.end(), lowerCase.begin(), lowerCase.end(), [](char c, char lower) {
            return c == lower ||
                   (c >= 'A' && c <= 'Z' && static_cast<char>(c - 'A' + 'a') == lower);
        });
}

bool namesHost(std::string_view afterScheme) {
    constexpr std::string_view kBeforeHost = "://";
    return afterScheme.substr(0, kBeforeHost.size()) == kBeforeHost &&
           afterScheme.size() > kBeforeHost.size() &&
           std::string_view("/?#:@").find(afterScheme[kBeforeHost.size()]) ==
               std::string_view::npos;
}

bool isSupported(const Link& link) {
    const std::string_view scheme = link.scheme();
    return (equalsInAnyCase(scheme, "http") || equalsInAnyCase(scheme, "https")) &&
           namesHost(std::string_view(link.text).substr(scheme.size()));
}

} // namespace

HTTPReply failedReply(std::int64_t code, std::string description) {
    return {Error{kTransportErrorDomain, code, std::move(description)}, std::nullopt, {}};
}

std::optional<HTTPReply> refusalOf(const HTTPRequest& request) {
    if (!request.link || !isSupported(*request.link)) {
        return failedReply(kUnsupportedLink, "unsupported URL");
    }
    if (request.method != "GET" && request.method != "POST") {
        return failedReply(kTransferFailed, base::concat("unsupported method ", request.method));
    }
    return std::nullopt;
}

bool isSecure(const Link& link) {
    return equalsInAnyCase(link.scheme(), "https");
}

std::string describeTooLarge(std::size_t limit) {
    return base::concat("answer longer than ", limit, " bytes");
}

namespace {

/// The first of what several threads may say.
class FirstOutcome {
  public:
    void offer(ChallengeOutcome outcome) {
        {
            const std::lock_guard lock(mutex_);
            if (outcome_) {
                return;
            }
            outcome_ = outcome;
        }
        decided_.notify_all();
    }

    [[nodiscard]] ChallengeOutcome wait() {
        std::unique_lock lock(mutex_);
        decided_.wait(lock, [this] { return outcome_.has_value(); });
        return *outcome_;
    }

  private:
    std::mutex mutex_;
    std::condition_variable decided_;
    std::optional<ChallengeOutcome> outcome_;
};

/// Refuses when nobody can answer any more.
class PendingAnswer : private base::NotCopied {
  public:
    PendingAnswer(std::shared_ptr<FirstOutcome> outcome, const AuthenticationChallenge& challenge)
        : outcome_(std::move(outcome)), trust_(challenge.trust) {}
    ~PendingAnswer() { outcome_->offer(ChallengeOutcome::refused); }

    void answer(ChallengeDisposition disposition,
                const std::optional<ServerTrustCredential>& credential) {
        switch (disposition) {
        case ChallengeDisposition::useCredential:
            outcome_->offer(credential && credential->trust == trust_ ? ChallengeOutcome::accepted
                                                                      : ChallengeOutcome::refused);
            return;
        case ChallengeDisposition::performDefaultHandling:
            outcome_->offer(ChallengeOutcome::leftToEvaluation);
            return;
        case ChallengeDisposition::cancel:
            break;
        }
        outcome_->offer(ChallengeOutcome::refused);
    }

  private:
    std::shared_ptr<FirstOutcome> outcome_;
    const ServerTrust* trust_;
};

ChallengeCompletion completionFor(const std::shared_ptr<FirstOutcome>& outcome,
                                  const AuthenticationChallenge& challenge) {
    return [pending = std::make_shared<PendingAnswer>(outcome, challenge)](
               ChallengeDisposition disposition, std::optional<ServerTrustCredential> credential) {
        pending->answer(disposition, credential);
    };
}

} // namespace

ChallengeOutcome askDelegate(const std::weak_ptr<HTTPSessionDelegate>& delegate,
                             const AuthenticationChallenge& challenge) {
    const auto outcome = std::make_shared<FirstOutcome>();
    if (const auto asked = delegate.lock()) {
        asked->didReceiveChallenge(challenge, completionFor(outcome, challenge));
    } else {
        return ChallengeOutcome::leftToEvaluation;
    }
    return outcome->wait();
}

} // namespace platform
