#include "tests/support/Program.h"

#include <algorithm>
#include <cerrno>
#include <csignal>
#include <cstdlib>
#include <fcntl.h>
#include <poll.h>
#include <stdexcept>
#include <sys/prctl.h>
#include <sys/wait.h>
#include <unistd.h>

namespace support {

namespace {

using Clock = std::chrono::steady_clock;

struct Pipe {
    Pipe() {
        if (::pipe2(ends, O_CLOEXEC) != 0) {
            throw std::runtime_error("cannot make a pipe");
        }
    }

    int ends[2] = {-1, -1};
};

[[noreturn]] void become(const std::vector<std::string>& arguments, int input, int output,
                         const std::function<void()>& prepare) {
    ::prctl(PR_SET_PDEATHSIG, SIGKILL);
    if (input >= 0) {
        ::dup2(input, STDIN_FILENO);
    }
    ::dup2(output, STDOUT_FILENO);
    ::dup2(output, STDERR_FILENO);
    std::vector<char*> words;
    for (const std::string& argument : arguments) {
        words.push_back(const_cast<char*>(argument.c_str()));
    }
    words.push_back(nullptr);
    if (prepare) {
        prepare();
    }
    ::execv(words[0], words.data());
    ::_exit(127);
}

int millisecondsUntil(Clock::time_point deadline) {
    const auto left = std::chrono::ceil<std::chrono::milliseconds>(deadline - Clock::now());
    return static_cast<int>(std::max<std::int64_t>(left.count(), 0));
}

} // namespace

Program::Program(const std::vector<std::string>& arguments, Input input,
                 const std::function<void()>& prepare) {
    const Pipe output;
    int theirInput = -1;
    if (input == Input::pipe) {
        const Pipe pipe;
        theirInput = pipe.ends[0];
        input_ = pipe.ends[1];
    }
    pid_ = ::fork();
    if (pid_ == 0) {
        become(arguments, theirInput, output.ends[1], prepare);
    }
    ::close(output.ends[1]);
    output_ = output.ends[0];
    if (theirInput >= 0) {
        ::close(theirInput);
    }
}

Program::~Program() {
    if (!ended_) {
        ::kill(pid_, SIGKILL);
        ::waitpid(pid_, nullptr, 0);
    }
    ::close(output_);
    endInput();
}

void Program::writeLine(const std::string& line) const {
    const std::string whole = line + '\n';
    for (std::size_t done = 0; done < whole.size();) {
        const ssize_t written = ::write(input_, whole.data() + done, whole.size() - done);
        if (written < 0 && errno != EINTR) {
            throw std::runtime_error("a program does not read its input any more");
        }
        done += written > 0 ? static_cast<std::size_t>(written) : 0;
    }
}

void Program::endInput() {
    if (input_ >= 0) {
        ::close(input_);
        input_ = -1;
    }
}

void Program::signal(int number) const {
    ::kill(pid_, number);
}

bool Program::readMore(Clock::time_point deadline) {
    pollfd watched{output_, POLLIN, 0};
    const int ready = ::poll(&watched, 1, millisecondsUntil(deadline));
    if (ready == 0) {
        return false;
    }
    char buffer[4096];
    const ssize_t length = ::read(output_, buffer, sizeof buffer);
    if (length <= 0) {
        return length < 0 && errno == EINTR;
    }
    partial_.append(buffer, static_cast<std::size_t>(length));
    for (auto end = partial_.find('\n'); end != std::string::npos; end = partial_.find('\n')) {
        lines_.push_back(partial_.substr(0, end));
        partial_.erase(0, end + 1);
    }
    return true;
}

std::optional<std::string> Program::awaitLine(std::string_view text) {
    const auto deadline = Clock::now() + kPatience;
    for (;;) {
        while (searched_ < lines_.size()) {
            const std::string& line = lines_[searched_++];
            if (line.find(text) != std::string::npos) {
                return line;
            }
        }
        if (!readMore(deadline)) {
            return std::nullopt;
        }
    }
}

std::size_t Program::count(std::string_view text) const {
    return static_cast<std::size_t>(
        std::count_if(lines_.begin(), lines_.end(), [text](const std::string& line) {
            return line.find(text) != std::string::npos;
        }));
}

std::optional<int> Program::awaitEnd() {
    const auto deadline = Clock::now() + kPatience;
    while (readMore(deadline)) {
    }
    if (Clock::now() >= deadline) {
        return std::nullopt;
    }
    int status = 0;
    while (::waitpid(pid_, &status, 0) < 0 && errno == EINTR) {
    }
    ended_ = true;
    return WIFEXITED(status) ? WEXITSTATUS(status) : 128 + WTERMSIG(status);
}

} // namespace support
