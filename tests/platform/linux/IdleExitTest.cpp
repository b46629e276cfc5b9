#include "platform/linux/IdleExit.h"

#include "platform/fake/FakeSystemLog.h"

#include <gtest/gtest.h>

#include <sys/eventfd.h>
#include <unistd.h>

namespace platform {
namespace {

constexpr std::chrono::microseconds kShort{200};

class IdleExitTest : public testing::Test {
  protected:
    IdleExitTest() : stream_(loop.addReadable(descriptor_, [] {})) {}
    ~IdleExitTest() override { ::close(descriptor_); }

    void closeStreams() {
        ++closed;
        stream_.reset();
    }

    FakeSystemLog log;
    LinuxRunLoop loop{log};
    int closed = 0;
    int busyQuestions = 0;

  private:
    int descriptor_ = ::eventfd(0, EFD_CLOEXEC);
    std::unique_ptr<RunLoopSource> stream_;
};

TEST_F(IdleExitTest, IdleLoopIsLeftWithoutSources) {
    const IdleExit idleExit(
        loop, kShort, [] { return false; }, [this] { closeStreams(); });
    while (loop.runOnce(kDistantFuture)) {
    }
    EXPECT_EQ(closed, 1);
}

TEST_F(IdleExitTest, NothingIsClosedWhileSomethingIsInHand) {
    const IdleExit idleExit(
        loop, kShort, [this] { return ++busyQuestions < 4; }, [this] { closeStreams(); });
    while (loop.runOnce(kDistantFuture)) {
        EXPECT_TRUE(closed == 0 || busyQuestions == 4);
    }
    EXPECT_EQ(busyQuestions, 4);
    EXPECT_EQ(closed, 1);
}

TEST_F(IdleExitTest, AnEventStartsTheIdleTimeAnew) {
    int turns = 0;
    IdleExit idleExit(
        loop, kShort, [this] { return ++busyQuestions < 0; }, [this] { closeStreams(); });
    idleExit.touch();
    EXPECT_TRUE(loop.runOnce(kDistantFuture));
    EXPECT_EQ(closed, 0);
    EXPECT_EQ(busyQuestions, 1) << "each idle time is an opportunity to try again";
    while (loop.runOnce(kDistantFuture)) {
        ++turns;
    }
    EXPECT_EQ(turns, 1);
    EXPECT_EQ(closed, 1);
}

} // namespace
} // namespace platform
