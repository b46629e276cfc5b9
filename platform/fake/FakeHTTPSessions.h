#pragma once

#include "platform/HTTPSession.h"
#include "platform/host/RequestThreads.h"

#include <condition_variable>
#include <cstddef>
#include <cstdint>
#include <deque>
#include <map>
#include <memory>
#include <mutex>
#include <optional>
#include <string>
#include <utility>
#include <vector>

namespace platform {

/// A request as it was started.
struct FakeHTTPRequest {
    std::string method;
    std::optional<Link> link;
    std::string body;
    std::size_t maximumAnswerSize = 0;
    /// Whether the body could be had to its end; if not, the request fails.
    bool isWhole = true;
    /// Those of its session.
    std::map<std::string, std::string> headers;
    /// Whether the server got it and answered.
    bool arrived = false;
};

/// What a server makes the delegate decide before it answers.
struct FakeHTTPChallenge {
    std::string method = kServerTrustMethod;
    int previousFailureCount = 0;
    /// What the evaluation of the server's trust gives, with kServerTrustMethod.
    TrustResult trust = TrustResult::unspecified;
};

/// What a request gets.
struct FakeHTTPAnswer {
    /// A body that is longer than the request allows becomes kAnswerTooLarge.
    HTTPReply reply;
    /// Raised by links of "https"; by others too when its method is not kServerTrustMethod. None
    /// when it does not come to that.
    std::optional<FakeHTTPChallenge> challenge = FakeHTTPChallenge{};
    /// The request stands still until `release`, challenge and all.
    bool held = false;
    /// The completion is called a second time right after the first, against its contract.
    bool completesTwice = false;
    /// The completion is kept for `completeLate`.
    bool completesLate = false;

    [[nodiscard]] static FakeHTTPAnswer status(int status, std::string body = {});
    /// Without a challenge.
    [[nodiscard]] static FakeHTTPAnswer failure(std::int64_t code, std::string description);
    /// From something that does not speak HTTP.
    [[nodiscard]] static FakeHTTPAnswer notHTTP(std::string className);

    /// The same with another challenge.
    [[nodiscard]] FakeHTTPAnswer with(FakeHTTPChallenge other) &&;
};

/// Sessions whose servers are a script. Requests run on threads of their own, as real ones do.
///
/// An answer that was pushed serves one request, whichever comes next; without one, the answer that
/// was set for the request's method and link serves. Where nothing is set nobody listens
/// (kCannotConnect). A link that no session supports is refused without a look at the script, but
/// is recorded.
///
/// All members may be called from any thread. The sessions must not outlive it.
class FakeHTTPSessions final : public HTTPSessions {
  public:
    [[nodiscard]] std::unique_ptr<HTTPSession>
    makeEphemeral(const std::map<std::string, std::string>& headers,
                  std::weak_ptr<HTTPSessionDelegate> delegate) override;

    void setAnswer(const std::string& method, const std::string& link, FakeHTTPAnswer answer);
    void pushAnswer(FakeHTTPAnswer answer);

    /// Every request so far, in the order in which they were started.
    [[nodiscard]] std::vector<FakeHTTPRequest> requests() const;
    [[nodiscard]] std::size_t sessionCount() const;

    /// Waits until this many requests were started.
    void awaitRequests(std::size_t count);
    /// Lets the held requests go, and all later ones.
    void release();
    /// Calls the completions that were kept once more, also of sessions that are gone, on the
    /// caller's thread.
    void completeLate();

  private:
    friend class FakeHTTPSession;

    /// A request's place in `requests_`, and what it gets.
    struct Taken {
        std::size_t number;
        FakeHTTPAnswer answer;
    };

    [[nodiscard]] Taken take(FakeHTTPRequest request);
    [[nodiscard]] FakeHTTPAnswer answerTo(const FakeHTTPRequest& request);
    void noteArrival(std::size_t number);
    void waitForRelease();
    void keep(HTTPCompletion completion, HTTPReply reply);

    mutable std::mutex mutex_;
    std::condition_variable changed_;
    std::map<std::pair<std::string, std::string>, FakeHTTPAnswer> answers_;
    std::deque<FakeHTTPAnswer> pushed_;
    std::vector<FakeHTTPRequest> requests_;
    std::vector<std::pair<HTTPCompletion, HTTPReply>> kept_;
    std::size_t sessionCount_ = 0;
    bool released_ = false;
};

/// A session of FakeHTTPSessions.
class FakeHTTPSession final : public HTTPSession {
  public:
    FakeHTTPSession(FakeHTTPSessions& script, std::map<std::string, std::string> headers,
                    std::weak_ptr<HTTPSessionDelegate> delegate);

    void start(const HTTPRequest& request, HTTPCompletion completion) override;

  private:
    void run(const HTTPRequest& request, const FakeHTTPSessions::Taken& taken,
             const HTTPCompletion& completion);
    [[nodiscard]] HTTPReply replyTo(const HTTPRequest& request,
                                    const FakeHTTPSessions::Taken& taken);
    [[nodiscard]] bool passes(const FakeHTTPChallenge& challenge, const Link& link) const;

    FakeHTTPSessions& script_;
    std::map<std::string, std::string> headers_;
    std::weak_ptr<HTTPSessionDelegate> delegate_;
    /// Last, because its threads use the rest until they end.
    RequestThreads threads_;
};

} // namespace platform
