#include "platform/linux/LinuxServiceRegistry.h"

#include "platform/fake/FakeSystemLog.h"
#include "tests/platform/linux/KernelReplies.h"
#include "tests/support/SeqpacketServer.h"
#include "tests/support/TemporaryDirectory.h"

#include <gtest/gtest.h>

#include <atomic>
#include <filesystem>
#include <fstream>
#include <limits>
#include <optional>
#include <string>

namespace platform {
namespace {

using support::Packet;
using support::SeqpacketServer;

class LinuxServiceRegistryTest : public testing::Test {
  protected:
    /// Answers every request with what `answer` makes of it.
    void serve(std::function<Packet(const Packet& request)> answer) {
        server.emplace(path, [answer = std::move(answer)](const SeqpacketServer::Peer& peer) {
            for (Packet request = peer.receive(); !request.empty(); request = peer.receive()) {
                peer.send(answer(request));
            }
        });
    }

    support::TemporaryDirectory directory;
    std::string path = directory.file("service.sock");
    FakeSystemLog log;
    LinuxServiceRegistry registry{path, log, std::chrono::seconds(30)};
    std::optional<SeqpacketServer> server;
};

TEST_F(LinuxServiceRegistryTest, RequestBytesOfEachOperation) {
    std::vector<Packet> requests;
    serve([&](const Packet& request) {
        requests.push_back(request);
        return support::reply(request, 0, 1, "/a");
    });
    const ServiceHandle entry = registry.findByPath("/p");
    EXPECT_NE(registry.findByClassName("C"), kNoService);
    EXPECT_EQ(registry.copyProperty(entry, "N"), (std::vector<std::uint8_t>{'/', 'a'}));
    server.reset();
    ASSERT_EQ(requests.size(), 3U);
    EXPECT_EQ(requests[0],
              (Packet{'K', 'S', 'T', 'Q', 1, 1, 0, 0, 1, 0, 0, 0, 0, 0, 0, 0, '/', 'p'}));
    EXPECT_EQ(requests[1], (Packet{'K', 'S', 'T', 'Q', 1, 2, 0, 0, 2, 0, 0, 0, 0, 0, 0, 0, 'C'}));
    EXPECT_EQ(requests[2], (Packet{'K', 'S', 'T', 'Q', 1, 3, 0, 0,   3,   0,  0,
                                   0,   0,   0,   0,   0, 2, 0, '/', 'a', 'N'}));
}

TEST_F(LinuxServiceRegistryTest, SameEntryHasOneHandleAndCountedReferences) {
    serve([](const Packet& request) { return support::reply(request, 0, 1, "/a"); });
    const ServiceHandle first = registry.findByPath("/a");
    const ServiceHandle second = registry.findByClassName("A");
    EXPECT_EQ(first, second);
    registry.release(first);
    EXPECT_EQ(registry.pathOf(second), "/a");
    registry.release(second);
    EXPECT_EQ(registry.pathOf(second), "");
    registry.release(second);
    registry.release(kNoService);
}

TEST_F(LinuxServiceRegistryTest, EntryThatIsWithheldHasNoPathAndNoProperties) {
    serve([](const Packet& request) { return support::reply(request, -6002, 0, ""); });
    const ServiceHandle withheld = registry.findByClassName("Keystrand");
    ASSERT_NE(withheld, kNoService);
    EXPECT_EQ(registry.pathOf(withheld), "");
    EXPECT_EQ(registry.statusOf(withheld), -6002);
    EXPECT_EQ(registry.copyProperty(withheld, "N"), std::nullopt);
    registry.release(withheld);
    EXPECT_EQ(registry.statusOf(withheld), kSuccess);
}

TEST_F(LinuxServiceRegistryTest, NoServiceIsWithheldWhereNoSocketCanBe) {
    LinuxServiceRegistry missing(directory.file("missing"), log);
    EXPECT_EQ(missing.findByClassName("Keystrand"), kNoService);
    std::ofstream(directory.file("file")) << "no directory";
    LinuxServiceRegistry below(directory.file("file/service.sock"), log);
    EXPECT_EQ(below.findByClassName("Keystrand"), kNoService);
}

TEST_F(LinuxServiceRegistryTest, PathsInRepliesAtTheirLimits) {
    std::atomic<std::size_t> length = 0;
    std::atomic<int> connections = 0;
    server.emplace(path, [&](const SeqpacketServer::Peer& peer) {
        ++connections;
        for (Packet request = peer.receive(); !request.empty(); request = peer.receive()) {
            peer.send(support::reply(request, 0, 1, std::string(length, 'p')));
        }
    });
    for (const std::size_t known : {1U, 1023U, 1024U}) {
        length = known;
        const ServiceHandle entry = registry.findByPath("/a");
        EXPECT_EQ(registry.pathOf(entry), std::string(known, 'p'));
    }
    EXPECT_EQ(connections, 1);
    for (const std::size_t unknown : {0U, 1025U, 100000U}) {
        length = unknown;
        EXPECT_EQ(registry.findByPath("/a"), kNoService) << unknown;
    }
    length = 1;
    EXPECT_NE(registry.findByPath("/a"), kNoService);
    EXPECT_EQ(connections, 4);
}

TEST_F(LinuxServiceRegistryTest, SeventeenthEntryTakesThePlaceOfTheOneFoundLongestAgo) {
    std::atomic<int> number = 0;
    serve([&](const Packet& request) {
        return support::reply(request, 0, 1, "/" + std::to_string(number));
    });
    std::vector<ServiceHandle> entries;
    for (number = 0; number < 16; ++number) {
        entries.push_back(registry.findByPath("/a"));
        EXPECT_EQ(registry.pathOf(entries.back()), "/" + std::to_string(number));
    }
    EXPECT_EQ(registry.pathOf(entries[0]), "/0");
    // Found again, so that another one is the oldest.
    number = 0;
    EXPECT_EQ(registry.findByPath("/a"), entries[0]);
    number = 16;
    EXPECT_EQ(registry.pathOf(registry.findByClassName("a")), "/16");
    EXPECT_EQ(registry.pathOf(entries[0]), "/0");
    EXPECT_EQ(registry.pathOf(entries[1]), "");
    // What gave way is nobody's, whatever is done with it.
    registry.release(entries[1]);
    EXPECT_FALSE(registry.copyProperty(entries[1], "p"));
    registry.release(entries[3]);
    EXPECT_EQ(registry.pathOf(entries[3]), "");
    number = 17;
    EXPECT_EQ(registry.pathOf(registry.findByPath("/a")), "/17");
    EXPECT_EQ(registry.pathOf(entries[2]), "/2");
}

TEST_F(LinuxServiceRegistryTest, PropertyOfAnEntryThatIsNotHeldIsNone) {
    int requests = 0;
    serve([&](const Packet& request) {
        ++requests;
        return support::reply(request, 0, 1, "x");
    });
    EXPECT_EQ(registry.copyProperty(7, "N"), std::nullopt);
    server.reset();
    EXPECT_EQ(requests, 0);
}

TEST_F(LinuxServiceRegistryTest, AbsentAndEmptyPropertiesAreDifferent) {
    serve([](const Packet& request) {
        if (request[5] != 3) {
            return support::reply(request, 0, 1, "/a");
        }
        return support::reply(request, 0, request.back() == 'E' ? 1 : 0, "");
    });
    const ServiceHandle entry = registry.findByPath("/a");
    EXPECT_EQ(registry.copyProperty(entry, "E"), std::vector<std::uint8_t>{});
    EXPECT_EQ(registry.copyProperty(entry, "A"), std::nullopt);
}

TEST_F(LinuxServiceRegistryTest, TextsBeyondTheLimitsAreNotAskedFor) {
    int requests = 0;
    serve([&](const Packet& request) {
        ++requests;
        return support::reply(request, 0, 1, "/a");
    });
    const ServiceHandle entry = registry.findByPath(std::string(1024, 'p'));
    EXPECT_NE(entry, kNoService);
    EXPECT_EQ(registry.findByPath(std::string(1025, 'p')), kNoService);
    EXPECT_NE(registry.findByClassName(std::string(255, 'c')), kNoService);
    EXPECT_EQ(registry.findByClassName(std::string(256, 'c')), kNoService);
    EXPECT_TRUE(registry.copyProperty(entry, std::string(255, 'n')));
    EXPECT_FALSE(registry.copyProperty(entry, std::string(256, 'n')));
    EXPECT_FALSE(registry.copyProperty(entry, ""));
    server.reset();
    EXPECT_EQ(requests, 3);
}

TEST_F(LinuxServiceRegistryTest, ServiceThatRefusesOrIsMissingHasNoEntries) {
    EXPECT_EQ(registry.findByPath("/a"), kNoService);
    serve([](const Packet& request) { return support::reply(request, -6002, 1, ""); });
    EXPECT_EQ(registry.findByPath("/a"), kNoService);
    server.reset();
    EXPECT_EQ(registry.findByPath("/a"), kNoService);
    serve([](const Packet& request) { return support::reply(request, 0, 1, ""); });
    EXPECT_EQ(registry.findByPath("/a"), kNoService);
    server.reset();
    serve([](const Packet& request) { return support::reply(request, 0, 1, "/a"); });
    EXPECT_NE(registry.findByPath("/a"), kNoService);
}

/// What the operator sees, by which the states of a kernel side can be told apart.
class RegistryWarningsTest : public LinuxServiceRegistryTest {
  protected:
    std::vector<std::string> warningsOf(LinuxServiceRegistry& asked) {
        static_cast<void>(asked.findByClassName("Keystrand"));
        for (const auto& line : log.lines()) {
            EXPECT_EQ(line.level, LogLevel::warning);
        }
        std::vector<std::string> texts = log.texts();
        log.clear();
        return texts;
    }

