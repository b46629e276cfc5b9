#pragma once

#include "platform/HTTPSession.h"

#include <memory>

namespace platform {

/// Whether a session without a delegate goes on.
[[nodiscard]] constexpr bool isTrusted(TrustResult result) {
    return result == TrustResult::proceed || result == TrustResult::unspecified;
}

/// What becomes of a challenge.
enum class ChallengeOutcome {
    accepted,
    /// Nobody decided: the evaluation does.
    leftToEvaluation,
    refused,
};

/// Asks the delegate and waits for its first answer, on whichever thread that comes. It is refused
/// when the last copy of the completion is gone without a call, and when the delegate wants to use
/// a credential that is not made from the trust in question. A delegate that is gone leaves it to
/// the evaluation.
///
/// Calls of the completion after the first do nothing, however late they come.
[[nodiscard]] ChallengeOutcome askDelegate(const std::weak_ptr<HTTPSessionDelegate>& delegate,
                                           const AuthenticationChallenge& challenge);

} // namespace platform
