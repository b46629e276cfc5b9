#include "tests/neighbours/Daemon.h"

#include "base/Concat.h"
#include "tests/neighbours/Random.h"

#include <algorithm>
#include <array>
#include <csignal>
#include <cstdlib>
#include <fcntl.h>
#include <filesystem>
#include <fstream>
#include <iterator>
#include <malloc.h>
#include <sys/prctl.h>
#include <sys/wait.h>
#include <unistd.h>
#include <utility>

namespace neighbours {

namespace {

constexpr int kFirstHandedDescriptor = 3;
constexpr int kPipeSize = 1 << 20;
constexpr std::size_t kNewest = 40;
/// A line's text, the dots of one that was cut, and its name.
constexpr std::size_t kLongestLine = 8192 + 64;

[[noreturn]] void become(const std::vector<std::string>& arguments, int eventSocket, int output) {
    ::prctl(PR_SET_PDEATHSIG, SIGKILL);
    ::dup2(output, STDOUT_FILENO);
    ::dup2(output, STDERR_FILENO);
    if (eventSocket >= 0) {
        // A duplicate onto itself would keep close-on-exec.
        const int copy = ::fcntl(eventSocket, F_DUPFD, kFirstHandedDescriptor + 1);
        ::dup2(copy, kFirstHandedDescriptor);
        ::close(copy);
        ::setenv("LISTEN_FDS", "1", 1);
        ::setenv("LISTEN_FDNAMES", "events", 1);
        ::setenv("LISTEN_PID", std::to_string(::getpid()).c_str(), 1);
    }
    std::vector<char*> words;
    words.reserve(arguments.size() + 1);
    for (const std::string& argument : arguments) {
        words.push_back(const_cast<char*>(argument.c_str()));
    }
    words.push_back(nullptr);
    ::execv(words[0], words.data());
    ::_exit(127);
}

} // namespace

Footprint Footprint::of(pid_t process) {
    const std::string directory = "/proc/" + std::to_string(process);
    const std::filesystem::directory_iterator entries(directory + "/fd");
    Footprint found{.descriptors =
                        static_cast<std::size_t>(std::distance(begin(entries), end(entries)))};
    std::ifstream rollup(directory + "/smaps_rollup");
    for (std::string word; rollup >> word;) {
        std::size_t kilobytes = 0;
        if (word == "Private_Dirty:" && rollup >> kilobytes) {
            found.kilobytes += kilobytes;
        }
    }
    return found;
}

Footprint Footprint::ofThis() {
    Footprint found = of(::getpid());
    const auto heap = ::mallinfo2();
    found.kilobytes = (heap.uordblks + heap.hblkhd) / 1024;
    return found;
}

Daemon::Daemon(const std::vector<std::string>& arguments, int eventSocket, std::string ready)
    : ready_(std::move(ready)) {
    int ends[2];
    require(::pipe2(ends, O_CLOEXEC) == 0, "no pipe");
    output_ = base::FileDescriptor(ends[0]);
    const base::FileDescriptor theirs(ends[1]);
    ::fcntl(ends[0], F_SETPIPE_SZ, kPipeSize);
    ::fcntl(ends[0], F_SETFL, O_NONBLOCK);
    process_ = ::fork();
    if (process_ == 0) {
        become(arguments, eventSocket, theirs.get());
    }
    require(process_ > 0, "no process");
}

Daemon::~Daemon() {
    if (!hasEnded_) {
        ::kill(process_, SIGKILL);
        ::waitpid(process_, nullptr, 0);
    }
}

void Daemon::listen() {
    std::array<char, 65536> buffer;
    ssize_t length = 0;
    while ((length = ::read(output_.get(), buffer.data(), buffer.size())) > 0) {
        std::string_view left(buffer.data(), static_cast<std::size_t>(length));
        for (auto end = left.find('\n'); end != std::string_view::npos; end = left.find('\n')) {
            if (partial_.empty()) {
                take(left.substr(0, end));
            } else {
                partial_ += left.substr(0, end);
                take(partial_);
                partial_.clear();
            }
            left.remove_prefix(end + 1);
        }
        partial_ += left;
    }
}

void Daemon::take(std::string_view line) {
    ++lines_;
    isReady_ = isReady_ || line.ends_with(ready_);
    newest_.emplace_back(line.substr(0, 400));
    if (newest_.size() > kNewest) {
        newest_.pop_front();
    }
    const bool isPlain = std::all_of(line.begin(), line.end(), [](char character) {
        const auto byte = static_cast<unsigned char>(character);
        return byte >= 0x20 && byte != 0x7f;
    });
    require(isPlain, "a line with a control character in it");
    require(line.size() <= kLongestLine, base::concat("a line of ", line.size(), " bytes"));
}

bool Daemon::runs() {
    int status = 0;
    if (!hasEnded_ && ::waitpid(process_, &status, WNOHANG) == process_) {
        hasEnded_ = true;
        ending_ = WIFEXITED(status) ? base::concat("status ", WEXITSTATUS(status))
                                    : base::concat("signal ", WTERMSIG(status));
        listen();
    }
    return !hasEnded_;
}

void Daemon::ask() const {
    ::kill(process_, SIGTERM);
}

} // namespace neighbours
