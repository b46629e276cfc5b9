// Launches a program whenever an event waits in the event socket, as the init system does: owns the
// socket, polls it, starts the program with the socket handed over, waits for its end, polls again.

#include "platform/linux/EventSocket.h"
#include "platform/linux/Paths.h"
#include "wire/SystemPaths.h"

#include <CLI/CLI.hpp>

#include <cerrno>
#include <csignal>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <exception>
#include <fcntl.h>
#include <filesystem>
#include <iostream>
#include <poll.h>
#include <string>
#include <sys/prctl.h>
#include <sys/signalfd.h>
#include <sys/wait.h>
#include <unistd.h>
#include <vector>

namespace {

constexpr int kFirstHandedDescriptor = 3;

struct Options {
    std::string root;
    bool startAtOnce = false;
    std::vector<std::string> program;
};

[[noreturn]] void becomeProgram(const Options& options, int socket, const sigset_t& signals) {
    ::prctl(PR_SET_PDEATHSIG, SIGKILL);
    ::sigprocmask(SIG_UNBLOCK, &signals, nullptr);
    // A duplicate onto itself would keep close-on-exec.
    const int copy = ::fcntl(socket, F_DUPFD, kFirstHandedDescriptor + 1);
    ::dup2(copy, kFirstHandedDescriptor);
    ::close(copy);
    ::setenv("LISTEN_FDS", "1", 1);
    ::setenv("LISTEN_FDNAMES", "events", 1);
    ::setenv("LISTEN_PID", std::to_string(::getpid()).c_str(), 1);
    std::vector<char*> arguments;
    for (const std::string& argument : options.program) {
        arguments.push_back(const_cast<char*>(argument.c_str()));
    }
    arguments.push_back(nullptr);
    ::execv(arguments[0], arguments.data());
    std::cerr << "kstd-supervise: cannot run " << options.program[0] << ": " << std::strerror(errno)
              << '\n';
    ::_exit(127);
}

/// Waits until something arrives in the socket or a signal does; false for a signal.
bool waitForEvent(int socket, int signals) {
    pollfd watched[2] = {{socket, POLLIN, 0}, {signals, POLLIN, 0}};
    while (::poll(watched, 2, -1) < 0 && errno == EINTR) {
    }
    return (watched[1].revents & POLLIN) == 0;
}

/// Waits for the program's end; false when a signal asked to end both.
bool waitForEnd(pid_t program, int signals, const sigset_t& ending) {
    for (;;) {
        signalfd_siginfo received{};
        if (::read(signals, &received, sizeof received) < 0) {
            continue;
        }
        int status = 0;
        const bool ended = ::waitpid(program, &status, WNOHANG) == program;
        if (sigismember(&ending, static_cast<int>(received.ssi_signo)) != 0) {
            if (!ended) {
                ::kill(program, SIGTERM);
                ::waitpid(program, &status, 0);
            }
            return false;
        }
        if (ended) {
            std::cout << "kstd-supervise: ended "
                      << (WIFEXITED(status) ? WEXITSTATUS(status) : 128 + WTERMSIG(status))
                      << std::endl;
            return true;
        }
    }
}

int supervise(const Options& options) {
    const platform::Paths paths(options.root);
    std::filesystem::create_directories(paths.under(wire::kDaemonDirectory));
    const base::FileDescriptor socket = platform::makeEventSocket(paths.eventSocket());
    if (!socket.isOpen()) {
        std::cerr << "kstd-supervise: cannot make the event socket " << paths.eventSocket() << '\n';
        return 1;
    }
    sigset_t ending;
    sigemptyset(&ending);
    sigaddset(&ending, SIGTERM);
    sigaddset(&ending, SIGINT);
    sigset_t all = ending;
    sigaddset(&all, SIGCHLD);
    ::sigprocmask(SIG_BLOCK, &all, nullptr);
    const base::FileDescriptor endingSignals(::signalfd(-1, &ending, SFD_CLOEXEC));
    const base::FileDescriptor signals(::signalfd(-1, &all, SFD_CLOEXEC));
    std::cout << "kstd-supervise: ready" << std::endl;

    bool launch = options.startAtOnce;
    while (launch || waitForEvent(socket.get(), endingSignals.get())) {
        launch = false;
        const pid_t program = ::fork();
        if (program == 0) {
            becomeProgram(options, socket.get(), all);
        }
        std::cout << "kstd-supervise: started " << program << std::endl;
        if (!waitForEnd(program, signals.get(), ending)) {
            break;
        }
    }
    return 0;
}

} // namespace

int main(int argc, char** argv) try {
    CLI::App app("Owns the event socket under a root directory and launches a program for it.");
    Options options;
    app.add_option("--root", options.root, "The directory in which /run lies")->required();
    app.add_flag("--start", options.startAtOnce, "Launch once without waiting for an event");
    app.add_option("program", options.program, "The program and its arguments, after --")
        ->required();
    CLI11_PARSE(app, argc, argv);
    return supervise(options);
} catch (const std::exception& error) {
    std::fprintf(stderr, "kstd-supervise: %s\n", error.what());
    return 1;
}
