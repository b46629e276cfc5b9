#include "platform/linux/LinuxKernelChannel.h"

#include "platform/fake/FakeSystemLog.h"
#include "tests/platform/linux/KernelReplies.h"
#include "tests/support/ChildProcess.h"
#include "tests/support/SeqpacketServer.h"
#include "tests/support/TemporaryDirectory.h"

#include <gmock/gmock.h>

#include <array>
#include <atomic>
#include <csignal>
#include <cstring>
#include <future>
#include <limits>
#include <optional>
#include <string>
#include <sys/stat.h>

namespace platform {
namespace {

using support::Packet;
using support::reply;
using support::SeqpacketServer;
using testing::ElementsAre;

constexpr std::uint8_t kFind = 2;
constexpr std::uint8_t kOpen = 4;
constexpr std::chrono::milliseconds kPatient{30000};
/// Long enough that the request is sent before it is over.
constexpr std::chrono::milliseconds kImpatient{300};

class LinuxKernelChannelTest : public testing::Test {
  protected:
    using Answer = std::function<Packet(const Packet& request)>;
    using Calls = std::function<bool(const SeqpacketServer::Peer&, const Packet& request)>;

    /// Serves lookups and opens; `call` handles struct and scalar calls and says whether the
    /// connection goes on.
    void serve(Calls call) {
        server.emplace(path, [this, call = std::move(call)](const SeqpacketServer::Peer& peer) {
            for (Packet request = peer.receive(); !request.empty(); request = peer.receive()) {
                if (request[5] == kFind) {
                    peer.send(reply(request, 0, 1, "/entry"));
                } else if (request[5] == kOpen) {
                    ++opens;
                    openRequest = request;
                    peer.send(reply(request, openStatus, 0, ""));
                } else {
                    ++calls;
                    if (!call(peer, request)) {
                        return;
                    }
                }
            }
        });
    }

    void serveAnswers(Answer answer) {
        serve(
            [answer = std::move(answer)](const SeqpacketServer::Peer& peer, const Packet& request) {
                peer.send(answer(request));
                return true;
            });
    }

    /// A server of which the first call is handled by `fault`, and every later one answered "ok".
    void serveOneFault(Calls fault) {
        serve([this, fault = std::move(fault)](const SeqpacketServer::Peer& peer,
                                               const Packet& request) {
            if (calls == 1) {
                return fault(peer, request);
            }
            peer.send(reply(request, 0, 2, "ok"));
            return true;
        });
    }

    Status open() {
        const ServiceHandle service = registry.findByClassName("Keystrand");
        const Status status = channel.open(service, 0, &connection);
        registry.release(service);
        return status;
    }

    Status call(std::size_t offered = 16) {
        output.fill(0xAA);
        outputSize = offered;
        return channel.structCall(connection, 0, "input", 5, output.data(), &outputSize);
    }

    void expectOutputUntouched(std::size_t offered = 16) const {
        EXPECT_EQ(outputSize, offered);
        EXPECT_TRUE(std::all_of(output.begin(), output.end(),
                                [](std::uint8_t byte) { return byte == 0xAA; }));
    }

    void expectNextCallWorks() {
        EXPECT_EQ(call(), kSuccess);
        EXPECT_EQ(std::string(output.begin(), output.begin() + 2), "ok");
        EXPECT_EQ(outputSize, 2U);
    }

