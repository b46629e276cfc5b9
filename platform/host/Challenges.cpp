#include "platform/host/Challenges.h"

#include <condition_variable>
#include <mutex>
#include <utility>

namespace platform {

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
class PendingAnswer {
  public:
    PendingAnswer(std::shared_ptr<FirstOutcome> outcome, const AuthenticationChallenge& challenge)
        : outcome_(std::move(outcome)), trust_(challenge.trust) {}
    PendingAnswer(const PendingAnswer&) = delete;
    PendingAnswer& operator=(const PendingAnswer&) = delete;
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
