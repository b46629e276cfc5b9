#pragma once

#include "base/NotCopied.h"
#include "platform/Link.h"
#include "platform/Result.h"

#include <cstddef>
#include <cstdint>
#include <functional>
#include <map>
#include <memory>
#include <optional>
#include <string>
#include <string_view>

namespace platform {

/// How the evaluation of a server's certificate ended. Any other value than these two is a refusal.
enum class TrustResult : std::uint32_t {
    proceed = 1,
    unspecified = 4,
    recoverableFailure = 5,
};

/// The certificate that a server has shown, for the host that was asked for.
class ServerTrust : private base::NotCopied {
  public:
    virtual ~ServerTrust() = default;

    /// Checks the chain, the dates and the host's name against this machine's trust anchors, as one
    /// verdict.
    [[nodiscard]] virtual TrustResult evaluate() = 0;
};

/// Says that a server may be trusted: made from the trust that was evaluated.
struct ServerTrustCredential {
    const ServerTrust* trust = nullptr;
};

inline constexpr char kServerTrustMethod[] = "ServerTrust";

/// A question that a server's answer raises.
struct AuthenticationChallenge {
    /// kServerTrustMethod, or a method that this system does not answer itself.
    std::string method;
    /// How often this question was answered before, without success.
    int previousFailureCount = 0;
    /// With kServerTrustMethod only; lasts until the completion is called.
    ServerTrust* trust = nullptr;
    /// The host of the link, as a certificate must name it.
    std::string host = {};
};

enum class ChallengeDisposition {
    /// Go on with the credential that comes with it. Without one that is made from the challenge's
    /// own trust this is as cancel.
    useCredential,
    /// Do as a session without a delegate does: trust what the evaluation trusts.
    performDefaultHandling,
    /// End the request with a transport error.
    cancel,
};

using ChallengeCompletion =
    std::function<void(ChallengeDisposition, std::optional<ServerTrustCredential>)>;

class HTTPSessionDelegate : private base::NotCopied {
  public:
    virtual ~HTTPSessionDelegate() = default;

    /// Called on a thread of the session, which waits for the completion. It may be called on any
    /// thread. Only its first call counts; when its last copy is gone without one, the challenge is
    /// cancelled.
    virtual void didReceiveChallenge(const AuthenticationChallenge& challenge,
                                     const ChallengeCompletion& completion) = 0;
};

/// A body that is given piece by piece. Called on a thread of the session.
class HTTPBody : private base::NotCopied {
  public:
    virtual ~HTTPBody() = default;

    /// Of the whole body. Stays as it is.
    [[nodiscard]] virtual std::uint64_t size() const = 0;

    /// The next 1 to `most` bytes, which last until the next call. None when they cannot be had:
    /// the request then ends with kTransferFailed. Not called once all bytes are given.
    [[nodiscard]] virtual std::string_view next(std::size_t most) = 0;
};

struct HTTPRequest {
    /// "GET" or "POST".
    std::string method;
    /// None is answered like a link of an unknown scheme.
    std::optional<Link> link;
    /// Of a "POST". Must last until the completion was called.
    std::string_view body = {};
    /// Of a "GET": an answer with a longer body is a transport error.
    std::size_t maximumAnswerSize = 1024UL * 1024;
    /// Takes the place of `body`, and must last as long.
    HTTPBody* pieces = nullptr;

    [[nodiscard]] std::uint64_t bodySize() const {
        return pieces != nullptr ? pieces->size() : body.size();
    }
};

struct HTTPResponse {
    /// None when what answered did not speak HTTP.
    std::optional<int> status;
    /// What kind of response it is, for messages.
    std::string className;
};

/// How a request ended: an error, or a response with its body. That of the answer to a "POST" is
/// never given: once the header of the final answer has come, nothing that befalls its body is an
/// error. (As long as a document is not out, an answer that accepts it must be whole to count.)
struct HTTPReply {
    /// Domain kTransportErrorDomain.
    std::optional<Error> error;
    std::optional<HTTPResponse> response;
    std::string body;
};

/// Codes of kTransportErrorDomain. A link that is missing, names no host, or is not of the schemes
/// "http" and "https" (in any letter case), is kUnsupportedLink with the description
/// "unsupported URL"; no connection is made.
inline constexpr std::int64_t kUnsupportedLink = 1;
inline constexpr std::int64_t kCannotConnect = 2;
inline constexpr std::int64_t kTimedOut = 3;
inline constexpr std::int64_t kTrustRefused = 4;
inline constexpr std::int64_t kAnswerTooLarge = 5;
inline constexpr std::int64_t kTransferFailed = 6;

using HTTPCompletion = std::function<void(const HTTPReply&)>;

/// Requests that share headers and a delegate, and nothing else: no cookies, caches or credentials
/// are kept.
///
/// Redirects are not followed: the answer is what the first server says. How long a request may
/// take depends on its method and its size only (platform/host/HTTPRequests.h); what takes longer
/// ends it with kTimedOut. No header is sent but Host, Content-Length (with a body) and the
/// session's own.
class HTTPSession : private base::NotCopied {
  public:
    /// Waits for the end of the requests that were started; their completions are called before.
    virtual ~HTTPSession() = default;

    /// Starts a request and returns at once. `completion` is called once, on a thread of the
    /// session, which must not destroy the session.
    virtual void start(const HTTPRequest& request, HTTPCompletion completion) = 0;
};

/// Makes sessions. May be called from any thread.
class HTTPSessions : private base::NotCopied {
  public:
    virtual ~HTTPSessions() = default;

    /// A session whose requests carry `headers`. A delegate that is gone is as none: the session
    /// then trusts what the evaluation trusts.
    [[nodiscard]] virtual std::unique_ptr<HTTPSession>
    makeEphemeral(const std::map<std::string, std::string>& headers,
                  std::weak_ptr<HTTPSessionDelegate> delegate) = 0;
};

} // namespace platform
