#pragma once

#include "base/Concat.h"
#include "platform/HTTPSession.h"

#include <atomic>
#include <functional>
#include <map>
#include <memory>
#include <string>
#include <utility>
#include <vector>

namespace support {

/// A delegate that does what the test says, and counts.
class ScriptedDelegate final : public platform::HTTPSessionDelegate {
  public:
    using Script = std::function<void(const platform::AuthenticationChallenge&,
                                      const platform::ChallengeCompletion&)>;

    explicit ScriptedDelegate(Script script) : script_(std::move(script)) {}

    void didReceiveChallenge(const platform::AuthenticationChallenge& challenge,
                             const platform::ChallengeCompletion& completion) override {
        ++challenges_;
        script_(challenge, completion);
    }

    [[nodiscard]] int challenges() const { return challenges_; }

  private:
    Script script_;
    std::atomic<int> challenges_{0};
};

/// A delegate that accepts every server, asked or not.
[[nodiscard]] inline std::shared_ptr<ScriptedDelegate> acceptingDelegate() {
    return std::make_shared<ScriptedDelegate>([](const auto& challenge, const auto& completion) {
        completion(platform::ChallengeDisposition::useCredential,
                   platform::ServerTrustCredential{challenge.trust});
    });
}

[[nodiscard]] inline std::shared_ptr<ScriptedDelegate>
answeringDelegate(platform::ChallengeDisposition disposition) {
    return std::make_shared<ScriptedDelegate>(
        [disposition](const auto& /*challenge*/, const auto& completion) {
            completion(disposition, std::nullopt);
        });
}

/// Counts the calls of completions and keeps the last reply.
class ReplyKeeper {
  public:
    [[nodiscard]] platform::HTTPCompletion completion() {
        return [this](const platform::HTTPReply& reply) {
            reply_ = reply;
            ++calls_;
        };
    }

    [[nodiscard]] int calls() const { return calls_; }
    /// To be read when the session is gone.
    [[nodiscard]] const platform::HTTPReply& reply() const { return reply_; }

  private:
    platform::HTTPReply reply_;
    std::atomic<int> calls_{0};
};

[[nodiscard]] inline platform::HTTPRequest get(const std::string& link) {
    return {"GET", platform::Link{link}, {}};
}

/// The body must last until the request has ended.
[[nodiscard]] inline platform::HTTPRequest post(const std::string& link, std::string_view body) {
    return {"POST", platform::Link{link}, body};
}

/// The reply to a request on a session of its own. A completion that is not called exactly once
/// shows as an error of another domain.
[[nodiscard]] inline platform::HTTPReply
fetch(platform::HTTPSessions& sessions, const platform::HTTPRequest& request,
      const std::shared_ptr<platform::HTTPSessionDelegate>& delegate = nullptr) {
    ReplyKeeper keeper;
    sessions.makeEphemeral({{"User-Agent", "kstd/1.0"}}, delegate)
        ->start(request, keeper.completion());
    if (keeper.calls() != 1) {
        return {platform::Error{"test", keeper.calls(), "completions"}, std::nullopt, {}};
    }
    return keeper.reply();
}

/// A reply in one word or two: "200", "no HTTP", or "transport 4".
[[nodiscard]] inline std::string outcomeOf(const platform::HTTPReply& reply) {
    if (reply.error) {
        return base::concat(reply.error->domain, ' ', reply.error->code);
    }
    if (!reply.response || !reply.response->status) {
        return "no HTTP";
    }
    return std::to_string(*reply.response->status);
}

} // namespace support
