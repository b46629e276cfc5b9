#include "platform/linux/LocalConnection.h"

#include "base/UnixAddress.h"
#include "tests/support/ChildProcess.h"
#include "tests/support/TemporaryDirectory.h"

#include <gtest/gtest.h>

#include <cerrno>
#include <fcntl.h>
#include <string>
#include <sys/socket.h>
#include <unistd.h>
#include <vector>

namespace {

using namespace std::chrono_literals;
using platform::connectLocally;

constexpr uid_t kNobody = 65534;

class LocalConnectionTest : public testing::Test {
  protected:
    [[nodiscard]] bool listen(int type, int backlog) {
        listener_ = base::FileDescriptor(::socket(AF_UNIX, type | SOCK_CLOEXEC, 0));
        const auto address = base::UnixAddress::of(path());
        return ::bind(listener_.get(), address->get(), address->size()) == 0 &&
               ::listen(listener_.get(), backlog) == 0;
    }

    [[nodiscard]] int errorOf(const std::string& path, int type = SOCK_STREAM) const {
        return connectLocally(path, type, 30s).error;
    }

    [[nodiscard]] std::string path() const { return directory_.file("socket"); }

    support::TemporaryDirectory directory_;
    base::FileDescriptor listener_;
};

TEST_F(LocalConnectionTest, ConnectsToAServerOfThisUser) {
    ASSERT_TRUE(listen(SOCK_STREAM, 1));
    const auto connection = connectLocally(path(), SOCK_STREAM, 30s);
    EXPECT_EQ(connection.error, 0);
    EXPECT_FALSE(connection.stranger);
    EXPECT_NE(::fcntl(connection.socket.get(), F_GETFD) & FD_CLOEXEC, 0);
    const base::FileDescriptor server(::accept(listener_.get(), nullptr, nullptr));
    EXPECT_EQ(::write(server.get(), "x", 1), 1);
    char byte = 0;
    EXPECT_EQ(::read(connection.socket.get(), &byte, 1), 1);
}

TEST_F(LocalConnectionTest, WhereNobodyListens) {
    EXPECT_EQ(errorOf(path()), ENOENT);
    EXPECT_EQ(errorOf(""), ENAMETOOLONG);
    EXPECT_EQ(errorOf(std::string(107, 'x')), ENOENT);
    EXPECT_EQ(errorOf(std::string(108, 'x')), ENAMETOOLONG);
    ASSERT_TRUE(listen(SOCK_STREAM, 1));
    EXPECT_EQ(errorOf(path(), SOCK_SEQPACKET), EPROTOTYPE);
    listener_.reset();
    EXPECT_EQ(errorOf(path()), ECONNREFUSED);
}

TEST_F(LocalConnectionTest, ServerThatTakesNoMoreConnectionsIsGivenUp) {
    ASSERT_TRUE(listen(SOCK_STREAM, 0));
    std::vector<platform::LocalConnection> connections;
    do {
        connections.push_back(connectLocally(path(), SOCK_STREAM, 10ms));
    } while (connections.back().error == 0 && connections.size() < 10);
    EXPECT_EQ(connections.back().error, ETIMEDOUT);
    EXPECT_FALSE(connections.back().socket.isOpen());
}

TEST_F(LocalConnectionTest, ServerOfAnotherUserIsRefused) {
    if (::geteuid() != 0) {
        GTEST_SKIP() << "needs root, to serve as another user";
    }
    listener_ = base::FileDescriptor(::socket(AF_UNIX, SOCK_STREAM, 0));
    const auto address = base::UnixAddress::of(path());
    ASSERT_EQ(::bind(listener_.get(), address->get(), address->size()), 0);
    EXPECT_EQ(support::exitStatusOfChild([this] {
                  return ::setuid(kNobody) == 0 && ::listen(listener_.get(), 1) == 0 ? 0 : 1;
              }),
              0);
    const auto connection = connectLocally(path(), SOCK_STREAM, 30s);
    EXPECT_EQ(connection.error, EPERM);
    EXPECT_EQ(connection.stranger, kNobody);
    EXPECT_FALSE(connection.socket.isOpen());
}

} // namespace
