// The daemon's side with the real program at the other end, and with programs that are not it.

#include "base/Concat.h"
#include "platform/Host.h"
#include "platform/linux/LinuxHost.h"
#include "platform/linux/RemoteHTTPSessions.h"
#include "tests/platform/https/ServerFaults.h"
#include "tests/platform/linux/OpenDescriptors.h"
#include "tests/platform/linux/ScriptedHTTPSClient.h"
#include "tests/support/Collector.h"
#include "tests/support/HTTPRequests.h"
#include "tests/support/NoThreads.h"
#include "tests/support/TemporaryDirectory.h"

#include <gtest/gtest.h>

#include <csignal>
#include <sys/wait.h>
#include <vector>

namespace {

using namespace std::chrono_literals;
using platform::HTTPReply;
using platform::RemoteHTTPSessions;
using support::acceptingDelegate;
using support::fetch;
using support::get;
using support::outcomeOf;
using support::post;

constexpr char kNowhere[] = "http://127.0.0.1:1/";

/// Starts the real program for a connection, as the init system does: how it ended.
[[nodiscard]] int runClient(base::FileDescriptor socket, const std::string& anchors) {
    const pid_t process = ::fork();
    if (process == 0) {
        ::dup2(socket.get(), 3);
        ::execl(KSTD_HTTPS, KSTD_HTTPS, "--trust-anchors", anchors.c_str(), nullptr);
        ::_exit(127);
    }
    socket.reset();
    int status = 0;
    ::waitpid(process, &status, 0);
    return status;
}

class RemoteHTTPSessionTest : public testing::Test {
  protected:
    void control(const std::string& line) { static_cast<void>(collector_.control(line)); }

    [[nodiscard]] HTTPReply postIt(std::string_view body) {
        return fetch(sessions_, post(link(), body));
    }
    [[nodiscard]] std::string link() const { return collector_.link("/2/kst"); }

