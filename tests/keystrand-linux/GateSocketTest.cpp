// What an administrator's tool gets, over the real socket.

#include "keystrand-linux/GateSocket.h"

#include "base/UnixAddress.h"
#include "tests/keystrand-linux/FakeUsbBus.h"
#include "tests/keystrand-linux/MachineDoubles.h"
#include "tests/support/TemporaryDirectory.h"

#include <gtest/gtest.h>

#include <csignal>
#include <sys/socket.h>
#include <thread>

namespace keystrand::usb {
namespace {

using namespace std::chrono_literals;

class GateSocketTest : public testing::Test {
  protected:
    GateSocketTest() {
        bus.addRootHub(1);
        bus.plug("1-1", aMouse());
        keystrand.start();
        bus.plug("1-2", aDisk());
    }

    /// Sends the packets over one connection, and returns the answers; an empty one for an end.
    std::vector<std::string> ask(const std::vector<std::string>& packets) {
        const std::unique_ptr<EventLoop> loop = EventLoop::create();
        const EventSource end = loop->signal(SIGUSR1, [&] { loop->stop(); });
        std::string error;
        const GateSocket socket(*loop,
                                std::move(*ListeningSocket::open(path, SOCK_SEQPACKET, error)),
                                keystrand, clocks);
        std::vector<std::string> answers;
        std::thread tool([&] {
            const base::FileDescriptor fd(::socket(AF_UNIX, SOCK_SEQPACKET | SOCK_CLOEXEC, 0));
            const auto address = base::UnixAddress::of(path);
            if (::connect(fd.get(), address->get(), address->size()) == 0) {
                for (const std::string& packet : packets) {
                    std::string answer(wire::kGateAnswerSize, '\0');
                    static_cast<void>(::send(fd.get(), packet.data(), packet.size(), MSG_NOSIGNAL));
                    const ssize_t size = ::recv(fd.get(), answer.data(), answer.size(), 0);
                    answer.resize(size > 0 ? static_cast<std::size_t>(size) : 0);
                    answers.push_back(answer);
                }
            }
            ::kill(::getpid(), SIGUSR1);
        });
        EXPECT_TRUE(loop->run());
        tool.join();
        return answers;
    }
    std::optional<wire::GateAnswer> ask(const wire::GateRequest& request) {
        const auto answers = ask(std::vector{wire::encodeGateRequest(request)});
        return answers.size() == 1 ? wire::decodeGateAnswer(answers[0]) : std::nullopt;
    }

    Keystrand::Parts partsWith(KernelState& model, const StateFile& gateRecord) {
        return {.kernel = model,
                .events = poster,
                .clock = clocks,
                .lockState = sessions,
                .bus = bus,
                .record = gateRecord,
                .devices = devices,
                .log = log,
                .switches = [] { return PolicySwitches(); },
                .sleepAgain = [] {},
                .rearm =
                    [] {
                    }};
    }

