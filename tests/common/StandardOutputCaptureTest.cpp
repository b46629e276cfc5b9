#include "tests/support/StandardOutputCapture.h"

#include <gtest/gtest.h>

#include <array>
#include <cstdio>
#include <fcntl.h>
#include <string>
#include <sys/wait.h>
#include <unistd.h>

namespace {

/// What a process prints that runs `body` and ends, all of it.
template <typename Body>
std::string printedBy(Body body) {
    std::array<int, 2> ends{};
    if (::pipe2(ends.data(), O_CLOEXEC) != 0) {
        return "no pipe";
    }
    std::fflush(stdout);
    const pid_t child = ::fork();
    if (child == 0) {
        ::dup2(ends[1], STDOUT_FILENO);
        body();
        std::fflush(stdout);
        ::_exit(0);
    }
    ::close(ends[1]);
    std::string text;
    char buffer[512];
    for (ssize_t count = 0; (count = ::read(ends[0], buffer, sizeof buffer)) > 0;) {
        text.append(buffer, static_cast<std::size_t>(count));
    }
    ::close(ends[0]);
    ::waitpid(child, nullptr, 0);
    return text;
}

TEST(StandardOutputCaptureTest, KeepsWhatATestThatSucceedsPrints) {
    EXPECT_EQ(printedBy([] {
                  const support::StandardOutputCapture capture;
                  std::puts("a line");
              }),
              "");
}

TEST(StandardOutputCaptureTest, GivesBackWhyATestFails) {
    const std::string printed = printedBy([] {
        const support::StandardOutputCapture capture;
        ADD_FAILURE() << "the reason";
    });
    EXPECT_NE(printed.find("the reason"), std::string::npos) << printed;
}

} // namespace