    support::Collector collector_;
    RemoteHTTPSessions sessions_{
        {.program = {KSTD_HTTPS, "--trust-anchors", collector_.authority()}}};
};

TEST_F(RemoteHTTPSessionTest, LargeDocumentArrivesWhole) {
    std::string document;
    for (int i = 0; document.size() < 5'000'000; ++i) {
        base::append(document, i);
        document.push_back(static_cast<char>(i));
    }
    EXPECT_EQ(outcomeOf(postIt(document)), "200");
    EXPECT_TRUE(collector_.body(1) == document);
    const std::vector<std::string> head = {
        "POST /2/kst HTTP/1.1", base::concat("Host: 127.0.0.1:", collector_.port()),
        "User-Agent: kstd/1.0", base::concat("Content-Length: ", document.size()), ""};
    EXPECT_EQ(collector_.lastHead(), head);
}

TEST_F(RemoteHTTPSessionTest, ServersThatDoNotBehaveEndAsTheyDoWithoutAnotherProcess) {
    const std::string document(5'000'000, 'd');
    control("body-size 1000");
    RemoteHTTPSessions hasty({.program = {KSTD_HTTPS, "--trust-anchors", collector_.authority(),
                                          "--fetch-limit", "0.2"}});
    for (const auto& [fault, ofAPost, ofAGet, isSlow] : support::kServerFaults) {
        SCOPED_TRACE(fault);
        control(base::concat("fault ", fault));
        const HTTPReply reply = postIt(document);
        EXPECT_EQ(outcomeOf(reply), ofAPost);
        EXPECT_TRUE(!reply.error || reply.error->description.size() > 16);
        EXPECT_EQ(reply.body, "");
        EXPECT_EQ(outcomeOf(fetch(isSlow ? hasty : sessions_, get(link()))), ofAGet);
    }
    control("body hallo");
    control("fault none");
    EXPECT_EQ(fetch(sessions_, get(link())).body, "hallo");
}

TEST_F(RemoteHTTPSessionTest, FindingsAboutACertificateComeThrough) {
    control("certificate expired");
    EXPECT_EQ(postIt("x").error,
              (platform::Error{platform::kTransportErrorDomain, platform::kTrustRefused,
                               "server not trusted: certificate has expired"}));
    EXPECT_EQ(outcomeOf(fetch(sessions_, get(link()), acceptingDelegate())), "200");
    const auto refusing = support::answeringDelegate(platform::ChallengeDisposition::cancel);
    control("certificate good");
    EXPECT_EQ(fetch(sessions_, get(link()), refusing).error->description,
              "server not trusted: refused by the delegate");
}

TEST_F(RemoteHTTPSessionTest, ClientForEachConnectionBehindASocket) {
    const support::TemporaryDirectory directory;
    const std::string path = directory.file("https.sock");
    std::vector<int> statuses;
    {
        const support::ConnectionServer server(path, [&](base::FileDescriptor socket) {
            statuses.push_back(runClient(std::move(socket), collector_.authority()));
        });
        RemoteHTTPSessions sessions({.socket = path});
        const auto delegate = acceptingDelegate();
        EXPECT_EQ(outcomeOf(fetch(sessions, post(link(), "first"), delegate)), "200");
        EXPECT_EQ(outcomeOf(fetch(sessions, get(kNowhere))), "transport 2");
        EXPECT_EQ(delegate->challenges(), 1);
        EXPECT_EQ(collector_.body(1), "first");
    }
    EXPECT_EQ(statuses, (std::vector{0, 0}));
}

TEST_F(RemoteHTTPSessionTest, NothingIsLeftBehind) {
    EXPECT_EQ(outcomeOf(postIt("x")), "200");
    const std::size_t before = support::countOpenDescriptors();
    for (int i = 0; i < 5; ++i) {
        EXPECT_EQ(outcomeOf(postIt("x")), "200");
    }
    EXPECT_EQ(support::countOpenDescriptors(), before);
    siginfo_t ended{};
    EXPECT_EQ(::waitid(P_ALL, 0, &ended, WEXITED | WNOHANG | WNOWAIT), 0);
    EXPECT_EQ(ended.si_pid, 0) << "the collector is the only child, and runs";
}

TEST(RemoteHTTPProgramTest, WhatIsNoClient) {
    const struct {
        std::vector<std::string> program;
        std::string description;
        // Only who is silent for good meets a limit that a busy machine may reach as well.
        std::chrono::milliseconds silenceLimit = 30s;
    } kCases[] = {
        {{"/no/such/program"},
         "cannot connect: no HTTPS client at /no/such/program: No such file or directory"},
        {{"/bin/false"}, "transfer failed: the HTTPS client ended without an answer"},
        {{"/bin/sh", "-c", "kill -SEGV $$"},
         "transfer failed: the HTTPS client ended without an answer"},
        {{"/bin/sh", "-c", "echo something else >&3; cat <&3 >/dev/null 2>&1"},
         "transfer failed: the HTTPS client sent what it must not"},
        {{"/bin/sh", "-c", "kill -STOP $$"},
         "timed out: the HTTPS client was silent for 20 ms",
         20ms},
        {{KSTD_HTTPS, "--no-such-option"},
         "transfer failed: the HTTPS client ended without an answer"},
    };
    for (const auto& [program, description, silenceLimit] : kCases) {
        SCOPED_TRACE(description);
        RemoteHTTPSessions sessions({.program = program, .silenceLimit = silenceLimit});
        const HTTPReply reply = fetch(sessions, get(kNowhere));
        ASSERT_TRUE(reply.error);
        EXPECT_EQ(reply.error->description, description);
    }
    EXPECT_EQ(::waitpid(-1, nullptr, WNOHANG), -1) << "there is no child any more";
}

TEST(RemoteHTTPProgramTest, WithoutAThreadTheCompletionComesAtOnce) {
    RemoteHTTPSessions sessions({.program = {"/bin/false"}});
    const auto session = sessions.makeEphemeral({}, {});
    const support::NoThreads none;
    support::ReplyKeeper keeper;
    session->start(get(kNowhere), keeper.completion());
    EXPECT_EQ(keeper.calls(), 1);
    EXPECT_EQ(keeper.reply().error->description, "no thread for the request");
}

TEST(RemoteHTTPProgramTest, RequestsTakeNoSignalsAndTheCallerKeepsItsOwn) {
    RemoteHTTPSessions sessions({.program = {"/bin/false"}});
    sigset_t before;
    sigset_t after;
    sigset_t during;
    ::sigemptyset(&during);
    ::pthread_sigmask(SIG_BLOCK, nullptr, &before);
    sessions.makeEphemeral({}, {})->start(
        get("file:///"), [&](const HTTPReply&) { ::pthread_sigmask(SIG_BLOCK, nullptr, &during); });
    ::pthread_sigmask(SIG_BLOCK, nullptr, &after);
    for (const int signal : {SIGTERM, SIGPIPE, SIGALRM, SIGUSR1}) {
        EXPECT_EQ(::sigismember(&during, signal), 1) << signal;
        EXPECT_EQ(::sigismember(&after, signal), ::sigismember(&before, signal)) << signal;
    }
}

TEST(RemoteHTTPProgramTest, HostLooksForTheClientBehindItsSocket) {
    const support::TemporaryDirectory root;
    platform::LinuxHost host({.paths = platform::Paths(root.path().string())});
    const HTTPReply reply = fetch(host.interfaces().https, get(kNowhere));
    ASSERT_TRUE(reply.error);
    EXPECT_EQ(reply.error->description,
              base::concat("cannot connect: no HTTPS client at ", root.path().string(),
                           "/run/kstd/https.sock: No such file or directory"));
}

} // namespace
