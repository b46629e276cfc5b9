#pragma once

#include "platform/HTTPSession.h"

#include <chrono>
#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <string_view>

namespace platform {

/// How long the parts of a request may take; what takes longer ends it with kTimedOut. Who talks to
/// the server keeps them, and who waits for its answer makes sure.
struct HTTPLimits {
    using Time = std::chrono::milliseconds;

    /// Each full so many bytes of a document are given as long again as the first.
    static constexpr std::uint64_t kSendingStep = 4UL * 1024 * 1024;

    /// From the start of a request to the end of the TLS handshake, a delegate's time to answer
    /// included.
    Time connecting = std::chrono::seconds(30);
    /// The whole of a "GET".
    Time fetching = std::chrono::seconds(60);
    /// From there on to the last byte of a "POST", with each full step of its body.
    Time sending = std::chrono::seconds(60);
    /// From there on to the end of the header of its answer.
    Time answering = std::chrono::seconds(60);

    [[nodiscard]] Time toSend(std::uint64_t bodySize) const {
        return sending * static_cast<Time::rep>(1 + bodySize / kSendingStep);
    }

    /// The whole of a request.
    [[nodiscard]] Time whole(std::string_view method, std::uint64_t bodySize) const {
        return method == "POST" ? connecting + toSend(bodySize) + answering : fetching;
    }
};

/// A reply that is only an error.
[[nodiscard]] HTTPReply failedReply(std::int64_t code, std::string description);

/// Why a request is not even tried: its link is none, or is not one of "http" or "https" (in any
/// letter case) that names a host, or its method is unknown. None when it is to be tried.
[[nodiscard]] std::optional<HTTPReply> refusalOf(const HTTPRequest& request);

/// Whether a supported link is one of "https".
[[nodiscard]] bool isSecure(const Link& link);

/// The description of kAnswerTooLarge.
[[nodiscard]] std::string describeTooLarge(std::size_t limit);

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
