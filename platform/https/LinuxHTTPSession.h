#pragma once

#include "platform/HTTPSession.h"
#include "platform/host/RequestThreads.h"
#include "platform/https/HTTPTransfer.h"

#include <map>
#include <memory>
#include <string>

namespace platform {

/// A session of LinuxHTTPSessions. Requests may be started from any thread; theirs take no signals.
///
/// When no thread can be made for a request, its completion is called before `start` returns.
class LinuxHTTPSession final : public HTTPSession {
  public:
    LinuxHTTPSession(std::map<std::string, std::string> headers,
                     std::weak_ptr<HTTPSessionDelegate> delegate, const LinuxHTTPOptions& options);

    void start(const HTTPRequest& request, HTTPCompletion completion) override;

  private:
    HTTPTransferSettings settings_;
    /// Last, because its threads use the rest until they end.
    RequestThreads threads_;
};

} // namespace platform
