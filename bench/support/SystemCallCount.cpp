#include "bench/support/SystemCallCount.h"

#include "bench/support/SystemError.h"

#include <csignal>
#include <exception>
#include <stdexcept>
#include <sys/ptrace.h>
#include <sys/syscall.h>
#include <sys/types.h>
#include <sys/wait.h>
#include <unistd.h>

namespace bench {

namespace {

constexpr int kSystemCallStop = SIGTRAP | 0x80;
constexpr long kMark = SYS_getppid;

[[noreturn]] void runTraced(const std::function<Work()>& prepare) {
    try {
        const Work work = prepare();
        if (::ptrace(PTRACE_TRACEME, 0, nullptr, nullptr) != 0 || ::raise(SIGSTOP) != 0) {
            ::_exit(1);
        }
        ::syscall(kMark);
        work();
        ::syscall(kMark);
        ::_exit(0);
    } catch (const std::exception&) {
        ::_exit(1);
    }
}

/// The number of the call that `child` is about to make, or below 0 when it comes back from one.
long enteredCall(pid_t child) {
    __ptrace_syscall_info info{};
    if (::ptrace(PTRACE_GET_SYSCALL_INFO, child, sizeof info, &info) < 0) {
        throw systemError("cannot look at a system call");
    }
    return info.op == PTRACE_SYSCALL_INFO_ENTRY ? static_cast<long>(info.entry.nr) : -1;
}

/// Lets the child go on to its next stop; false when it has ended.
bool step(pid_t child, int& status) {
    if (::ptrace(PTRACE_SYSCALL, child, nullptr, nullptr) != 0 ||
        ::waitpid(child, &status, 0) != child) {
        throw systemError("cannot follow the child");
    }
    return WIFSTOPPED(status);
}

SystemCalls follow(pid_t child) {
    int status = 0;
    if (::waitpid(child, &status, 0) != child || !WIFSTOPPED(status) ||
        ::ptrace(PTRACE_SETOPTIONS, child, nullptr, PTRACE_O_TRACESYSGOOD | PTRACE_O_EXITKILL) !=
            0) {
        throw std::runtime_error("cannot trace the child");
    }
    SystemCalls counts;
    int marks = 0;
    while (step(child, status)) {
        const long call = WSTOPSIG(status) == kSystemCallStop ? enteredCall(child) : -1;
        if (call == kMark) {
            ++marks;
        } else if (call >= 0 && marks == 1) {
            ++counts[call];
        }
    }
    if (marks != 2 || !WIFEXITED(status) || WEXITSTATUS(status) != 0) {
        throw std::runtime_error("the traced child failed");
    }
    return counts;
}

} // namespace

SystemCalls countSystemCalls(const std::function<Work()>& prepare) {
    const pid_t child = ::fork();
    if (child < 0) {
        throw systemError("cannot start the traced child");
    }
    if (child == 0) {
        runTraced(prepare);
    }
    try {
        return follow(child);
    } catch (...) {
        ::kill(child, SIGKILL);
        ::waitpid(child, nullptr, 0);
        throw;
    }
}

} // namespace bench
