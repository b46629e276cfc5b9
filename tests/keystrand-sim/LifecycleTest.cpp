#include "tests/keystrand-sim/SimulatorProcess.h"

#include <csignal>
#include <cstring>
#include <filesystem>
#include <fstream>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/un.h>
#include <sys/wait.h>
#include <unistd.h>

namespace keystrand::sim::test {

using namespace keystrand::test;

namespace {

class LifecycleTest : public SimulatorProcess {
  protected:
    static mode_t modeOf(const std::string& file) {
        struct stat status {};
        EXPECT_EQ(::stat(file.c_str(), &status), 0) << file;
        return status.st_mode & 07777U;
    }

    void expectCleanEnd() {
        EXPECT_EQ(program_->awaitEnd(), 0);
        EXPECT_FALSE(std::filesystem::exists(servicePath()));
        EXPECT_FALSE(std::filesystem::exists(controlPath()));
    }

    /// Runs the program to its end and hands back everything it said.
    std::string runToEnd(const std::vector<std::string>& words, int expectedStatus) {
        support::Program program(words);
        EXPECT_EQ(program.awaitEnd(), expectedStatus);
        std::string text;
        for (const std::string& line : program.lines()) {
            text += line + "\n";
        }
        return text;
    }

    std::string control(std::vector<std::string> words, int expectedStatus) {
        words.insert(words.begin(),
                     {KEYSTRAND_SIM_PROGRAM, "ctl", "--root", root_.path().string()});
        return runToEnd(words, expectedStatus);
    }
};

TEST_F(LifecycleTest, DirectoryAndSocketsHaveTheirModes) {
    const mode_t before = ::umask(077);
    start();
    ::umask(before);
    EXPECT_EQ(modeOf(path("run/keystrand")), 0755U);
    EXPECT_EQ(modeOf(servicePath()), 0600U);
    EXPECT_EQ(modeOf(controlPath()), 0600U);
}

TEST_F(LifecycleTest, DirectoryThatIsThereKeepsItsMode) {
    ASSERT_EQ(::mkdir(path("run/keystrand").c_str(), 0700), 0);
    start();
    EXPECT_EQ(modeOf(path("run/keystrand")), 0700U);
}

TEST_F(LifecycleTest, TerminateEndsCleanly) {
    start();
    program_->signal(SIGTERM);
    expectCleanEnd();
}

TEST_F(LifecycleTest, InterruptEndsCleanly) {
    start();
    program_->signal(SIGINT);
    expectCleanEnd();
}

TEST_F(LifecycleTest, QuitEndsCleanly) {
    start();
    tell("quit");
    expectCleanEnd();
}

TEST_F(LifecycleTest, EndsWithClientsConnected) {
    start();
    const PacketSocket client = openClient();
    tell("fault silence");
    ASSERT_TRUE(client.send(openRequest(1)));
    program_->signal(SIGTERM);
    expectCleanEnd();
    EXPECT_TRUE(client.awaitHangUp());
}

TEST_F(LifecycleTest, SecondInstanceIsRefusedAndTheFirstGoesOn) {
    start();
    EXPECT_EQ(runToEnd(commandLine({}), 1),
              "keystrand-sim: " + servicePath() + ": another instance listens there\n");
    EXPECT_EQ(exchange(connect(), propertyRequest(1, "P")), reply(3, 1, 0, 0));
}

TEST_F(LifecycleTest, StaleSocketsAreReplaced) {
    start();
    program_->signal(SIGKILL);
    EXPECT_EQ(program_->awaitEnd(), 128 + SIGKILL);
    ASSERT_TRUE(std::filesystem::exists(servicePath()));
    ASSERT_TRUE(std::filesystem::exists(controlPath()));
    start();
    EXPECT_EQ(exchange(connect(), propertyRequest(1, "P")), reply(3, 1, 0, 0));
}

TEST_F(LifecycleTest, FileThatIsNoSocketIsLeftAlone) {
    std::filesystem::create_directories(path("run/keystrand"));
    std::ofstream(servicePath()) << "precious";
    EXPECT_EQ(runToEnd(commandLine({}), 1),
              "keystrand-sim: " + servicePath() + ": is there and is not a socket\n");
    EXPECT_EQ(std::filesystem::file_size(servicePath()), 8U);
}

TEST_F(LifecycleTest, SocketThatSomebodyElsePutThereIsLeftAlone) {
    start();
    std::filesystem::remove(servicePath());
    const PacketSocket other = PacketSocket::boundTo(servicePath());
    program_->signal(SIGTERM);
    EXPECT_EQ(program_->awaitEnd(), 0);
    EXPECT_TRUE(std::filesystem::exists(servicePath()));
}

TEST_F(LifecycleTest, RootThatCannotBeUsed) {
    const std::string missing = path("missing");
    EXPECT_EQ(runToEnd({KEYSTRAND_SIM_PROGRAM, "--root", missing}, 1),
              "keystrand-sim: " + missing +
                  "/run: cannot make the directory: No such file or directory\n");
    const std::string longRoot = path(std::string(100, 'd'));
    std::filesystem::create_directory(longRoot);
    EXPECT_EQ(runToEnd({KEYSTRAND_SIM_PROGRAM, "--root", longRoot}, 1),
              "keystrand-sim: " + longRoot +
                  "/run/keystrand/service.sock: too long for a socket\n");
}

TEST_F(LifecycleTest, DoesNotStartWithAWrongPolicyFile) {
    const std::string file = path("policies.conf");
    const std::vector<std::string> words = commandLine({"--policies", file});
    EXPECT_EQ(runToEnd(words, 1), "keystrand-sim: " + file + ": cannot be read, or is too large\n");
    std::ofstream(file) << "# one\npolicy a = passwort\n";
    EXPECT_EQ(runToEnd(words, 1), "keystrand-sim: " + file + ":2: unknown requirement passwort\n");
    EXPECT_FALSE(std::filesystem::exists(path("run/keystrand")));
    std::ofstream(file) << "policy a = passcode\n";
    start({"--policies", file});
    EXPECT_EQ(tell("policies").lines, std::vector<std::string>{"policy a = passcode"});
}

TEST_F(LifecycleTest, OptionsOutsideTheirRange) {
    const std::vector<std::pair<std::string, std::string>> bad = {{"--period", "0"},
                                                                  {"--period", "4294967296"},
                                                                  {"--analytics-period", "0"},
                                                                  {"--clock", "0"},
                                                                  {"--clock", "x"},
                                                                  {"--log-level", "256"},
                                                                  {"--clock", "9007199254740993"}};
    for (const auto& [option, value] : bad) {
        support::Program program(commandLine({option, value}));
        const auto status = program.awaitEnd();
        ASSERT_TRUE(status);
        EXPECT_GT(*status, 0) << option << " " << value;
        EXPECT_LT(*status, 128) << option << " " << value;
        EXPECT_EQ(program.count(option), 1U) << value;
    }
}

TEST_F(LifecycleTest, OptionsReachTheModel) {
    start({"--clock", "77", "--period", "1", "--analytics-period", "4294967295", "--log-level",
           "255"});
    const auto status = tell("status");
    EXPECT_EQ(status.value("now"), "77");
    EXPECT_EQ(status.value("period"), "1");
    EXPECT_EQ(status.value("analytics-period"), "4294967295");
    EXPECT_EQ(status.value("log-level"), "255");
}

TEST_F(LifecycleTest, ControlModeTellsHowItWent) {
    EXPECT_EQ(control({"status"}, 2), "keystrand-sim: nobody listens at " + controlPath() + "\n");
    start();
    EXPECT_EQ(control({"env", "set", "1", "0a"}, 0), "");
    EXPECT_EQ(control({"env", "get", "1"}, 0), "value 0a\n");
    EXPECT_EQ(control({"fault", "command=26", "control=7", "status=-42"}, 0), "");
    EXPECT_EQ(control({"env", "get"}, 1), "keystrand-sim: id: missing\n");
}

/// What a process of another user gets from a socket: 0 when it is hung up on without a word.
int strangerConnects(const std::string& path, int type) {
    const pid_t child = ::fork();
    if (child == 0) {
        sockaddr_un address{};
        address.sun_family = AF_UNIX;
        std::strncpy(address.sun_path, path.c_str(), sizeof address.sun_path - 1);
        const int fd = ::socket(AF_UNIX, type | SOCK_CLOEXEC, 0);
        constexpr uid_t kNobody = 65534;
        if (::setresuid(kNobody, kNobody, kNobody) != 0) {
            ::_exit(3);
        }
        if (::connect(fd, reinterpret_cast<const sockaddr*>(&address), sizeof address) != 0) {
            ::_exit(2);
        }
        char byte = 0;
        ::_exit(::recv(fd, &byte, 1, 0) == 0 ? 0 : 1);
    }
    int status = 0;
    ::waitpid(child, &status, 0);
    return WIFEXITED(status) ? WEXITSTATUS(status) : -1;
}

TEST_F(LifecycleTest, PeersOfAnotherUserAreTurnedAwayWithoutAWord) {
    if (::geteuid() != 0) {
        GTEST_SKIP() << "only root can become another user";
    }
    start();
    EXPECT_EQ(strangerConnects(servicePath(), SOCK_SEQPACKET), 2);
    // Past the permissions, the credentials still count.
    ASSERT_EQ(::chmod(root_.path().c_str(), 0755), 0);
    ASSERT_EQ(::chmod(servicePath().c_str(), 0666), 0);
    ASSERT_EQ(::chmod(controlPath().c_str(), 0666), 0);
    EXPECT_EQ(strangerConnects(servicePath(), SOCK_SEQPACKET), 0);
    EXPECT_EQ(strangerConnects(controlPath(), SOCK_STREAM), 0);
    EXPECT_EQ(exchange(connect(), propertyRequest(1, "P")), reply(3, 1, 0, 0));
}

} // namespace

} // namespace keystrand::sim::test
