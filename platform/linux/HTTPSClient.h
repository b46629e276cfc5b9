#pragma once

#include "platform/Result.h"
#include "platform/linux/ConnectedProgram.h"
#include "platform/linux/RemoteHTTPSessions.h"
#include "wire/HTTPConnection.h"

#include <optional>
#include <utility>

namespace platform {

/// A running HTTPS client and the connection to it, for one request. At its end it is hung up on,
/// and, if it was started from here, waited for.
class HTTPSClient {
  public:
    /// An error is kCannotConnect.
    [[nodiscard]] static Result<HTTPSClient> reach(const RemoteHTTPOptions& options);

    [[nodiscard]] wire::HTTPConnection& connection() { return connection_; }

  private:
    HTTPSClient(std::optional<ConnectedProgram> program, wire::HTTPConnection connection)
        : program_(std::move(program)), connection_(std::move(connection)) {}

    [[nodiscard]] static Result<HTTPSClient> start(const RemoteHTTPOptions& options);
    [[nodiscard]] static Result<HTTPSClient> connect(const RemoteHTTPOptions& options);

    std::optional<ConnectedProgram> program_;
    /// Last, because a program ends when it is hung up on.
    wire::HTTPConnection connection_;
};

} // namespace platform
