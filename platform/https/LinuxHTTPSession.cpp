#include "platform/https/LinuxHTTPSession.h"

#include "platform/host/HTTPRequestCheck.h"

#include <utility>

namespace platform {

namespace {

HTTPReply replyTo(const HTTPRequest& request, const HTTPTransferSettings& settings) {
    if (auto refusal = refusalOf(request)) {
        return *std::move(refusal);
    }
    return HTTPTransfer(request, settings).perform();
}

} // namespace

LinuxHTTPSession::LinuxHTTPSession(std::map<std::string, std::string> headers,
                                   std::weak_ptr<HTTPSessionDelegate> delegate,
                                   const LinuxHTTPOptions& options)
    : settings_{std::move(headers), std::move(delegate), options} {}

void LinuxHTTPSession::start(const HTTPRequest& request, HTTPCompletion completion) {
    if (!threads_.start([this, request, completion] { completion(replyTo(request, settings_)); })) {
        completion(failedReply(kTransferFailed, "no thread for the request"));
    }
}

} // namespace platform
