#include "tests/support/SystemCallStepper.h"

#include <csignal>
#include <stdexcept>
#include <sys/ptrace.h>
#include <sys/wait.h>

namespace support {

namespace {

constexpr int kSystemCallStop = SIGTRAP | 0x80;

} // namespace

SystemCallStepper::SystemCallStepper(pid_t program) : program_(program) {
    if (::ptrace(PTRACE_SEIZE, program_, nullptr, PTRACE_O_TRACESYSGOOD) != 0 ||
        ::ptrace(PTRACE_INTERRUPT, program_, nullptr, nullptr) != 0 || !waitForStop()) {
        throw std::runtime_error("cannot trace the program");
    }
}

SystemCallStepper::~SystemCallStepper() {
    if (stopped_) {
        ::ptrace(PTRACE_DETACH, program_, nullptr, nullptr);
    }
}

bool SystemCallStepper::waitForStop() {
    int status = 0;
    stopped_ = ::waitpid(program_, &status, __WALL) == program_ && WIFSTOPPED(status);
    return stopped_;
}

std::optional<SystemCallStepper::Stop> SystemCallStepper::next() {
    for (;;) {
        siginfo_t signal{};
        stopped_ = false;
        if (::ptrace(PTRACE_SYSCALL, program_, nullptr, nullptr) != 0 || !waitForStop()) {
            return std::nullopt;
        }
        __ptrace_syscall_info info{};
        if (::ptrace(PTRACE_GETSIGINFO, program_, nullptr, &signal) == 0 &&
            signal.si_code == kSystemCallStop &&
            ::ptrace(PTRACE_GET_SYSCALL_INFO, program_, sizeof info, &info) > 0) {
            const bool isEntry = info.op == PTRACE_SYSCALL_INFO_ENTRY;
            return Stop{isEntry, isEntry ? info.entry.nr : 0};
        }
    }
}

void SystemCallStepper::kill() {
    ::kill(program_, SIGKILL);
    stopped_ = false;
}

} // namespace support
