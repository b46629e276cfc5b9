#include "platform/linux/RemoteHTTPSessions.h"

#include "base/Concat.h"
#include "platform/host/HTTPRequests.h"
#include "platform/host/RequestThreads.h"
#include "platform/linux/HTTPSClient.h"
#include "platform/linux/RemoteHTTPExchange.h"

#include <exception>
#include <utility>

namespace platform {

namespace {

HTTPReply replyTo(const HTTPRequest& request, const RemoteHTTPSettings& settings) {
    if (auto refusal = refusalOf(request)) {
        return *std::move(refusal);
    }
    if (settings.options.mustStop()) {
        return failedReply(kTransferFailed, kStoppedDescription);
    }
    Result<HTTPSClient> client = HTTPSClient::reach(settings.options);
    if (!client) {
        return {client.error(), std::nullopt, {}};
    }
    HTTPSClient reached = std::move(client).value();
    return RemoteHTTPExchange(reached.connection(), request, settings).perform();
}

/// On a thread nobody else catches what memory that has ended throws.
HTTPReply replyOrReason(const HTTPRequest& request, const RemoteHTTPSettings& settings) {
    try {
        return replyTo(request, settings);
    } catch (const std::exception& error) {
        return failedReply(kTransferFailed, base::concat("transfer failed: ", error.what()));
    }
}

/// A session of RemoteHTTPSessions. Requests may be started from any thread.
///
/// When no thread can be made for a request, its completion is called before `start` returns.
class RemoteHTTPSession final : public HTTPSession {
  public:
    explicit RemoteHTTPSession(RemoteHTTPSettings settings) : settings_(std::move(settings)) {}

    void start(const HTTPRequest& request, HTTPCompletion completion) override {
        if (!threads_.start(
                [this, request, completion] { completion(replyOrReason(request, settings_)); })) {
            completion(failedReply(kTransferFailed, "no thread for the request"));
        }
    }

  private:
    RemoteHTTPSettings settings_;
    /// Last, because its threads use the rest until they end.
    RequestThreads threads_;
};

} // namespace

std::unique_ptr<HTTPSession>
RemoteHTTPSessions::makeEphemeral(const std::map<std::string, std::string>& headers,
                                  std::weak_ptr<HTTPSessionDelegate> delegate) {
    return std::make_unique<RemoteHTTPSession>(
        RemoteHTTPSettings{headers, std::move(delegate), options_});
}

} // namespace platform
