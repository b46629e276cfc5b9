#include "tests/kstctl/RunProgram.h"

#include "tests/support/TemporaryDirectory.h"

#include <cerrno>
#include <cstdlib>
#include <fcntl.h>
#include <fstream>
#include <grp.h>
#include <iterator>
#include <pty.h>
#include <sys/prctl.h>
#include <sys/wait.h>
#include <unistd.h>

namespace kstctl {

namespace {

struct Descriptors {
    int in = -1;
    int out = -1;
    int err = -1;
};

int madeFile(const std::string& path) {
    return ::open(path.c_str(), O_RDWR | O_CREAT | O_TRUNC | O_CLOEXEC, 0600);
}

std::string content(const std::string& path) {
    std::ifstream file(path, std::ios::binary);
    return {std::istreambuf_iterator<char>(file), {}};
}

void becomeUser(uid_t user) {
    if (::setgroups(0, nullptr) != 0 || ::setgid(user) != 0 || ::setuid(user) != 0) {
        ::_exit(126);
    }
}

[[noreturn]] void become(const std::vector<std::string>& arguments, const RunOptions& options,
                         const Descriptors& descriptors) {
    ::prctl(PR_SET_PDEATHSIG, SIGKILL);
    ::dup2(descriptors.in, STDIN_FILENO);
    ::dup2(descriptors.out, STDOUT_FILENO);
    ::dup2(descriptors.err, STDERR_FILENO);
    for (const std::string& variable : options.environment) {
        ::putenv(const_cast<char*>(variable.c_str()));
    }
    // The directories above the program may be closed to the other user.
    const int program = ::open(KSTCTL, O_RDONLY | O_CLOEXEC);
    if (options.user) {
        becomeUser(*options.user);
    }
    std::vector<char*> words{const_cast<char*>(KSTCTL)};
    for (const std::string& argument : arguments) {
        words.push_back(const_cast<char*>(argument.c_str()));
    }
    words.push_back(nullptr);
    ::fexecve(program, words.data(), environ);
    ::_exit(127);
}

int awaitEnd(pid_t program) {
    int status = 0;
    while (::waitpid(program, &status, 0) < 0 && errno == EINTR) {
    }
    return WIFEXITED(status) ? WEXITSTATUS(status) : 128 + WTERMSIG(status);
}

/// Everything that is written to a terminal until nobody has it open any more.
std::string readTerminal(int terminal) {
    std::string text;
    char buffer[4096];
    ssize_t length = 0;
    while ((length = ::read(terminal, buffer, sizeof buffer)) > 0) {
        text.append(buffer, static_cast<std::size_t>(length));
    }
    return text;
}

} // namespace

Ran runKstctl(const std::vector<std::string>& arguments, const RunOptions& options) {
    const support::TemporaryDirectory directory;
    std::ofstream(directory.file("in"), std::ios::binary) << options.input;
    const std::string outPath = options.outputFile.value_or(directory.file("out"));
    Descriptors descriptors{.in = ::open(directory.file("in").c_str(), O_RDONLY | O_CLOEXEC),
                            .out = options.outputFile
                                       ? ::open(outPath.c_str(), O_WRONLY | O_CLOEXEC)
                                       : madeFile(outPath),
                            .err = madeFile(directory.file("err"))};
    int terminal = -1;
    if (options.onTerminal) {
        ::close(descriptors.in);
        ::close(descriptors.out);
        winsize size{};
        size.ws_col = options.columns;
        if (::openpty(&terminal, &descriptors.out, nullptr, nullptr, &size) != 0) {
            return {};
        }
        ::fcntl(terminal, F_SETFD, FD_CLOEXEC);
        ::fcntl(descriptors.out, F_SETFD, FD_CLOEXEC);
        descriptors.in = ::fcntl(descriptors.out, F_DUPFD_CLOEXEC, 0);
    }
    const pid_t program = ::fork();
    if (program == 0) {
        become(arguments, options, descriptors);
    }
    ::close(descriptors.in);
    ::close(descriptors.out);
    ::close(descriptors.err);
    Ran ran;
    if (options.onTerminal) {
        ran.out = readTerminal(terminal);
        ::close(terminal);
    }
    ran.status = awaitEnd(program);
    ran.err = content(directory.file("err"));
    if (!options.onTerminal && !options.outputFile) {
        ran.out = content(outPath);
    }
    return ran;
}

} // namespace kstctl
