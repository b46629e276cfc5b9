#pragma once

#include "base/Concat.h"
#include "tests/support/Program.h"
#include "wire/HTTPConnection.h"

#include <fcntl.h>
#include <optional>
#include <stdexcept>
#include <string>
#include <sys/socket.h>
#include <unistd.h>
#include <utility>
#include <vector>

namespace support {

/// kstd-https with that descriptor of the test as its descriptor 3; -1 gives it none. A shell puts
/// it there and becomes the program.
class ClientProgram {
  public:
    explicit ClientProgram(int descriptor, const std::vector<std::string>& options = {})
        : program_(commandLine(descriptor, options)) {}

    [[nodiscard]] Program& program() { return program_; }

  private:
    [[nodiscard]] static std::vector<std::string>
    commandLine(int descriptor, const std::vector<std::string>& options) {
        const std::string from = descriptor < 0 ? "-" : std::to_string(descriptor);
        std::vector<std::string> words = {"/bin/bash", "-c",
                                          base::concat("exec \"$0\" \"$@\" 3<&", from), KSTD_HTTPS};
        words.insert(words.end(), options.begin(), options.end());
        return words;
    }

    Program program_;
};

/// kstd-https and the daemon's end of its connection.
class ConnectedClient {
  public:
    explicit ConnectedClient(const std::vector<std::string>& options = {})
        : ConnectedClient(ends(), options) {}

    [[nodiscard]] wire::HTTPConnection& connection() { return *connection_; }
    void hangUp() { connection_.reset(); }

    /// The exit status of the program.
    [[nodiscard]] std::optional<int> awaitEnd() { return client_.program().awaitEnd(); }
    [[nodiscard]] pid_t pid() { return client_.program().pid(); }
    [[nodiscard]] const std::vector<std::string>& lines() { return client_.program().lines(); }

  private:
    using Ends = std::pair<base::FileDescriptor, base::FileDescriptor>;

    ConnectedClient(Ends ends, const std::vector<std::string>& options)
        : client_(ends.second.get(), options),
          connection_(std::in_place, std::move(ends.first), kPatience) {}

    /// Ours, which programs that are started do not get, and theirs.
    [[nodiscard]] static Ends ends() {
        int numbers[2] = {-1, -1};
        if (::socketpair(AF_UNIX, SOCK_STREAM, 0, numbers) != 0) {
            throw std::runtime_error("no connection");
        }
        ::fcntl(numbers[0], F_SETFD, FD_CLOEXEC);
        return {base::FileDescriptor(numbers[0]), base::FileDescriptor(numbers[1])};
    }

    ClientProgram client_;
    std::optional<wire::HTTPConnection> connection_;
};

} // namespace support
