#pragma once

#include "platform/fake/FakeHTTPSessions.h"
#include "platform/shared/RequestThreads.h"

#include <map>
#include <memory>
#include <string>

namespace platform {

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
