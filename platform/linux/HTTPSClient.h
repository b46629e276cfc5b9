#pragma once

#include "base/FileDescriptor.h"
#include "platform/Result.h"
#include "platform/linux/RemoteHTTPSessions.h"
#include "wire/HTTPConnection.h"

#include <chrono>
#include <optional>
#include <string>
#include <sys/types.h>
#include <utility>
#include <vector>

namespace platform {

/// A program that was started with one end of a connection, as its descriptor
/// wire::kHTTPConnectionDescriptor. It gets nothing else of this process but standard output and
/// standard error: its standard input and its environment are empty, and it takes signals as a
/// program does that a shell has started.
class ConnectedProgram {
  public:
    /// Starts the program at the path `arguments[0]`. None, with `error` an errno value, when it
    /// cannot be started.
    [[nodiscard]] static std::optional<ConnectedProgram>
    start(const std::vector<std::string>& arguments, int& error);

    ConnectedProgram(ConnectedProgram&& other) noexcept;
    ConnectedProgram& operator=(ConnectedProgram&&) = delete;
    /// Waits for the program's end for a little while and kills it then. It should have been hung
    /// up on before.
    ~ConnectedProgram();

    /// This process's end of the connection, a stream socket. Once.
    [[nodiscard]] base::FileDescriptor takeConnection() { return std::move(connection_); }

  private:
    ConnectedProgram(pid_t process, base::FileDescriptor connection)
        : process_(process), connection_(std::move(connection)) {}

    pid_t process_;
    base::FileDescriptor connection_;
};

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
