// The program itself: how it is called, and how it ends.

#include "tests/support/Program.h"

#include "base/FileDescriptor.h"
#include "base/UnixAddress.h"
#include "tests/support/TemporaryDirectory.h"

#include <gtest/gtest.h>

#include <csignal>
#include <filesystem>
#include <string>
#include <sys/socket.h>
#include <vector>

namespace {

using support::Program;

std::vector<std::string> call(const std::vector<std::string>& arguments) {
    std::vector<std::string> words{KEYSTRAND_SESSIONS_PROGRAM};
    words.insert(words.end(), arguments.begin(), arguments.end());
    return words;
}

TEST(KeystrandSessionsProgramTest, HelpIsPrinted) {
    for (const std::string option : {"--help", "-h"}) {
        Program program(call({option}));
        EXPECT_EQ(program.awaitEnd(), 0);
        EXPECT_EQ(program.lines().at(0), "usage: keystrand-sessions [--root DIR]");
    }
}

TEST(KeystrandSessionsProgramTest, WrongUsageIsRefused) {
    const std::vector<std::vector<std::string>> wrong = {
        {"--root"}, {"--root", "/", "/"}, {"/"}, {"--bus", "/"}, {"--help", "--help"}};
    for (const auto& arguments : wrong) {
        Program program(call(arguments));
        EXPECT_EQ(program.awaitEnd(), 2) << arguments[0];
        EXPECT_EQ(program.lines().at(0), "usage: keystrand-sessions [--root DIR]");
    }
}

TEST(KeystrandSessionsProgramTest, WithoutBusAndKeystrandItWaitsAndEndsWhenAsked) {
    for (const int signal : {SIGTERM, SIGINT}) {
        const support::TemporaryDirectory root;
        Program program(call({"--root", root.path().string()}));
        EXPECT_TRUE(
            program.awaitLine("keystrand-sessions: the message bus cannot be reached, and is "
                              "tried again and again: No such file or directory."));
        program.signal(signal);
        EXPECT_EQ(program.awaitEnd(), 0);
        EXPECT_EQ(program.lines().size(), 1U);
    }
}

TEST(KeystrandSessionsProgramTest, KeystrandIsLookedForUnderTheRoot) {
    const support::TemporaryDirectory root;
    std::filesystem::create_directories(root.path() / "run/keystrand");
    const base::FileDescriptor socket(::socket(AF_UNIX, SOCK_SEQPACKET | SOCK_CLOEXEC, 0));
    const auto address = base::UnixAddress::of(root.file("run/keystrand/sessions.sock")).value();
    ASSERT_EQ(::bind(socket.get(), address.get(), address.size()), 0);
    ASSERT_EQ(::listen(socket.get(), 1), 0);
    const timeval patience{support::kPatience.count(), 0};
    ASSERT_EQ(::setsockopt(socket.get(), SOL_SOCKET, SO_RCVTIMEO, &patience, sizeof patience), 0);
    const Program program(call({"--root", root.path().string()}));
    const base::FileDescriptor connection(::accept(socket.get(), nullptr, nullptr));
    EXPECT_TRUE(connection.isOpen());
}

} // namespace
