// A process that forks while it uses the library: the child begins anew, the parent goes on.

#include "KSTLib/Channel.h"
#include "tests/KSTLib/KernelServerFixture.h"
#include "tests/support/AssertionLines.h"
#include "tests/support/ChildProcess.h"
#include "tests/support/MemoryScan.h"
#include "tests/support/ScriptedChannel.h"
#include "tests/support/ScriptedRegistry.h"

#include <gtest/gtest.h>

#include <cerrno>
#include <cstdlib>
#include <filesystem>
#include <future>
#include <map>
#include <memory>
#include <string.h>
#include <sys/wait.h>
#include <thread>
#include <unistd.h>

namespace {

using support::MemoryScan;

/// How many handlers of forks the system has no memory for.
int handlersRefused = 0;

constexpr MemoryScan::Turned kTurnedSecret = {0x31, 0xe9, 0x74, 0x2c, 0xb5, 0x80, 0x1f, 0xd6,
                                              0x4a, 0xc3, 0x09, 0x7e, 0xa2, 0xf7, 0x5d, 0x18};

class Fork : public support::KernelServerFixture {
  protected:
    void SetUp() override {
        KernelServerFixture::SetUp();
        context = openContext();
        ASSERT_NE(context, nullptr);
    }

    void TearDown() override {
        EXPECT_EQ(KSTContextDelete(context, false), 0);
        KernelServerFixture::TearDown();
    }

    static std::size_t openSockets() {
        std::size_t count = 0;
        for (const auto& entry : std::filesystem::directory_iterator("/proc/self/fd")) {
            std::error_code error;
            const auto target = std::filesystem::read_symlink(entry.path(), error);
            count += target.string().starts_with("socket:") ? 1U : 0U;
        }
        return count;
    }

    /// The requests of each connection are numbered 1, 2, 3, ...: none is another process's.
    void expectEveryConnectionInOrder() {
        std::map<int, std::uint64_t> last;
        for (const Seen& request : seen()) {
            if (request.code != kEnd) {
                EXPECT_EQ(request.sequence, ++last[request.connection] & 0xffU);
            }
        }
    }

    KSTContextRef context = nullptr;
};

/// A library that nobody has used yet: the first times it asks for a handler it gets none. What its
/// first call says is in `lines`.
int exitStatusWithoutHandlers(int refused, const std::vector<std::string>& lines) {
    handlersRefused = refused;
    support::RecordingLog log;
    support::ScriptedRegistry registry;
    support::ScriptedChannel channel;
    kst::installPlatform({log, registry, channel});
    const KSTStatus first = kst::init();
    const bool isRefused = !lines.empty();
    const bool isRight = first == (isRefused ? -4 : 0) && kst::gChannelOpen != isRefused &&
                         registry.classesAsked.empty() == isRefused &&
                         support::textsWithoutLineNumbers(log) == lines;
    return isRight && kst::init() == 0 && kst::gChannelOpen ? 0 : 1;
}

} // namespace

// The names are the linker's. NOLINTBEGIN(bugprone-reserved-identifier)
extern "C" {

int __real_pthread_atfork(void (*prepare)(), void (*parent)(), void (*child)());

// The thread sanitizer calls it while it starts, when nothing that it looks after can run yet.
#ifdef __clang__
__attribute__((disable_sanitizer_instrumentation))
#endif
int __wrap_pthread_atfork(void (*prepare)(), void (*parent)(), void (*child)()) {
    if (handlersRefused > 0) {
        --handlersRefused;
        return ENOMEM;
    }
    return __real_pthread_atfork(prepare, parent, child);
}

} // extern "C"
// NOLINTEND(bugprone-reserved-identifier)

// In a process of its own, since a handler stays.
TEST(ForkDeathTest, WithoutAHandlerNothingIsOpenedUntilThereIsOne) {
    GTEST_FLAG_SET(death_test_style, "threadsafe");
    const std::vector<std::string> line = {
        "KSTLib: AssertMacros: watchForks() (value: 0x0),  file: "
        "KSTLib/KSTLib:<n>\n"};
    EXPECT_EXIT(std::_Exit(exitStatusWithoutHandlers(1, {})), testing::ExitedWithCode(0), "");
    EXPECT_EXIT(std::_Exit(exitStatusWithoutHandlers(2, line)), testing::ExitedWithCode(0), "");
}

TEST_F(Fork, ChildBeginsWithoutAConnectionAndMakesItsOwn) {
    kst::gLogLevel = 35;
    const std::size_t sockets = openSockets();
    const int inChild = support::exitStatusOfChild([&] {
        // Its lookup and its calls each had a connection.
        const bool isClosed = !kst::gChannelOpen && openSockets() == sockets - 2;
        const bool sameLevel = kst::gLogLevel == 35;
        const bool works = ask(context, "yes") == 1 && ask(context, "no") == 0;
        return isClosed && sameLevel && works && openSockets() == sockets ? 0 : 1;
    });
    EXPECT_EQ(inChild, 0);
    EXPECT_TRUE(kst::gChannelOpen);
    EXPECT_EQ(ask(context, "yes"), 1);
    kst::gLogLevel = kst::kInitialLogLevel;

    int connections = 0;
    for (const Seen& request : seen()) {
        connections = std::max(connections, request.connection);
    }
    EXPECT_EQ(connections, 4);
    expectEveryConnectionInOrder();
}

TEST_F(Fork, ChildOfAChild) {
    const int inChild = support::exitStatusOfChild([&] {
        const int first = ask(context, "yes");
        const int below =
            support::exitStatusOfChild([&] { return ask(context, "no") == 0 ? 0 : 1; });
        return first == 1 && below == 0 && ask(context, "yes") == 1 ? 0 : 1;
    });
    EXPECT_EQ(inChild, 0);
    expectEveryConnectionInOrder();
}