    [[nodiscard]] std::vector<std::string> cannotFind(const std::string& reason) const {
        return {"kstd: ServiceRegistry: cannot find Keystrand at " + path + ": " + reason + "."};
    }

    const std::vector<std::string> none{};
};

TEST_F(RegistryWarningsTest, AbsentKernelSide) {
    EXPECT_EQ(warningsOf(registry),
              std::vector<std::string>{"kstd: KernelSocket: cannot connect to " + path +
                                       ": No such file or directory."});
    EXPECT_EQ(warningsOf(registry), none);
}

TEST_F(RegistryWarningsTest, SilentKernelSide) {
    server.emplace(path, [](const SeqpacketServer::Peer& peer) {
        static_cast<void>(peer.receive());
        static_cast<void>(peer.receive());
    });
    LinuxServiceRegistry impatient(path, log, std::chrono::milliseconds(1));
    EXPECT_EQ(warningsOf(impatient), cannotFind("Connection timed out"));
}

TEST_F(RegistryWarningsTest, RefusingKernelSide) {
    serve([](const Packet& request) { return support::reply(request, -42, 0, ""); });
    EXPECT_EQ(warningsOf(registry), cannotFind("refused with status -42"));
    EXPECT_EQ(warningsOf(registry), none);
}

TEST_F(RegistryWarningsTest, StatusThatIsNoErrorOfTheSystemIsANumber) {
    std::atomic<std::int32_t> status = 0;
    serve([&status](const Packet& request) { return support::reply(request, status, 0, ""); });
    for (const std::int32_t number :
         {std::numeric_limits<std::int32_t>::max(), 2147482649, 2147482648, 1, -999, -1134, -5095,
          -5096, std::numeric_limits<std::int32_t>::min()}) {
        status = number;
        EXPECT_EQ(warningsOf(registry),
                  cannotFind("refused with status " + std::to_string(number)));
    }
    status = -1001;
    EXPECT_EQ(warningsOf(registry), cannotFind("Operation not permitted"));
}

TEST_F(RegistryWarningsTest, KernelSideWithoutTheEntry) {
    serve([](const Packet& request) { return support::reply(request, 0, 0, ""); });
    EXPECT_EQ(warningsOf(registry), cannotFind("there is none"));
}

TEST_F(RegistryWarningsTest, ReasonIsNewsAgainWhenItHasWorked) {
    EXPECT_EQ(warningsOf(registry).size(), 1U);
    serve([](const Packet& request) { return support::reply(request, 0, 1, "/a"); });
    EXPECT_EQ(warningsOf(registry), none);
    server.reset();
    std::filesystem::remove(path);
    static_cast<void>(warningsOf(registry));
    serve([](const Packet& request) { return support::reply(request, 0, 1, "/a"); });
    EXPECT_EQ(warningsOf(registry), none);
    server.reset();
    std::filesystem::remove(path);
    EXPECT_EQ(warningsOf(registry).size(), 1U);
}

TEST_F(RegistryWarningsTest, CopyThatIsRefusedAndPropertyThatIsNotThere) {
    std::int32_t status = 0;
    serve([&status](const Packet& request) {
        return support::reply(request, request[5] == 3 ? status : 0, request[5] == 3 ? 0 : 1,
                              request[5] == 3 ? "" : "/a");
    });
    const ServiceHandle entry = registry.findByClassName("Keystrand");
    ASSERT_NE(entry, kNoService);
    EXPECT_EQ(registry.copyProperty(entry, "N"), std::nullopt);
    EXPECT_EQ(log.texts(), none);
    status = -7;
    EXPECT_EQ(registry.copyProperty(entry, "N"), std::nullopt);
    EXPECT_EQ(registry.copyProperty(entry, "N"), std::nullopt);
    EXPECT_EQ(log.texts(), std::vector<std::string>{"kstd: ServiceRegistry: cannot copy N at " +
                                                    path + ": refused with status -7."});
}

} // namespace
} // namespace platform
