#include "platform/linux/EventSocket.h"

#include "base/UnixAddress.h"
#include "platform/fake/FakeSystemLog.h"
#include "tests/platform/linux/OpenDescriptors.h"
#include "tests/support/ChildProcess.h"
#include "tests/support/FailingCalls.h"
#include "tests/support/TemporaryDirectory.h"

#include <gmock/gmock.h>

#include <cerrno>
#include <chrono>
#include <cstring>
#include <fcntl.h>
#include <string>
#include <sys/socket.h>
#include <sys/stat.h>
#include <unistd.h>
#include <utility>
#include <vector>

namespace platform {
namespace {

using testing::ElementsAre;

constexpr uid_t kNobody = 65534;

class EventSocketTest : public testing::Test {
  protected:
    void SetUp() override {
        listen();
        sender = ::socket(AF_UNIX, SOCK_DGRAM | SOCK_CLOEXEC, 0);
    }
    void TearDown() override { ::close(sender); }

    void listen() {
        socket.reset();
        socket = std::make_unique<EventSocket>(
            makeEventSocket(path), loop, log, [this](const wire::EventDatagram& event) {
                received.push_back(std::string(event.stream) + " " + std::string(event.name) + " " +
                                   std::to_string(event.payload.size()));
            });
    }

    bool send(const std::vector<std::uint8_t>& datagram) const {
        const auto address = base::UnixAddress::of(path);
        return ::sendto(sender, datagram.data(), datagram.size(), 0, address->get(),
                        address->size()) == static_cast<ssize_t>(datagram.size());
    }

    /// Handles what is there.
    void runAll(int turns) {
        for (int i = 0; i < turns; ++i) {
            EXPECT_TRUE(loop.runOnce({0}));
        }
    }

    static std::vector<std::uint8_t> event(std::string_view name, std::size_t payload = 0) {
        return wire::encodeEvent("s", name, std::vector<std::uint8_t>(payload)).value();
    }