    support::TemporaryDirectory directory;
    std::string path = directory.file("gate.sock");
    StateFile record{directory.file("gate"), StateFile::Durability::none};
    StateFile devices{directory.file("devices"), StateFile::Durability::none};
    FakeUsbBus bus;
    Clocks clocks;
    Sessions sessions;
    Poster poster;
    Log log;
    KernelState kernel;
    Keystrand keystrand{partsWith(kernel, record), Keystrand::Settings{}};
};

TEST_F(GateSocketTest, ListsDevices) {
    clocks.pass(7s);
    const auto answer = ask(wire::GateDevicesRequest());
    ASSERT_TRUE(answer && std::holds_alternative<wire::GateDevices>(*answer));
    const auto& listed = std::get<wire::GateDevices>(*answer);
    ASSERT_EQ(listed.size(), 2U);
    EXPECT_EQ(listed[0].port, "1-1");
    EXPECT_TRUE(listed[0].accepted);
    EXPECT_EQ(listed[0].rule, "attached");
    EXPECT_EQ(listed[1].port, "1-2");
    EXPECT_FALSE(listed[1].accepted);
    EXPECT_EQ(listed[1].rule, "refused");
    EXPECT_EQ(listed[1].vendor, 0x1111);
    EXPECT_EQ(listed[1].name, "disk");
    EXPECT_EQ(listed[1].classes, "08/06/50");
    EXPECT_EQ(listed[1].forSeconds, 7U);
}

TEST_F(GateSocketTest, AcceptsTheDeviceThatWasListed) {
    const Attachment seen = bus.attachmentAt("1-2");
    const wire::GateAcceptRequest accept{seen.port, seen.number, seen.inode};
    EXPECT_EQ(ask(accept), wire::GateAnswer(wire::GateDone()));
    EXPECT_TRUE(bus.isAuthorized("1-2"));
    bus.replug("1-2");
    EXPECT_EQ(ask(accept), wire::GateAnswer(wire::GateRefusal{"the device is not there any more"}));
    EXPECT_FALSE(bus.isAuthorized("1-2"));
}

TEST_F(GateSocketTest, OpensForAWhile) {
    EXPECT_EQ(ask(wire::GateOpenRequest{60}), wire::GateAnswer(wire::GateDone()));
    EXPECT_EQ(bus.rootHubDefault(1), kEverybody);
    auto answer = ask(wire::GateStatusRequest());
    ASSERT_TRUE(answer && std::holds_alternative<wire::GateStatus>(*answer));
    EXPECT_EQ(std::get<wire::GateStatus>(*answer), (wire::GateStatus{.locked = true,
                                                                     .starting = true,
                                                                     .closed = false,
                                                                     .untilRestricted = 3600,
                                                                     .untilClosed = 60}));
    EXPECT_EQ(ask(wire::GateOpenRequest{0}), wire::GateAnswer(wire::GateDone()));
    EXPECT_EQ(bus.rootHubDefault(1), kHardWiredOnly);
}

/// A service has died here, and nobody can read what it noted.
class LostRecordSocketTest : public GateSocketTest {
  protected:
    LostRecordSocketTest() {
        std::string problem;
        EXPECT_TRUE(lostRecord.replace("nonsense\n", problem));
        next.start();
    }
    std::string gap() {
        const auto answer = usb::answer(next, clocks, wire::GateStatusRequest());
        return std::get<wire::GateStatus>(answer).gap;
    }

    StateFile lostRecord{directory.file("lost"), StateFile::Durability::none};
    KernelState nextKernel;
    Keystrand next{partsWith(nextKernel, lostRecord), Keystrand::Settings{}};
};

TEST_F(LostRecordSocketTest, StatusNamesWhatStaysClosedWhenTheGateIsOpen) {
    EXPECT_EQ(gap(), "");
    sessions.say(LockState::Said::unlocked);
    EXPECT_EQ(gap(), "the parameter authorized_default, root hub usb1 (who closed it is not known "
                     "any more: keystrand --restore --all opens it)");
    bus.setRootHubDefault(1, kEverybody);
    bus.setParameterDefault(kEverybody);
    EXPECT_EQ(gap(), "");
}

TEST_F(GateSocketTest, WhatIsNoRequestIsRefusedAndTheNextOneAnswered) {
    const auto answers = ask({"nonsense\n", std::string(wire::kGateRequestSize + 1, 'x'),
                              std::string(4096, '\0'), "status\n"});
    ASSERT_EQ(answers.size(), 4U);
    for (std::size_t index = 0; index < 3; ++index) {
        EXPECT_EQ(answers[index], "error not understood\n");
    }
    EXPECT_TRUE(wire::decodeGateAnswer(answers[3]));
}

TEST_F(GateSocketTest, OneToolMayAskAgainAndAgain) {
    const auto answers = ask(std::vector<std::string>(100, "status\n"));
    ASSERT_EQ(answers.size(), 100U);
    for (const std::string& answer : answers) {
        EXPECT_TRUE(wire::decodeGateAnswer(answer)) << answer;
    }
}

} // namespace
} // namespace keystrand::usb
