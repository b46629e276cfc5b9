// What the program takes for its connection, and from whom.

#include "tests/kstd-https/ClientProgram.h"
#include "tests/support/ChildProcess.h"

#include <gtest/gtest.h>

#include <fcntl.h>
#include <string>
#include <vector>

namespace {

using support::ClientProgram;
using support::ConnectedClient;

using Lines = std::vector<std::string>;

void expectNoConnection(const base::FileDescriptor& descriptor) {
    ClientProgram client(descriptor.get());
    EXPECT_EQ(client.program().awaitEnd(), 1);
    EXPECT_EQ(client.program().lines(),
              (Lines{"kstd-https: descriptor 3 is no connection of a local stream socket"}));
}

TEST(HTTPSConnectionTest, WhatIsNoConnection) {
    expectNoConnection(base::FileDescriptor());
    expectNoConnection(base::FileDescriptor(::open("/dev/null", O_RDWR)));
    expectNoConnection(base::FileDescriptor(::socket(AF_UNIX, SOCK_STREAM, 0)));
    expectNoConnection(base::FileDescriptor(::socket(AF_INET, SOCK_STREAM, 0)));
    for (const int type : {SOCK_DGRAM, SOCK_SEQPACKET}) {
        int ends[2] = {-1, -1};
        ASSERT_EQ(::socketpair(AF_UNIX, type, 0, ends), 0);
        const base::FileDescriptor ours(ends[0]);
        expectNoConnection(base::FileDescriptor(ends[1]));
    }
}

TEST(HTTPSConnectionTest, DaemonThatHangsUpAtOnce) {
    ConnectedClient client;
    client.hangUp();
    EXPECT_EQ(client.awaitEnd(), 1);
    EXPECT_EQ(client.lines(), (Lines{"kstd-https: what came is no request"}));
}

TEST(HTTPSConnectionTest, PeerOfAnotherUserIsRefused) {
    if (::geteuid() != 0) {
        GTEST_SKIP() << "needs root, to be another user";
    }
    constexpr uid_t kNobody = 65534;
    // Credentials are those of whoever makes the pair.
    EXPECT_EQ(support::exitStatusOfChild([] {
                  if (::seteuid(kNobody) != 0) {
                      return 1;
                  }
                  int ends[2] = {-1, -1};
                  const bool made = ::socketpair(AF_UNIX, SOCK_STREAM, 0, ends) == 0;
                  if (!made || ::seteuid(0) != 0) {
                      return 2;
                  }
                  ClientProgram client(ends[1]);
                  const bool refused = client.program().awaitEnd() == 1;
                  return refused && client.program().lines() ==
                                        Lines{"kstd-https: refused a connection of user 65534"}
                             ? 0
                             : 3;
              }),
              0);
}

} // namespace