    support::TemporaryDirectory directory;
    std::string path = directory.file("events.sock");
    FakeSystemLog log;
    LinuxRunLoop loop{log};
    std::vector<std::string> received;
    std::unique_ptr<EventSocket> socket;
    int sender = -1;
};

TEST_F(EventSocketTest, EventsAreHandedOnInOrderOneATurn) {
    ASSERT_TRUE(send(event("first", 3)));
    ASSERT_TRUE(send(event("second")));
    runAll(1);
    EXPECT_THAT(received, ElementsAre("s first 3"));
    runAll(1);
    EXPECT_THAT(received, ElementsAre("s first 3", "s second 0"));
    EXPECT_THAT(log.texts(), ElementsAre());
}

TEST_F(EventSocketTest, LargestDatagramIsTakenAndOneByteMoreIsDropped) {
    const std::size_t room = wire::kEventMaxSize - event("n").size();
    auto largest = event("n", room);
    ASSERT_EQ(largest.size(), wire::kEventMaxSize);
    ASSERT_TRUE(send(largest));
    largest.push_back(0);
    ASSERT_TRUE(send(largest));
    ASSERT_TRUE(send(event("after")));
    runAll(3);
    EXPECT_THAT(received, ElementsAre("s n " + std::to_string(room), "s after 0"));
    EXPECT_THAT(log.texts(),
                ElementsAre("kstd: EventSocket: dropped oversized datagram, 4097 bytes."));
}

TEST_F(EventSocketTest, EveryTruncationIsDroppedAndTheNextEventIsTaken) {
    const auto whole = event("name", 2);
    for (std::size_t length = 0; length < whole.size(); ++length) {
        ASSERT_TRUE(send({whole.begin(), whole.begin() + static_cast<std::ptrdiff_t>(length)}));
        ASSERT_TRUE(send(whole));
        runAll(2);
        ASSERT_EQ(received.size(), length + 1);
        EXPECT_EQ(log.texts().back(), "kstd: EventSocket: dropped malformed datagram, " +
                                          std::to_string(length) + " bytes.");
    }
}

TEST_F(EventSocketTest, RefusalOfTheSystemIsSaidOnceAndWaitedOut) {
    int ends[2];
    ASSERT_EQ(::pipe2(ends, O_CLOEXEC), 0);
    const base::FileDescriptor writer(ends[1]);
    ASSERT_EQ(::write(writer.get(), "x", 1), 1);
    socket.reset();
    // Readable, but no socket.
    socket = std::make_unique<EventSocket>(base::FileDescriptor(ends[0]), loop, log,
                                           [](const wire::EventDatagram&) {});
    ASSERT_TRUE(loop.runOnce(kDistantFuture));
    const auto refused = std::chrono::steady_clock::now();
    // The end of the pause, and another attempt.
    ASSERT_TRUE(loop.runOnce(kDistantFuture));
    EXPECT_GE(std::chrono::steady_clock::now() - refused, std::chrono::milliseconds(900));
    ASSERT_TRUE(loop.runOnce(kDistantFuture));
    EXPECT_THAT(log.texts(), ElementsAre("kstd: EventSocket: cannot receive: Socket operation on "
                                         "non-socket."));
}

TEST_F(EventSocketTest, DescriptorsSentAlongAreClosed) {
    const std::size_t before = support::countOpenDescriptors();
    for (int i = 0; i < 50; ++i) {
        auto datagram = event("with descriptors");
        const auto address = base::UnixAddress::of(path);
        iovec data{datagram.data(), datagram.size()};
        alignas(cmsghdr) std::array<char, CMSG_SPACE(4 * sizeof(int))> control{};
        msghdr message{};
        message.msg_name = const_cast<sockaddr*>(address->get());
        message.msg_namelen = address->size();
        message.msg_iov = &data;
        message.msg_iovlen = 1;
        message.msg_control = control.data();
        message.msg_controllen = control.size();
        cmsghdr* const rights = CMSG_FIRSTHDR(&message);
        rights->cmsg_level = SOL_SOCKET;
        rights->cmsg_type = SCM_RIGHTS;
        rights->cmsg_len = CMSG_LEN(4 * sizeof(int));
        const int descriptors[4] = {sender, sender, sender, sender};
        std::memcpy(CMSG_DATA(rights), descriptors, sizeof descriptors);
        ASSERT_GT(::sendmsg(sender, &message, 0), 0);
        runAll(1);
    }
    EXPECT_EQ(received.size(), 50U);
    EXPECT_EQ(support::countOpenDescriptors(), before);
}

TEST_F(EventSocketTest, AnotherUserIsRefused) {
    if (::geteuid() != 0) {
        GTEST_SKIP() << "needs root, to send as another user";
    }
    ASSERT_EQ(::chmod(directory.path().c_str(), 0755), 0);
    ASSERT_EQ(::chmod(path.c_str(), 0666), 0);
    EXPECT_EQ(support::exitStatusOfChild(
                  [this] { return ::setuid(kNobody) == 0 && send(event("foreign")) ? 0 : 1; }),
              0);
    ASSERT_TRUE(send(event("own")));
    runAll(2);
    EXPECT_THAT(received, ElementsAre("s own 0"));
    EXPECT_THAT(log.texts(), ElementsAre("kstd: EventSocket: dropped datagram of user 65534."));
}

/// A datagram with control data that a test makes up, in the place of what is in the socket.
std::function<ssize_t(msghdr&)> withControl(int level, int type, std::size_t length) {
    return [=](msghdr& message) {
        auto* const control = CMSG_FIRSTHDR(&message);
        control->cmsg_level = level;
        control->cmsg_type = type;
        control->cmsg_len = length;
        return static_cast<ssize_t>(message.msg_iov->iov_len);
    };
}

TEST_F(EventSocketTest, DatagramWithoutItsSendersCredentialsIsDropped) {
    support::FailingCalls::recvmsg = {
        [](msghdr& message) {
            message.msg_controllen = 0;
            return ssize_t{1};
        },
        withControl(SOL_SOCKET + 1, SCM_CREDENTIALS, CMSG_LEN(sizeof(ucred))),
        withControl(SOL_SOCKET, SCM_RIGHTS, CMSG_LEN(sizeof(ucred))),
        withControl(SOL_SOCKET, SCM_CREDENTIALS, CMSG_LEN(sizeof(ucred)) - 1),
    };
    ASSERT_TRUE(send(event("after")));
    runAll(5);
    EXPECT_THAT(received, ElementsAre("s after 0"));
    const std::string line = "kstd: EventSocket: dropped datagram of unknown sender.";
    EXPECT_THAT(log.texts(), ElementsAre(line, line, line, line));
}

TEST_F(EventSocketTest, ReceivingThatIsInterruptedIsTriedAgainSilently) {
    const auto failure = [](int error) {
        return [error](msghdr& /*message*/) {
            errno = error;
            return ssize_t{-1};
        };
    };
    support::FailingCalls::recvmsg = {failure(EAGAIN), failure(EINTR)};
    ASSERT_TRUE(send(event("after")));
    runAll(3);
    EXPECT_THAT(received, ElementsAre("s after 0"));
    EXPECT_THAT(log.texts(), ElementsAre());
}

TEST_F(EventSocketTest, TheOwnerOfTheSocketMaySend) {
    if (::geteuid() != 0) {
        GTEST_SKIP() << "needs root, to give the socket to another user";
    }
    socket.reset();
    base::FileDescriptor made = makeEventSocket(path);
    ASSERT_EQ(::chown(path.c_str(), kNobody, kNobody), 0);
    ASSERT_EQ(::chmod(directory.path().c_str(), 0755), 0);
    socket = std::make_unique<EventSocket>(
        std::move(made), loop, log,
        [this](const wire::EventDatagram& event) { received.emplace_back(event.name); });
    EXPECT_EQ(support::exitStatusOfChild(
                  [this] { return ::setuid(kNobody) == 0 && send(event("owner's")) ? 0 : 1; }),
              0);
    ASSERT_TRUE(send(event("root's")));
    runAll(2);
    EXPECT_THAT(received, ElementsAre("owner's", "root's"));
}

TEST_F(EventSocketTest, SocketFileIsForItsOwnerAloneWhateverTheUmask) {
    const mode_t before = ::umask(0);
    listen();
    struct stat status {};
    ASSERT_EQ(::stat(path.c_str(), &status), 0);
    EXPECT_EQ(status.st_mode & 0777U, 0600U);
    ::umask(0777);
    listen();
    ::umask(before);
    ASSERT_EQ(::stat(path.c_str(), &status), 0);
    EXPECT_EQ(status.st_mode & 0777U, 0600U);
}

TEST_F(EventSocketTest, NoSocketIsMadeInAMissingDirectory) {
    EXPECT_FALSE(makeEventSocket(directory.file("missing/events.sock")).isOpen());
    EXPECT_FALSE(makeEventSocket(std::string(200, 'x')).isOpen());
}

/// Hands descriptors to a child as an init system does and returns what it answers.
int withHandedDescriptors(const std::vector<int>& descriptors, const std::string& names,
                          const std::function<int()>& inChild) {
    return support::exitStatusOfChild([&] {
        std::vector<int> copies;
        for (const int descriptor : descriptors) {
            copies.push_back(::fcntl(descriptor, F_DUPFD, 100));
        }
        for (std::size_t i = 0; i < copies.size(); ++i) {
            ::dup2(copies[i], 3 + static_cast<int>(i));
        }
        ::setenv("LISTEN_FDS", std::to_string(descriptors.size()).c_str(), 1);
        ::setenv("LISTEN_FDNAMES", names.c_str(), 1);
        ::setenv("LISTEN_PID", std::to_string(::getpid()).c_str(), 1);
        return inChild();
    });
}

ino_t socketIdentity(int descriptor) {
    struct stat status {};
    ::fstat(descriptor, &status);
    return status.st_ino;
}

TEST_F(EventSocketTest, ActivatedSocketIsFoundByItsNameWhereverItStands) {
    const base::FileDescriptor wanted = makeEventSocket(directory.file("a"));
    const base::FileDescriptor unwanted = makeEventSocket(directory.file("b"));
    const ino_t identity = socketIdentity(wanted.get());
    const auto isWanted = [identity] {
        const base::FileDescriptor found = takeActivatedEventSocket();
        return found.isOpen() && socketIdentity(found.get()) == identity &&
                       std::getenv("LISTEN_FDS") == nullptr
                   ? 0
                   : 1;
    };
    EXPECT_EQ(withHandedDescriptors({wanted.get(), unwanted.get()}, "events:x", isWanted), 0);
    EXPECT_EQ(withHandedDescriptors({unwanted.get(), wanted.get()}, "x:events", isWanted), 0);
}

TEST_F(EventSocketTest, OtherNamesAndOtherKindsOfSocketAreNotTaken) {
    const base::FileDescriptor datagrams = makeEventSocket(directory.file("a"));
    const base::FileDescriptor stream(::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0));
    const auto isNone = [] {
        return takeActivatedEventSocket().isOpen() ? 1 : 0;
    };
    EXPECT_EQ(withHandedDescriptors({datagrams.get()}, "other", isNone), 0);
    EXPECT_EQ(withHandedDescriptors({stream.get()}, "events", isNone), 0);
    EXPECT_EQ(support::exitStatusOfChild(isNone), 0);
}

} // namespace
} // namespace platform
