#pragma once

#include "platform/HTTPSession.h"
#include "platform/host/HTTPRequests.h"
#include "platform/linux/StopRequest.h"

#include <chrono>
#include <map>
#include <memory>
#include <string>
#include <vector>

namespace platform {

/// How a program reaches the HTTPS client, which is a program of its own: docs/https-process.md.
struct RemoteHTTPOptions {
    /// The socket behind which the init system starts one for each connection.
    std::string socket = {};
    /// The client's path and its arguments, to be started for each request. It then takes the place
    /// of the socket.
    std::vector<std::string> program = {};
    /// How long it may say nothing. It says something every second while it works, so this is not
    /// a limit on servers.
    std::chrono::milliseconds silenceLimit = std::chrono::seconds(30);
    /// What it keeps by itself, and how long after them a request is ended from here, whatever it
    /// says.
    HTTPLimits limits = {};
    std::chrono::milliseconds grace = std::chrono::seconds(5);
    /// Ends requests, with kTransferFailed, that have no answer yet, and each that is started
    /// later. It outlives the sessions.
    const StopRequest* stop = nullptr;

    [[nodiscard]] bool mustStop() const { return stop != nullptr && stop->isMade(); }
    /// For poll.
    [[nodiscard]] int stopDescriptor() const { return stop != nullptr ? stop->descriptor() : -1; }
};

/// HTTP and HTTPS through another process, so that this one has no code for either: of what comes
/// from the network it sees a status and bytes, up to the request's limit. What the client is made
/// of, and what servers it trusts, stands in platform/https/HTTPTransfer.h.
///
/// When the client cannot be reached, or runs as another user than root or this process's, a
/// request ends with kCannotConnect; when it is silent or takes too long, with kTimedOut; when it
/// ends too early or breaks the rules of the connection, with kTransferFailed. A link or headers
/// that do not fit into a message are kTransferFailed, too.
class RemoteHTTPSessions final : public HTTPSessions {
  public:
    explicit RemoteHTTPSessions(RemoteHTTPOptions options) : options_(std::move(options)) {}

    [[nodiscard]] std::unique_ptr<HTTPSession>
    makeEphemeral(const std::map<std::string, std::string>& headers,
                  std::weak_ptr<HTTPSessionDelegate> delegate) override;

  private:
    RemoteHTTPOptions options_;
};

} // namespace platform
