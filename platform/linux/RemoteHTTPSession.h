#pragma once

#include "platform/HTTPSession.h"
#include "platform/host/RequestThreads.h"
#include "platform/linux/RemoteHTTPExchange.h"

#include <utility>

namespace platform {

/// A session of RemoteHTTPSessions. Requests may be started from any thread.
///
/// When no thread can be made for a request, its completion is called before `start` returns.
class RemoteHTTPSession final : public HTTPSession {
  public:
    explicit RemoteHTTPSession(RemoteHTTPSettings settings) : settings_(std::move(settings)) {}

    void start(const HTTPRequest& request, HTTPCompletion completion) override;

  private:
    RemoteHTTPSettings settings_;
    /// Last, because its threads use the rest until they end.
    RequestThreads threads_;
};

} // namespace platform
