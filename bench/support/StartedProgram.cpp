#include "bench/support/StartedProgram.h"

#include "bench/support/SystemError.h"

#include <array>
#include <csignal>
#include <fcntl.h>
#include <spawn.h>
#include <stdexcept>
#include <sys/wait.h>
#include <unistd.h>

namespace bench {

namespace {

std::vector<char*> pointersTo(const std::vector<std::string>& words) {
    std::vector<char*> pointers;
    for (const std::string& word : words) {
        pointers.push_back(const_cast<char*>(word.c_str()));
    }
    pointers.push_back(nullptr);
    return pointers;
}

} // namespace

StartedProgram::StartedProgram(const std::vector<std::string>& arguments) {
    int ends[2] = {-1, -1};
    if (::pipe2(ends, O_CLOEXEC) != 0) {
        throw systemError("cannot make a pipe");
    }
    output_ = base::FileDescriptor(ends[0]);
    const base::FileDescriptor writing(ends[1]);
    posix_spawn_file_actions_t actions;
    ::posix_spawn_file_actions_init(&actions);
    ::posix_spawn_file_actions_adddup2(&actions, writing.get(), STDOUT_FILENO);
    ::posix_spawn_file_actions_adddup2(&actions, writing.get(), STDERR_FILENO);
    const int problem = ::posix_spawn(&pid_, arguments.front().c_str(), &actions, nullptr,
                                      pointersTo(arguments).data(), ::environ);
    ::posix_spawn_file_actions_destroy(&actions);
    if (problem != 0) {
        throw std::system_error(problem, std::generic_category(),
                                "cannot start " + arguments.front());
    }
}

StartedProgram::~StartedProgram() {
    ::kill(pid_, SIGKILL);
    ::waitpid(pid_, nullptr, 0);
}

void StartedProgram::awaitText(std::string_view text) {
    while (written_.find(text) == std::string::npos) {
        std::array<char, 4096> buffer;
        const ssize_t length = ::read(output_.get(), buffer.data(), buffer.size());
        if (length <= 0) {
            throw std::runtime_error("a program ended before it was ready, it wrote: " + written_);
        }
        written_.append(buffer.data(), static_cast<std::size_t>(length));
    }
}

} // namespace bench