TEST_F(Fork, NobodyGetsTheAnswerOfAnother) {
    constexpr int kForks = 30;
    constexpr int kQuestions = 20;
    const auto wrongAnswers = [&](const char* policy, int right) {
        int wrong = 0;
        for (int i = 0; i < kQuestions; ++i) {
            wrong += ask(context, policy) == right ? 0 : 1;
        }
        return wrong;
    };
    for (int i = 0; i < kForks; ++i) {
        const pid_t child = ::fork();
        if (child == 0) {
            ::_exit(wrongAnswers("no", 0));
        }
        EXPECT_EQ(wrongAnswers("yes", 1), 0);
        int status = 0;
        ASSERT_EQ(::waitpid(child, &status, 0), child);
        EXPECT_EQ(status, 0);
    }
    expectEveryConnectionInOrder();
}

TEST_F(Fork, WrongArgumentsInTheChildAskNobody) {
    const std::size_t before = commands().size();
    EXPECT_EQ(support::exitStatusOfChild([] { return KSTContextCreate(nullptr) == -3 ? 0 : 1; }),
              0);
    EXPECT_EQ(commands().size(), before);
}

TEST_F(Fork, WhileAnotherThreadIsInsideACall) {
    KSTCredential* credential = nullptr;
    ASSERT_EQ(KSTCredentialCreate(kKSTCredentialTypePassphraseEntered, &credential), 0);
    auto* passphrase = reinterpret_cast<std::uint8_t*>(credential + 1) + 8;
    for (std::size_t i = 0; i < kTurnedSecret.size(); ++i) {
        passphrase[i] = static_cast<std::uint8_t>(~kTurnedSecret[i]);
    }
    wipesRequests = true;
    std::promise<void> mayAnswer;
    handle = [answer = mayAnswer.get_future().share()](const Peer&, int code,
                                                       const support::Packet&) {
        if (code == 5) {
            answer.wait();
        }
        return false;
    };
    KSTStatus inParent = -1;
    std::thread call([&] { inParent = KSTContextAddCredential(context, credential); });
    ASSERT_TRUE(await(5));

    const int inChild = support::exitStatusOfChild([&] {
        // The caller's own copy is the caller's.
        ::explicit_bzero(passphrase, kTurnedSecret.size());
        if (std::make_unique<MemoryScan>(kTurnedSecret)->places() != 0) {
            return 1;
        }
        return KSTContextDelete(context, true) == 0 ? 0 : 2;
    });
    EXPECT_EQ(inChild, 0);
    // The parent's call holds what it held.
    EXPECT_GT(std::make_unique<MemoryScan>(kTurnedSecret)->places(), 1U);
    mayAnswer.set_value();
    call.join();
    EXPECT_EQ(inParent, 0);
    EXPECT_EQ(commands(), (std::vector<int>{18, 5, 2}));
    KSTCredentialDelete(credential);
    expectEveryConnectionInOrder();
}

TEST_F(Fork, WithinAResultBlock) {
    int inChild = -1;
    KSTStatus status = -1;
    pid_t child = -1;
    KSTGlobalContextVerifyPolicy("yes", false, nullptr, 0,
                                 [&](KSTStatus err, bool satisfied, const KSTRequirement*) {
                                     status = err;
                                     child = ::fork();
                                     if (child == 0) {
                                         inChild = satisfied && ask(context, "no") == 0 ? 0 : 1;
                                     }
                                 });
    if (child == 0) {
        // The block's answer was its own, the context that was made for the call is the parent's.
        ::_exit(inChild == 0 && ask(context, "yes") == 1 ? 0 : 1);
    }
    EXPECT_EQ(status, 0);
    int ended = 0;
    ASSERT_EQ(::waitpid(child, &ended, 0), child);
    EXPECT_EQ(ended, 0);
    gAllocatedBytes -= 1;
    const std::vector<int> codes = commands();
    EXPECT_EQ(std::count(codes.begin(), codes.end(), 2), 1);
    expectEveryConnectionInOrder();
}

TEST_F(Fork, BytesOfAResultBlockStayInItsOwnChild) {
    handle = [](const Peer& peer, int code, const support::Packet& request) {
        if (code == 25) {
            peer.send(support::reply(request, 0, 5, "value"));
        }
        return code == 25;
    };
    bool isWhole = false;
    pid_t child = -1;
    ASSERT_EQ(KSTGetEnvironmentVariable(1,
                                        [&](const void* data, std::size_t length) {
                                            child = ::fork();
                                            isWhole =
                                                length == 5 && std::memcmp(data, "value", 5) == 0;
                                        }),
              0);
    if (child == 0) {
        ::_exit(isWhole ? 0 : 1);
    }
    int ended = 0;
    ASSERT_EQ(::waitpid(child, &ended, 0), child);
    EXPECT_EQ(ended, 0);
    EXPECT_TRUE(isWhole);
}

TEST_F(Fork, ChildThatNobodyWasToldOf) {
    const pid_t child = ::_Fork();
    if (child == 0) {
        const bool works = ask(context, "no") == 0 && ask(context, "yes") == 1;
        ::_exit(works ? 0 : 1);
    }
    EXPECT_EQ(ask(context, "yes"), 1);
    int ended = 0;
    ASSERT_EQ(::waitpid(child, &ended, 0), child);
    EXPECT_EQ(ended, 0);
    expectEveryConnectionInOrder();
}

TEST_F(Fork, ChildOfAProcessWhosePlatformWasTakenAway) {
    kst::removePlatform();
    EXPECT_EQ(support::exitStatusOfChild([] {
                  return kst::installedPlatform() == nullptr && KSTContextCreate(nullptr) == -3 ? 0
                                                                                                : 1;
              }),
              0);
}
