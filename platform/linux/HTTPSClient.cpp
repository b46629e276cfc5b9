#include "platform/linux/HTTPSClient.h"

#include "base/Concat.h"
#include "base/NotCopied.h"
#include "platform/HTTPSession.h"
#include "platform/linux/LocalConnection.h"
#include "wire/HTTPMessages.h"

#include <cerrno>
#include <csignal>
#include <fcntl.h>
#include <poll.h>
#include <spawn.h>
#include <string_view>
#include <sys/socket.h>
#include <sys/syscall.h>
#include <sys/wait.h>
#include <system_error>
#include <unistd.h>
#include <utility>

namespace platform {

namespace {

/// How long a program may take to end by itself once it was hung up on.
constexpr int kEndMilliseconds = 1000;

/// What a program is started with.
class SpawnSettings : private base::NotCopied {
  public:
    explicit SpawnSettings(int connection) {
        ::posix_spawn_file_actions_init(&actions_);
        // Also clears close-on-exec where the descriptor has that number already.
        ::posix_spawn_file_actions_adddup2(&actions_, connection, wire::kHTTPConnectionDescriptor);
        ::posix_spawn_file_actions_addopen(&actions_, STDIN_FILENO, "/dev/null", O_RDONLY, 0);
        ::posix_spawn_file_actions_addclosefrom_np(&actions_, wire::kHTTPConnectionDescriptor + 1);
        // What this thread blocks and what this process ignores is not for the program.
        sigset_t signals;
        ::sigemptyset(&signals);
        ::posix_spawnattr_init(&attributes_);
        ::posix_spawnattr_setsigmask(&attributes_, &signals);
        ::sigaddset(&signals, SIGPIPE);
        ::posix_spawnattr_setsigdefault(&attributes_, &signals);
        ::posix_spawnattr_setflags(&attributes_, POSIX_SPAWN_SETSIGMASK | POSIX_SPAWN_SETSIGDEF);
    }
    ~SpawnSettings() {
        ::posix_spawn_file_actions_destroy(&actions_);
        ::posix_spawnattr_destroy(&attributes_);
    }

    /// An errno value, or 0.
    [[nodiscard]] int spawn(pid_t& process, const std::vector<std::string>& arguments) const {
        std::vector<char*> words;
        words.reserve(arguments.size() + 1);
        for (const std::string& argument : arguments) {
            // Nothing writes to them; the function is older than const.
            words.push_back(const_cast<char*>(argument.c_str()));
        }
        words.push_back(nullptr);
        char* const environment[] = {nullptr};
        return ::posix_spawn(&process, words[0], &actions_, &attributes_, words.data(),
                             environment);
    }

  private:
    posix_spawn_file_actions_t actions_{};
    posix_spawnattr_t attributes_{};
};

bool endsByItself(pid_t process) {
    // The C library's own declaration is not for C++.
    const base::FileDescriptor ended(static_cast<int>(::syscall(SYS_pidfd_open, process, 0)));
    pollfd watched{ended.get(), POLLIN, 0};
    int ready = -1;
    do {
        ready = ended.isOpen() ? ::poll(&watched, 1, kEndMilliseconds) : 0;
    } while (ready < 0 && errno == EINTR);
    return ready > 0;
}

} // namespace

std::optional<ConnectedProgram> ConnectedProgram::start(const std::vector<std::string>& arguments,
                                                        int& error) {
    int ends[2];
    if (::socketpair(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0, ends) != 0) {
        error = errno;
        return std::nullopt;
    }
    base::FileDescriptor ours(ends[0]);
    const base::FileDescriptor theirs(ends[1]);
    pid_t process = -1;
    error = SpawnSettings(theirs.get()).spawn(process, arguments);
    if (error != 0) {
        return std::nullopt;
    }
    return ConnectedProgram(process, std::move(ours));
}

ConnectedProgram::ConnectedProgram(ConnectedProgram&& other) noexcept
    : process_(std::exchange(other.process_, -1)), connection_(std::move(other.connection_)) {}

ConnectedProgram::~ConnectedProgram() {
    // This is what asks it to end.
    connection_.reset();
    if (process_ < 0) {
        return;
    }
    if (!endsByItself(process_)) {
        ::kill(process_, SIGKILL);
    }
    while (::waitpid(process_, nullptr, 0) < 0 && errno == EINTR) {
    }
}

namespace {

Error unreachable(std::string_view path, std::string_view reason) {
    return {kTransportErrorDomain, kCannotConnect,
            base::concat("cannot connect: no HTTPS client at ", path, ": ", reason)};
}

std::string wordsFor(int error) {
    return std::generic_category().message(error);
}

} // namespace

Result<HTTPSClient> HTTPSClient::reach(const RemoteHTTPOptions& options) {
    return options.program.empty() ? connect(options) : start(options);
}

Result<HTTPSClient> HTTPSClient::start(const RemoteHTTPOptions& options) {
    int error = 0;
    auto program = ConnectedProgram::start(options.program, error);
    if (!program) {
        return unreachable(options.program.front(), wordsFor(error));
    }
    wire::HTTPConnection connection(program->takeConnection(), options.silenceLimit,
                                    options.stopDescriptor());
    return HTTPSClient(std::move(program), std::move(connection));
}

Result<HTTPSClient> HTTPSClient::connect(const RemoteHTTPOptions& options) {
    LocalConnection reached = connectLocally(options.socket, SOCK_STREAM, options.silenceLimit);
    if (reached.stranger) {
        return unreachable(options.socket,
                           base::concat("it is served by user ", *reached.stranger));
    }
    if (reached.error != 0) {
        return unreachable(options.socket, wordsFor(reached.error));
    }
    return HTTPSClient(std::nullopt,
                       wire::HTTPConnection(std::move(reached.socket), options.silenceLimit,
                                            options.stopDescriptor()));
}

} // namespace platform