    support::TemporaryDirectory directory;
    std::string path = directory.file("service.sock");
    FakeSystemLog log;
    LinuxServiceRegistry registry{path, log, kPatient};
    LinuxKernelChannel channel{path, registry, log, kPatient};
    ConnectionHandle connection = kNoConnection;
    std::array<std::uint8_t, 300> output{};
    std::size_t outputSize = 0;
    /// Read it only after the server's end.
    Packet openRequest;
    std::atomic<int> opens = 0;
    std::atomic<int> calls = 0;
    std::atomic<Status> openStatus = kSuccess;
    std::optional<SeqpacketServer> server;
};

TEST_F(LinuxKernelChannelTest, StructCallSendsSelectorOfferedSizeAndInput) {
    Packet seen;
    serveAnswers([&](const Packet& request) {
        seen = request;
        return reply(request, 0, 3, "out");
    });
    ASSERT_EQ(open(), kSuccess);
    EXPECT_EQ(call(300), kSuccess);
    EXPECT_EQ(outputSize, 3U);
    EXPECT_EQ(output[3], 0xAA);
    server.reset();
    ASSERT_EQ(seen.size(), 16U + 8 + 5);
    EXPECT_EQ(Packet(seen.begin() + 16, seen.end()),
              (Packet{0, 0, 0, 0, 0x2c, 1, 0, 0, 'i', 'n', 'p', 'u', 't'}));
}

TEST_F(LinuxKernelChannelTest, OpenSendsTypeAndPath) {
    serveAnswers([](const Packet& request) { return reply(request, 0, 0, ""); });
    ASSERT_EQ(open(), kSuccess);
    EXPECT_NE(connection, kNoConnection);
    server.reset();
    EXPECT_EQ(openRequest, (Packet{'K', 'S', 'T', 'Q', 1, 4, 0, 0,   1,   0,   0,   0,   0,
                                   0,   0,   0,   0,   0, 0, 0, '/', 'e', 'n', 't', 'r', 'y'}));
}

TEST_F(LinuxKernelChannelTest, AbsentSocketIsENOENTAndAnUnservedOneECONNREFUSED) {
    KernelSocketConnection nobody(path, log, kPatient);
    EXPECT_EQ(nobody.connect(), statusFromErrno(ENOENT));
    serveAnswers([](const Packet& request) { return reply(request, 0, 0, ""); });
    server.reset();
    EXPECT_EQ(nobody.connect(), statusFromErrno(ECONNREFUSED));
    KernelSocketConnection tooLong(std::string(108, 'x'), log, kPatient);
    EXPECT_EQ(tooLong.connect(), statusFromErrno(ENAMETOOLONG));
    const std::string line = "kstd: KernelSocket: cannot connect to ";
    EXPECT_THAT(log.texts(), ElementsAre(line + path + ": No such file or directory.",
                                         line + path + ": Connection refused.",
                                         line + "its socket: File name too long."));
}

TEST_F(LinuxKernelChannelTest, ReasonIsToldOnceUntilAConnectionWasMade) {
    KernelSocketConnection client(path, log, kPatient, "a-program");
    const std::string line = "a-program: KernelSocket: cannot connect to " + path + ": ";
    for (int i = 0; i < 2; ++i) {
        EXPECT_EQ(client.connect(), statusFromErrno(ENOENT));
        EXPECT_THAT(log.texts(), ElementsAre(line + "No such file or directory."));
    }
    serveAnswers([](const Packet& request) { return reply(request, 0, 0, ""); });
    EXPECT_EQ(client.connect(), kSuccess);
    EXPECT_EQ(client.connectStatus(), kSuccess);
    client.disconnect();
    server.reset();
    EXPECT_EQ(client.connect(), statusFromErrno(ECONNREFUSED));
    EXPECT_EQ(client.connectStatus(), statusFromErrno(ECONNREFUSED));
    EXPECT_THAT(log.texts(),
                ElementsAre(line + "No such file or directory.", line + "Connection refused."));
}

TEST_F(LinuxKernelChannelTest, LongestNamesAndPathsFitIntoALine) {
    path.append(107 - path.size(), 'p');
    const std::string program(255, 'n');
    LinuxServiceRegistry named(path, log, kPatient, program);
    const std::string service(255, 's');
    EXPECT_EQ(named.findByClassName(service), kNoService);
    server.emplace(path, [](const SeqpacketServer::Peer& peer) {
        peer.send(reply(peer.receive(), statusFromErrno(ENOTRECOVERABLE), 0, ""));
    });
    EXPECT_NE(named.findByClassName(service), kNoService);
    EXPECT_THAT(log.texts(), ElementsAre(program + ": KernelSocket: cannot connect to " + path +
                                             ": No such file or directory.",
                                         program + ": ServiceRegistry: cannot find " + service +
                                             " at " + path + ": State not recoverable."));
}

/// What opening fails with when the service was looked up by its class.
class WithheldServiceTest : public LinuxKernelChannelTest {
  protected:
    void expectOpening(Status status, const std::string& line) {
        for (int i = 0; i < 2; ++i) {
            EXPECT_EQ(registry.findByPath("/entry"), kNoService);
            EXPECT_NE(registry.findByClassName("Keystrand"), kNoService);
            EXPECT_EQ(open(), status);
            EXPECT_EQ(connection, kNoConnection);
        }
        EXPECT_THAT(log.texts(), ElementsAre(line));
    }
};

TEST_F(WithheldServiceTest, SocketThatNobodyServes) {
    serveAnswers([](const Packet& request) { return reply(request, 0, 0, ""); });
    server.reset();
    expectOpening(statusFromErrno(ECONNREFUSED),
                  "kstd: KernelSocket: cannot connect to " + path + ": Connection refused.");
    serveAnswers([](const Packet& request) { return reply(request, 0, 0, ""); });
    EXPECT_EQ(open(), kSuccess);
}

TEST_F(WithheldServiceTest, SocketThatIsNotThisUsers) {
    if (::geteuid() != 0) {
        GTEST_SKIP() << "needs root, to become a user who may not";
    }
    ASSERT_EQ(::chmod(directory.path().c_str(), 0755), 0);
    serveAnswers([](const Packet& request) { return reply(request, 0, 0, ""); });
    ASSERT_EQ(::chmod(path.c_str(), 0600), 0);
    EXPECT_EQ(support::exitStatusOfChild([&] {
                  constexpr uid_t kNobody = 65534;
                  if (::setuid(kNobody) != 0) {
                      return 1;
                  }
                  expectOpening(statusFromErrno(EACCES), "kstd: KernelSocket: cannot connect to " +
                                                             path + ": Permission denied.");
                  return HasFailure() ? 2 : 0;
              }),
              0);
}

TEST_F(WithheldServiceTest, ServiceThatRefusesTheLookup) {
    server.emplace(path, [](const SeqpacketServer::Peer& peer) {
        for (Packet request = peer.receive(); !request.empty(); request = peer.receive()) {
            peer.send(reply(request, -6002, 0, ""));
        }
    });
    EXPECT_NE(registry.findByClassName("Keystrand"), kNoService);
    EXPECT_EQ(open(), -6002);
    EXPECT_THAT(log.texts(), ElementsAre("kstd: ServiceRegistry: cannot find Keystrand at " + path +
                                         ": refused with status -6002."));
}

TEST_F(WithheldServiceTest, ServiceThatSaysNothing) {
    server.emplace(path, [](const SeqpacketServer::Peer& peer) { peer.stayingSilent(); });
    LinuxServiceRegistry impatient(path, log, std::chrono::milliseconds(20));
    LinuxKernelChannel on(path, impatient, log, kPatient);
    EXPECT_EQ(on.open(impatient.findByClassName("Keystrand"), 0, &connection),
              statusFromErrno(ETIMEDOUT));
    EXPECT_THAT(log.texts(), ElementsAre("kstd: ServiceRegistry: cannot find Keystrand at " + path +
                                         ": Connection timed out."));
}

TEST_F(WithheldServiceTest, LookupsThatFailDoNotUseUpTheEntries) {
    serveAnswers([](const Packet& request) { return reply(request, 0, 0, ""); });
    server.reset();
    for (std::size_t i = 0; i < 2 * LinuxServiceRegistry::kMaxEntries; ++i) {
        EXPECT_NE(registry.findByClassName("Keystrand"), kNoService);
    }
    serveAnswers([](const Packet& request) { return reply(request, 0, 0, ""); });
    EXPECT_EQ(open(), kSuccess);
}

TEST_F(LinuxKernelChannelTest, HandleThatIsNotHeldCannotBeOpened) {
    serveAnswers([](const Packet& request) { return reply(request, 0, 0, ""); });
    EXPECT_EQ(channel.open(kNoService, 0, &connection), statusFromErrno(ENOENT));
    EXPECT_EQ(channel.open(7, 0, &connection), statusFromErrno(ENOENT));
    EXPECT_EQ(connection, kNoConnection);
}

TEST_F(LinuxKernelChannelTest, RefusedOpenPassesItsStatusAndStoresNothing) {
    serveAnswers([](const Packet& request) { return reply(request, 0, 0, ""); });
    openStatus = -6004;
    EXPECT_EQ(open(), -6004);
    EXPECT_EQ(connection, kNoConnection);
    openStatus = kSuccess;
    EXPECT_EQ(open(), kSuccess);
}

TEST_F(LinuxKernelChannelTest, CallsOnNoConnectionAreEBADF) {
    EXPECT_EQ(call(), statusFromErrno(EBADF));
    expectOutputUntouched();
    std::uint64_t scalar = 0;
    std::uint32_t count = 1;
    EXPECT_EQ(channel.scalarCall(3, 2, nullptr, 0, &scalar, &count), statusFromErrno(EBADF));
}

TEST_F(LinuxKernelChannelTest, StatusOfTheKernelPassesUnchangedAndLeavesTheOutput) {
    for (const Status status : {-1, -5, -42, 1, -6006, -1110, std::numeric_limits<Status>::min(),
                                std::numeric_limits<Status>::max()}) {
        serveAnswers([status](const Packet& request) { return reply(request, status, 9, ""); });
        connection = kNoConnection;
        ASSERT_EQ(open(), kSuccess);
        EXPECT_EQ(call(), status);
        expectOutputUntouched();
        server.reset();
    }
}

TEST_F(LinuxKernelChannelTest, ReplyOfTheOfferedSizeIsTakenAndOneByteMoreToldOnly) {
    std::atomic<std::uint32_t> size = 16;
    serveAnswers(
        [&](const Packet& request) { return reply(request, 0, size, std::string(size, 'x')); });
    ASSERT_EQ(open(), kSuccess);
    EXPECT_EQ(call(), kSuccess);
    EXPECT_EQ(outputSize, 16U);
    size = 17;
    EXPECT_EQ(call(), kSuccess);
    expectOutputUntouched(17);
    size = 0;
    EXPECT_EQ(call(), kSuccess);
    EXPECT_EQ(outputSize, 0U);
    EXPECT_EQ(opens, 1);
}

TEST_F(LinuxKernelChannelTest, NoOutputTakesOnlyAnEmptyReply) {
    std::atomic<std::uint32_t> size = 0;
    serveAnswers(
        [&](const Packet& request) { return reply(request, 0, size, std::string(size, 'x')); });
    ASSERT_EQ(open(), kSuccess);
    EXPECT_EQ(channel.structCall(connection, 0, nullptr, 0, nullptr, nullptr), kSuccess);
    size = 1;
    EXPECT_EQ(channel.structCall(connection, 0, nullptr, 0, nullptr, nullptr),
              statusFromErrno(EMSGSIZE));
}

/// A reply that breaks the rules.
struct BadReply {
    const char* name;
    Packet (*make)(const Packet& request);
    int error;
};

class BadReplyTest : public LinuxKernelChannelTest, public testing::WithParamInterface<BadReply> {};

TEST_P(BadReplyTest, GivesAPlatformStatusAndTheNextCallWorks) {
    serveOneFault([](const SeqpacketServer::Peer& peer, const Packet& request) {
        peer.send(GetParam().make(request));
        return true;
    });
    ASSERT_EQ(open(), kSuccess);
    EXPECT_EQ(call(), statusFromErrno(GetParam().error));
    expectOutputUntouched();
    expectNextCallWorks();
    EXPECT_EQ(opens, 2);
}

Packet changed(Packet packet, std::size_t at, std::uint8_t by) {
    packet[at] = static_cast<std::uint8_t>(packet[at] ^ by);
    return packet;
}

Packet cutTo(Packet packet, std::size_t size) {
    packet.resize(size, 'x');
    return packet;
}

INSTANTIATE_TEST_SUITE_P(
    Replies, BadReplyTest,
    testing::Values(
        BadReply{"Magic", [](const Packet& r) { return changed(reply(r, 0, 2, "no"), 0, 1); },
                 EPROTO},
        BadReply{"Version", [](const Packet& r) { return changed(reply(r, 0, 2, "no"), 4, 3); },
                 EPROTO},
        BadReply{"OtherOperation",
                 [](const Packet& r) { return changed(reply(r, 0, 2, "no"), 5, 3); }, EPROTO},
        BadReply{"WrongSequence",
                 [](const Packet& r) { return changed(reply(r, 0, 2, "no"), 8, 1); }, EPROTO},
        BadReply{"WrongSequenceInItsLastByte",
                 [](const Packet& r) { return changed(reply(r, 0, 2, "no"), 15, 1); }, EPROTO},
        BadReply{"OneByte", [](const Packet& r) { return cutTo(reply(r, 0, 0, ""), 1); }, EPROTO},
        BadReply{"HeaderOneByteShort",
                 [](const Packet& r) { return cutTo(reply(r, 0, 0, ""), 23); }, EPROTO},
        BadReply{"BodyShorterThanReported", [](const Packet& r) { return reply(r, 0, 3, "no"); },
                 EPROTO},
        BadReply{"BodyLongerThanReported", [](const Packet& r) { return reply(r, 0, 1, "no"); },
                 EPROTO},
        BadReply{"LargerThanAnyMessage",
                 [](const Packet& r) { return cutTo(reply(r, 0, 2, "no"), 131073); }, EMSGSIZE}),
    [](const auto& test) { return std::string(test.param.name); });

TEST_F(LinuxKernelChannelTest, ReservedBytesOfAReplyAreNotLookedAt) {
    serveAnswers([](const Packet& request) {
        return changed(changed(reply(request, 0, 2, "ok"), 6, 0x80), 7, 0xff);
    });
    ASSERT_EQ(open(), kSuccess);
    expectNextCallWorks();
    expectNextCallWorks();
    EXPECT_EQ(opens, 1);
}

TEST_F(LinuxKernelChannelTest, ReplyThatSaysMoreThanItBringsEndsTheConnection) {
    serveOneFault([](const SeqpacketServer::Peer& peer, const Packet& request) {
        peer.send(reply(request, 0, UINT32_MAX, "0123456789"));
        return true;
    });
    ASSERT_EQ(open(), kSuccess);
    EXPECT_EQ(call(), kSuccess);
    EXPECT_FALSE(channel.isConnected(connection));
    expectOutputUntouched(UINT32_MAX);
    expectNextCallWorks();
    EXPECT_EQ(opens, 2);
    EXPECT_TRUE(channel.isConnected(connection));
}

TEST_F(LinuxKernelChannelTest, ScalarReplyThatSaysMoreThanItBringsEndsTheConnection) {
    serveOneFault([](const SeqpacketServer::Peer& peer, const Packet& request) {
        peer.send(reply(request, 0, UINT32_MAX, "0123456789"));
        return true;
    });
    ASSERT_EQ(open(), kSuccess);
    std::uint64_t scalar = 9;
    std::uint32_t count = 1;
    EXPECT_EQ(channel.scalarCall(connection, 2, nullptr, 0, &scalar, &count), kSuccess);
    EXPECT_EQ(count, UINT32_MAX);
    EXPECT_EQ(scalar, 9U);
    EXPECT_FALSE(channel.isConnected(connection));
    expectNextCallWorks();
}

TEST_F(LinuxKernelChannelTest, SixteenConnectionsAreTheLimit) {
    serveAnswers([](const Packet& request) { return reply(request, 0, 2, "ok"); });
    for (std::size_t i = 0; i < LinuxKernelChannel::kMaxConnections; ++i) {
        ASSERT_EQ(open(), kSuccess);
        EXPECT_EQ(connection, i + 1);
    }
    EXPECT_EQ(open(), statusFromErrno(EMFILE));
    expectNextCallWorks();
}

TEST_F(LinuxKernelChannelTest, PassedDeadlineSendsNothing) {
    serveAnswers([](const Packet& request) { return reply(request, 0, 2, "ok"); });
    ASSERT_EQ(open(), kSuccess);
    channel.setDeadline(std::chrono::steady_clock::now());
    EXPECT_EQ(call(), statusFromErrno(ETIMEDOUT));
    expectOutputUntouched();
    EXPECT_EQ(calls, 0);
    EXPECT_TRUE(channel.isConnected(connection));
    channel.setDeadline(std::nullopt);
    expectNextCallWorks();
    EXPECT_EQ(opens, 1);
}

TEST_F(LinuxKernelChannelTest, ConnectionIsNotMadeAfterTheDeadline) {
    serveAnswers([](const Packet& request) { return reply(request, 0, 2, "ok"); });
    const ServiceHandle service = registry.findByClassName("Keystrand");
    channel.setDeadline(std::chrono::steady_clock::now());
    EXPECT_EQ(channel.open(service, 0, &connection), statusFromErrno(ETIMEDOUT));
    registry.setDeadline(std::chrono::steady_clock::now());
    EXPECT_EQ(open(), statusFromErrno(ETIMEDOUT));
    EXPECT_EQ(opens, 0);
    registry.setDeadline(std::nullopt);
    channel.setDeadline(std::nullopt);
    EXPECT_EQ(channel.open(service, 0, &connection), kSuccess);
}

TEST_F(LinuxKernelChannelTest, SignalsDoNotEndACall) {
    struct sigaction noted {};
    noted.sa_handler = [](int) {
    };
    struct sigaction former {};
    ASSERT_EQ(::sigaction(SIGUSR1, &noted, &former), 0);
    const pthread_t client = ::pthread_self();
    serveAnswers([&](const Packet& request) {
        for (int i = 0; i < 100; ++i) {
            ::pthread_kill(client, SIGUSR1);
        }
        return reply(request, 0, 2, "ok");
    });
    ASSERT_EQ(open(), kSuccess);
    for (int i = 0; i < 20; ++i) {
        expectNextCallWorks();
    }
    server.reset();
    ::sigaction(SIGUSR1, &former, nullptr);
}

TEST_F(LinuxKernelChannelTest, PostedRequestIsSentBehindTheOneThatWasNotAnswered) {
    std::vector<std::uint8_t> inputs;
    std::atomic<bool> hungUp = false;
    serve([&](const SeqpacketServer::Peer& peer, const Packet& request) {
        if (calls > 2) {
            peer.send(reply(request, 0, 2, "ok"));
            return true;
        }
        inputs.push_back(request.back());
        if (calls == 2) {
            hungUp = peer.receive().empty();
            peer.send(reply(request, 0, 2, "no"));
            return false;
        }
        return true;
    });
    ASSERT_EQ(open(), kSuccess);
    channel.setDeadline(std::chrono::steady_clock::now() + kImpatient);
    output.fill(0xAA);
    outputSize = 16;
    EXPECT_EQ(channel.structCall(connection, 0, "A", 1, output.data(), &outputSize),
              statusFromErrno(ETIMEDOUT));
    EXPECT_FALSE(channel.isConnected(connection));
    EXPECT_EQ(channel.post(connection, 0, "B", 1), kSuccess);
    channel.setDeadline(std::nullopt);
    expectNextCallWorks();
    server.reset();
    EXPECT_EQ(inputs, (Packet{'A', 'B'}));
    EXPECT_TRUE(hungUp);
    EXPECT_EQ(opens, 2);
}

TEST_F(LinuxKernelChannelTest, PostedRequestIsSentOverAFreshConnectionAfterAHangUp) {
    std::promise<void> first;
    std::promise<void> second;
    serve([&](const SeqpacketServer::Peer&, const Packet& request) {
        (request.back() == 'A' ? first : second).set_value();
        return true;
    });
    ASSERT_EQ(open(), kSuccess);
    EXPECT_EQ(channel.post(connection, 0, "A", 1), kSuccess);
    EXPECT_FALSE(channel.isConnected(connection));
    EXPECT_EQ(channel.post(connection, 0, "B", 1), kSuccess);
    EXPECT_FALSE(channel.isConnected(connection));
    EXPECT_EQ(channel.post(99, 0, "C", 1), statusFromErrno(EBADF));
    for (std::promise<void>* arrival : {&first, &second}) {
        EXPECT_EQ(arrival->get_future().wait_for(std::chrono::seconds(30)),
                  std::future_status::ready);
    }
    server.reset();
    EXPECT_EQ(opens, 2);
    EXPECT_EQ(channel.post(connection, 0, "D", 1), statusFromErrno(ECONNREFUSED));
}

TEST_F(LinuxKernelChannelTest, ConnectionWhoseAnswerIsLateEndsWithTheDeadline) {
    std::atomic<bool> hungUp = false;
    serveOneFault([&](const SeqpacketServer::Peer& peer, const Packet&) {
        hungUp = peer.receive().empty();
        return false;
    });
    ASSERT_EQ(open(), kSuccess);
    channel.setDeadline(std::chrono::steady_clock::now() + kImpatient);
    EXPECT_EQ(call(), statusFromErrno(ETIMEDOUT));
    channel.setDeadline(std::nullopt);
    server.reset();
    EXPECT_TRUE(hungUp);
}

TEST_F(LinuxKernelChannelTest, ChildMakesAConnectionOfItsOwnAndTheParentGoesOn) {
    serveAnswers([](const Packet& request) { return reply(request, 0, 2, "ok"); });
    ASSERT_EQ(open(), kSuccess);
    expectNextCallWorks();
    EXPECT_FALSE(channel.isInherited());
    const int inChild = support::exitStatusOfChild([&] {
        const bool inherited = channel.isInherited() && registry.isInherited();
        const bool works = call() == kSuccess && outputSize == 2;
        return inherited && works && !channel.isInherited() ? 0 : 1;
    });
    EXPECT_EQ(inChild, 0);
    EXPECT_EQ(opens, 2);
    EXPECT_FALSE(channel.isInherited());
    expectNextCallWorks();
    EXPECT_EQ(opens, 2);
    EXPECT_EQ(calls, 3);
}

TEST_F(LinuxKernelChannelTest, ConnectionsThatAreLeftToTheParentMeanNothingAnyMore) {
    serveAnswers([](const Packet& request) { return reply(request, 0, 2, "ok"); });
    ASSERT_EQ(open(), kSuccess);
    const int inChild = support::exitStatusOfChild([&] {
        channel.leaveToParent();
        registry.leaveToParent();
        const bool meansNothing =
            call() == statusFromErrno(EBADF) && !channel.isInherited() && !registry.isInherited();
        return meansNothing && open() == kSuccess && connection == 1 && call() == kSuccess ? 0 : 1;
    });
    EXPECT_EQ(inChild, 0);
    expectNextCallWorks();
    EXPECT_EQ(opens, 2);
}

TEST_F(LinuxKernelChannelTest, HangUpInsteadOfAnAnswerIsReportedAndTheRequestNotSentAgain) {
    serveOneFault([](const SeqpacketServer::Peer&, const Packet&) { return false; });
    ASSERT_EQ(open(), kSuccess);
    EXPECT_EQ(call(), statusFromErrno(ECONNRESET));
    expectOutputUntouched();
    EXPECT_EQ(calls, 1);
    expectNextCallWorks();
    EXPECT_EQ(calls, 2);
}

TEST_F(LinuxKernelChannelTest, ServiceThatHangsUpOnEveryConnectionGivesAPlatformStatus) {
    serveAnswers([](const Packet& request) { return reply(request, 0, 2, "ok"); });
    ASSERT_EQ(open(), kSuccess);
    server.reset();
    server.emplace(path, [](const SeqpacketServer::Peer&) {});
    // Whether the hang-up is seen before or after the request was sent is the system's affair.
    EXPECT_THAT(call(), testing::AnyOf(statusFromErrno(EPIPE), statusFromErrno(ECONNRESET)));
    expectOutputUntouched();
    server.reset();
    serveAnswers([](const Packet& request) { return reply(request, 0, 2, "ok"); });
    expectNextCallWorks();
}

TEST_F(LinuxKernelChannelTest, OpeningThatIsNotAnsweredIsGivenUp) {
    server.emplace(path, [](const SeqpacketServer::Peer& peer) {
        for (Packet request = peer.receive(); !request.empty(); request = peer.receive()) {
            if (request[5] == kFind) {
                peer.send(reply(request, 0, 1, "/entry"));
            }
        }
    });
    const ServiceHandle service = registry.findByClassName("Keystrand");
    LinuxKernelChannel impatient(path, registry, log, std::chrono::milliseconds(20));
    EXPECT_EQ(impatient.open(service, 0, &connection), statusFromErrno(ETIMEDOUT));
}

TEST_F(LinuxKernelChannelTest, LateAnswerIsNotTakenForTheNextOne) {
    std::atomic<bool> firstSeen = false;
    serveOneFault([&](const SeqpacketServer::Peer& peer, const Packet& request) {
        // The client hangs up when its patience ends; only then comes the answer.
        firstSeen = true;
        peer.stayingSilent();
        peer.send(reply(request, 0, 2, "no"));
        return false;
    });
    ASSERT_EQ(open(), kSuccess);
    channel.setDeadline(std::chrono::steady_clock::now() + kImpatient);
    outputSize = 16;
    EXPECT_EQ(channel.structCall(connection, 0, "input", 5, output.data(), &outputSize),
              statusFromErrno(ETIMEDOUT));
    EXPECT_EQ(outputSize, 16U);
    channel.setDeadline(std::nullopt);
    EXPECT_EQ(channel.structCall(connection, 0, "input", 5, output.data(), &outputSize), kSuccess);
    EXPECT_EQ(std::string(output.begin(), output.begin() + 2), "ok");
    EXPECT_TRUE(firstSeen);
}

TEST_F(LinuxKernelChannelTest, RestartedServiceIsReconnectedAndOpenedBeforeTheRequestIsSent) {
    serveAnswers([](const Packet& request) { return reply(request, 0, 2, "ok"); });
    ASSERT_EQ(open(), kSuccess);
    expectNextCallWorks();
    server.reset();
    EXPECT_EQ(call(), statusFromErrno(ECONNREFUSED));
    serveAnswers([](const Packet& request) { return reply(request, 0, 2, "ok"); });
    expectNextCallWorks();
    EXPECT_EQ(opens, 2);
    server.reset();
    serveAnswers([](const Packet& request) { return reply(request, 0, 2, "ok"); });
    expectNextCallWorks();
    EXPECT_EQ(opens, 3);
    EXPECT_EQ(calls, 3);
}

TEST_F(LinuxKernelChannelTest, RestartedServiceThatRefusesToOpenPassesItsStatus) {
    serveAnswers([](const Packet& request) { return reply(request, 0, 2, "ok"); });
    ASSERT_EQ(open(), kSuccess);
    server.reset();
    openStatus = -77;
    serveAnswers([](const Packet& request) { return reply(request, 0, 2, "ok"); });
    EXPECT_EQ(call(), -77);
    EXPECT_EQ(calls, 0);
    openStatus = kSuccess;
    expectNextCallWorks();
}

TEST_F(LinuxKernelChannelTest, InputThatFillsAMessageIsSentWholeAndOneByteMoreRefused) {
    std::atomic<std::size_t> received = 0;
    serveAnswers([&](const Packet& request) {
        received = request.size();
        return reply(request, 0, 2, "ok");
    });
    ASSERT_EQ(open(), kSuccess);
    const std::size_t room = 131072 - 16 - 8;
    for (const std::size_t size : {room - 1, room}) {
        const std::vector<std::uint8_t> input(size, 7);
        outputSize = 16;
        EXPECT_EQ(channel.structCall(connection, 0, input.data(), size, output.data(), &outputSize),
                  kSuccess);
        EXPECT_EQ(received, size + 24);
    }
    for (const std::size_t size : {room + 1, room + 1000, std::size_t{1} << 20}) {
        const std::vector<std::uint8_t> input(size, 7);
        EXPECT_EQ(channel.structCall(connection, 0, input.data(), size, output.data(), &outputSize),
                  statusFromErrno(EMSGSIZE));
    }
    EXPECT_EQ(calls, 2);
    expectNextCallWorks();
    EXPECT_EQ(opens, 1);
}

TEST_F(LinuxKernelChannelTest, ScalarCallSendsAndTakesNumbers) {
    Packet seen;
    serveAnswers([&](const Packet& request) {
        seen = request;
        return reply(request, 0, 2, std::string("\x01\0\0\0\0\0\0\0\0\0\0\0\0\0\0\x80", 16));
    });
    ASSERT_EQ(open(), kSuccess);
    const std::uint64_t inputs[] = {5, UINT64_MAX};
    std::uint64_t outputs[3] = {9, 9, 9};
    std::uint32_t count = 3;
    EXPECT_EQ(channel.scalarCall(connection, 2, inputs, 2, outputs, &count), kSuccess);
    EXPECT_EQ(count, 2U);
    EXPECT_THAT(outputs, ElementsAre(1, 1ULL << 63U, 9));
    server.reset();
    EXPECT_EQ(Packet(seen.begin() + 16, seen.end()),
              (Packet{2, 0, 0, 0, 3, 0, 0,    0,    2,    0,    0,    0,    5,    0,
                      0, 0, 0, 0, 0, 0, 0xff, 0xff, 0xff, 0xff, 0xff, 0xff, 0xff, 0xff}));
}

TEST_F(LinuxKernelChannelTest, ScalarReplyThatDoesNotFitIsNotStoredAndOneThatDoesNotAddUpRefused) {
    std::atomic<std::uint32_t> reported = 2;
    serveAnswers(
        [&](const Packet& request) { return reply(request, 0, reported, std::string(15, 'x')); });
    ASSERT_EQ(open(), kSuccess);
    std::uint64_t scalar = 9;
    std::uint32_t count = 1;
    EXPECT_EQ(channel.scalarCall(connection, 2, nullptr, 0, &scalar, &count), kSuccess);
    EXPECT_EQ(count, 2U);
    reported = 1;
    count = 1;
    EXPECT_EQ(channel.scalarCall(connection, 2, nullptr, 0, &scalar, &count),
              statusFromErrno(EPROTO));
    EXPECT_EQ(scalar, 9U);
    EXPECT_EQ(count, 1U);
}

TEST_F(LinuxKernelChannelTest, ScalarCallThatFailsLeavesItsOutput) {
    serveAnswers([](const Packet& request) { return reply(request, -6004, 0, ""); });
    ASSERT_EQ(open(), kSuccess);
    std::uint64_t scalar = 9;
    std::uint32_t count = 1;
    EXPECT_EQ(channel.scalarCall(connection, 2, nullptr, 0, &scalar, &count), -6004);
    server.reset();
    EXPECT_EQ(channel.scalarCall(connection, 2, nullptr, 0, &scalar, &count),
              statusFromErrno(ECONNREFUSED));
    EXPECT_EQ(scalar, 9U);
    EXPECT_EQ(count, 1U);
}

TEST_F(LinuxKernelChannelTest, SixteenScalarsAreTheLimit) {
    serveAnswers([](const Packet& request) { return reply(request, 0, 0, ""); });
    ASSERT_EQ(open(), kSuccess);
    const std::array<std::uint64_t, 17> inputs{};
    EXPECT_EQ(channel.scalarCall(connection, 2, inputs.data(), 16, nullptr, nullptr), kSuccess);
    EXPECT_EQ(channel.scalarCall(connection, 2, inputs.data(), 17, nullptr, nullptr),
              statusFromErrno(E2BIG));
    std::array<std::uint64_t, 17> outputs{};
    std::uint32_t count = 17;
    EXPECT_EQ(channel.scalarCall(connection, 2, nullptr, 0, outputs.data(), &count),
              statusFromErrno(E2BIG));
}

TEST_F(LinuxKernelChannelTest, ServiceOfAnotherUserIsRefusedWithALine) {
    if (::geteuid() != 0) {
        GTEST_SKIP() << "needs root, to serve as another user";
    }
    constexpr uid_t kNobody = 65534;
    ASSERT_EQ(::chmod(directory.path().c_str(), 0777), 0);
    // Root trusts itself only, so the client here is root and the server is not.
    const pid_t child = ::fork();
    if (child == 0) {
        const int listener = ::socket(AF_UNIX, SOCK_SEQPACKET, 0);
        sockaddr_un address{};
        address.sun_family = AF_UNIX;
        path.copy(address.sun_path, sizeof address.sun_path - 1);
        const bool listening =
            ::setuid(kNobody) == 0 &&
            ::bind(listener, reinterpret_cast<const sockaddr*>(&address), sizeof address) == 0 &&
            ::listen(listener, 1) == 0;
        ::raise(SIGSTOP);
        ::_exit(listening ? 0 : 1);
    }
    int status = 0;
    ::waitpid(child, &status, WUNTRACED);
    KernelSocketConnection foreign(path, log, kPatient);
    EXPECT_EQ(foreign.connect(), statusFromErrno(EPERM));
    EXPECT_THAT(log.texts(),
                ElementsAre("kstd: KernelSocket: " + path + " is served by user 65534, refused."));
    ::kill(child, SIGCONT);
    ::waitpid(child, &status, 0);
    EXPECT_EQ(WEXITSTATUS(status), 0);
}

} // namespace
} // namespace platform
