#include "platform/linux/RemoteHTTPSession.h"

#include "platform/host/HTTPRequestCheck.h"
#include "platform/linux/HTTPSClient.h"

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

} // namespace

void RemoteHTTPSession::start(const HTTPRequest& request, HTTPCompletion completion) {
    if (!threads_.start([this, request, completion] { completion(replyTo(request, settings_)); })) {
        completion(failedReply(kTransferFailed, "no thread for the request"));
    }
}

} // namespace platform
