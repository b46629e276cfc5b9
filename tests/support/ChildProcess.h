#pragma once

#include <functional>
#include <sys/wait.h>
#include <unistd.h>

namespace support {

/// Runs `inChild` in a copy of this process and returns what it returned; -1 when it was killed.
inline int exitStatusOfChild(const std::function<int()>& inChild) {
    const pid_t child = ::fork();
    if (child == 0) {
        ::_exit(inChild());
    }
    int status = 0;
    ::waitpid(child, &status, 0);
    return WIFEXITED(status) ? WEXITSTATUS(status) : -1;
}

} // namespace support
