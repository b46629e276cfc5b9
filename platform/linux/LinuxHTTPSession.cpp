#include "platform/linux/LinuxHTTPSession.h"

#include "platform/shared/HTTPRequestCheck.h"

#include <csignal>
#include <utility>

namespace platform {

namespace {

/// Threads made while this lasts take no signals: those of the process are for its main thread,
/// and that of a broken connection must not end it.
class SignalsBlocked {
  public:
    SignalsBlocked() {
        sigset_t all;
        ::sigfillset(&all);
        ::pthread_sigmask(SIG_SETMASK, &all, &before_);
    }
    SignalsBlocked(const SignalsBlocked&) = delete;
    SignalsBlocked& operator=(const SignalsBlocked&) = delete;
    ~SignalsBlocked() { ::pthread_sigmask(SIG_SETMASK, &before_, nullptr); }

  private:
    sigset_t before_{};
};

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
    const SignalsBlocked blocked;
    if (!threads_.start([this, request, completion] { completion(replyTo(request, settings_)); })) {
        completion(failedReply(kTransferFailed, "no thread for the request"));
    }
}

} // namespace platform
