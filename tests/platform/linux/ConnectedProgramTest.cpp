#include "base/Concat.h"
#include "platform/linux/HTTPSClient.h"
#include "tests/platform/linux/OpenDescriptors.h"
#include "tests/support/EnvironmentVariable.h"

#include <gtest/gtest.h>

#include <cerrno>
#include <csignal>
#include <cstdint>
#include <fcntl.h>
#include <sys/socket.h>
#include <sys/wait.h>
#include <unistd.h>

namespace {

using platform::ConnectedProgram;

/// All that the program writes into its connection.
std::string outputOf(const base::FileDescriptor& connection) {
    std::string output;
    char buffer[4096];
    for (ssize_t size = 1; size > 0;) {
        size = ::read(connection.get(), buffer, sizeof buffer);
        output.append(buffer, size > 0 ? static_cast<std::size_t>(size) : 0);
    }
    return output;
}

std::string shell(const std::string& script) {
    int error = -1;
    auto program = ConnectedProgram::start({"/bin/sh", "-c", script, "name"}, error);
    EXPECT_EQ(error, 0);
    return program ? outputOf(program->takeConnection()) : "none";
}

/// Whether a child of this process has ended and was not waited for.
bool hasZombie() {
    siginfo_t ended{};
    return ::waitid(P_ALL, 0, &ended, WEXITED | WNOHANG | WNOWAIT) == 0 && ended.si_pid != 0;
}

TEST(ConnectedProgramTest, GetsTheConnectionAndNothingElse) {
    const support::EnvironmentVariable variable("KSTD_TEST_VARIABLE", "1");
    const base::FileDescriptor low(::fcntl(STDERR_FILENO, F_DUPFD, 4));
    const base::FileDescriptor high(::fcntl(STDERR_FILENO, F_DUPFD, 200));
    const std::string numbers = base::concat("3 4 5 6 7 8 9 ", low.get(), ' ', high.get());
    EXPECT_EQ(shell(base::concat("for n in ", numbers,
                                 "; do [ -e /proc/$$/fd/$n ] && echo $n >&3; done")),
              "3\n");
    EXPECT_EQ(shell("readlink /proc/$$/fd/0 >&3"), "/dev/null\n");
    EXPECT_EQ(shell("tr '\\0' '\\n' </proc/$$/environ >&3"), "");
    EXPECT_EQ(shell("echo $0 $* >&3"), "name\n");
}

/// A set of signals in the status of a program; the shell looks at its own.
std::uint64_t signalsOf(const std::string& kind) {
    const std::string found =
        shell(base::concat("while read -r name value; do [ \"$name\" = ", kind,
                           ": ] && echo $value >&3; done </proc/$$/status"));
    return std::stoull(found, nullptr, 16);
}

TEST(ConnectedProgramTest, TakesSignalsAsAnyProgram) {
    sigset_t all;
    sigset_t before;
    ::sigfillset(&all);
    ::pthread_sigmask(SIG_SETMASK, &all, &before);
    const auto pipeBefore = std::signal(SIGPIPE, SIG_IGN);
    EXPECT_EQ(signalsOf("SigBlk"), 0U);
    EXPECT_EQ(signalsOf("SigIgn") & (std::uint64_t{1} << (SIGPIPE - 1U)), 0U);
    std::signal(SIGPIPE, pipeBefore);
    ::pthread_sigmask(SIG_SETMASK, &before, nullptr);
}

TEST(ConnectedProgramTest, ConnectionGoesBothWaysAndEndsWithTheProgram) {
    int error = -1;
    auto program =
        ConnectedProgram::start({"/bin/sh", "-c", "read line <&3; echo \"got $line\" >&3"}, error);
    ASSERT_TRUE(program);
    const base::FileDescriptor connection = program->takeConnection();
    EXPECT_EQ(::write(connection.get(), "word\n", 5), 5);
    EXPECT_EQ(outputOf(connection), "got word\n");
}

TEST(ConnectedProgramTest, ProgramThatCannotBeStarted) {
    const std::size_t before = support::countOpenDescriptors();
    int error = 0;
    EXPECT_FALSE(ConnectedProgram::start({"/no/such/program"}, error));
    EXPECT_EQ(error, ENOENT);
    EXPECT_FALSE(ConnectedProgram::start({"/etc"}, error));
    EXPECT_EQ(error, EACCES);
    EXPECT_EQ(support::countOpenDescriptors(), before);
    EXPECT_FALSE(hasZombie());
}

TEST(ConnectedProgramTest, IsWaitedForAndOneThatDoesNotEndKilled) {
    const std::size_t before = support::countOpenDescriptors();
    int error = 0;
    for (const char* const script : {"exit 3", "cat <&3", "kill -STOP $$"}) {
        SCOPED_TRACE(script);
        const auto program = ConnectedProgram::start({"/bin/sh", "-c", script}, error);
        EXPECT_EQ(error, 0);
    }
    EXPECT_EQ(::waitpid(-1, nullptr, WNOHANG), -1) << "there is no child any more";
    EXPECT_EQ(errno, ECHILD);
    EXPECT_EQ(support::countOpenDescriptors(), before);
}

} // namespace
