#include "platform/linux/LinuxRunLoop.h"

#include "base/NotCopied.h"
#include "platform/fake/FakeSystemLog.h"
#include "platform/linux/LinuxClock.h"

#include <gtest/gtest.h>

#include <cerrno>
#include <cstdint>
#include <memory>
#include <string>
#include <sys/eventfd.h>
#include <system_error>
#include <unistd.h>

namespace platform {
namespace {

/// A descriptor that is readable once `signal` was called.
class Signal : private base::NotCopied {
  public:
    Signal() : descriptor_(::eventfd(0, EFD_CLOEXEC | EFD_NONBLOCK)) {}
    ~Signal() { ::close(descriptor_); }

    [[nodiscard]] int descriptor() const { return descriptor_; }
    void signal() const {
        const std::uint64_t one = 1;
        ASSERT_EQ(::write(descriptor_, &one, sizeof one), static_cast<ssize_t>(sizeof one));
    }
    void clear() const {
        std::uint64_t value = 0;
        static_cast<void>(::read(descriptor_, &value, sizeof value));
    }

  private:
    int descriptor_;
};

class LinuxRunLoopTest : public testing::Test {
  protected:
    FakeSystemLog log;
    LinuxRunLoop loop{log};
    Signal signal;
    Signal other;
};

TEST_F(LinuxRunLoopTest, WithoutSourcesItCannotRun) {
    EXPECT_FALSE(loop.runOnce(kDistantFuture));
    EXPECT_FALSE(loop.runOnce({0}));
}

TEST_F(LinuxRunLoopTest, ReadableDescriptorCallsItsHandler) {
    int calls = 0;
    const auto source = loop.addReadable(signal.descriptor(), [&] {
        ++calls;
        signal.clear();
    });
    signal.signal();
    EXPECT_TRUE(loop.runOnce(kDistantFuture));
    EXPECT_EQ(calls, 1);
}

TEST_F(LinuxRunLoopTest, PastDeadlineHandlesWhatIsReadyAndDoesNotWait) {
    int calls = 0;
    const auto source = loop.addReadable(signal.descriptor(), [&] {
        ++calls;
        signal.clear();
    });
    EXPECT_TRUE(loop.runOnce({0}));
    EXPECT_EQ(calls, 0);
    signal.signal();
    EXPECT_TRUE(loop.runOnce({0}));
    EXPECT_EQ(calls, 1);
}

TEST_F(LinuxRunLoopTest, ReturnsAfterTheDeadlineAndNotBefore) {
    const auto source = loop.addReadable(signal.descriptor(), [] {});
    const Date deadline{realTimeNow().nanosecondsSince1970 + 5'000'000};
    EXPECT_TRUE(loop.runOnce(deadline));
    EXPECT_GE(realTimeNow(), deadline);
}

TEST_F(LinuxRunLoopTest, RemovedSourceLeavesTheLoopWithoutReasonToRun) {
    auto source = loop.addReadable(signal.descriptor(), [] {});
    source.reset();
    EXPECT_FALSE(loop.runOnce(kDistantFuture));
}

TEST_F(LinuxRunLoopTest, DisabledSourceDoesNotCountAndIsNotCalled) {
    int calls = 0;
    const auto source = loop.addReadable(signal.descriptor(), [&] { ++calls; });
    source->setEnabled(false);
    signal.signal();
    EXPECT_FALSE(loop.runOnce({0}));
    source->setEnabled(true);
    EXPECT_TRUE(loop.runOnce({0}));
    EXPECT_EQ(calls, 1);
}

TEST_F(LinuxRunLoopTest, EnablingTwiceCountsOnce) {
    const auto source = loop.addReadable(signal.descriptor(), [] {});
    source->setEnabled(true);
    source->setEnabled(false);
    EXPECT_FALSE(loop.runOnce({0}));
}

TEST_F(LinuxRunLoopTest, HandlerThatThrowsEndsTheLoopWithALine) {
    bool throws = true;
    const auto source = loop.addReadable(signal.descriptor(), [&throws] {
        if (throws) {
            throw std::system_error(ENOSPC, std::generic_category(), "another source");
        }
    });
    signal.signal();
    EXPECT_FALSE(loop.hasFailed());
    EXPECT_FALSE(loop.runOnce({0}));
    EXPECT_TRUE(loop.hasFailed());
    throws = false;
    EXPECT_FALSE(loop.runOnce({0}));
    EXPECT_EQ(log.texts(), (std::vector<std::string>{"kstd: MainRunLoop: cannot run: another "
                                                     "source: No space left on device."}));
}

TEST_F(LinuxRunLoopTest, TimerMayBeAReasonToRun) {
    const auto timer = loop.addTimer([] {}, RunLoopSource::Keeps::loopRunning);
    EXPECT_FALSE(loop.runOnce({0}));
    timer->fireAfter(std::chrono::microseconds(1));
    EXPECT_TRUE(loop.runOnce(kDistantFuture));
}

TEST_F(LinuxRunLoopTest, SourceMayBeDestroyedInItsOwnHandler) {
    std::unique_ptr<RunLoopSource> source;
    const std::string captured(100, 'x');
    std::string seen;
    source = loop.addReadable(signal.descriptor(), [&source, &seen, captured] {
        source.reset();
        seen = captured;
    });
    signal.signal();
    EXPECT_TRUE(loop.runOnce(kDistantFuture));
    EXPECT_EQ(seen, captured);
    EXPECT_FALSE(loop.runOnce(kDistantFuture));
}

TEST_F(LinuxRunLoopTest, PendingWorkGoesBeforeDescriptors) {
    std::string order;
    const auto readable = loop.addReadable(signal.descriptor(), [&] {
        order += 'd';
        signal.clear();
    });
    std::unique_ptr<RunLoopSource> pending;
    pending = loop.addPending([&] {
        order += 'p';
        pending->setEnabled(false);
    });
    signal.signal();
    pending->setEnabled(true);
    EXPECT_TRUE(loop.runOnce(kDistantFuture));
    EXPECT_TRUE(loop.runOnce(kDistantFuture));
    EXPECT_EQ(order, "pd");
}

TEST_F(LinuxRunLoopTest, TimerFiresButGivesTheLoopNoReasonToRun) {
    int fired = 0;
    const auto timer = loop.addTimer([&] { ++fired; });
    timer->fireAfter(std::chrono::microseconds(1));
    EXPECT_FALSE(loop.runOnce(kDistantFuture));
    const auto source = loop.addReadable(signal.descriptor(), [] {});
    EXPECT_TRUE(loop.runOnce(kDistantFuture));
    EXPECT_EQ(fired, 1);
}

TEST_F(LinuxRunLoopTest, TimerFiresOnce) {
    int fired = 0;
    const auto timer = loop.addTimer([&] { ++fired; });
    const auto source = loop.addReadable(signal.descriptor(), [] {});
    timer->fireAfter(std::chrono::microseconds(1));
    EXPECT_TRUE(loop.runOnce(kDistantFuture));
    EXPECT_TRUE(loop.runOnce({realTimeNow().nanosecondsSince1970 + 2'000'000}));
    EXPECT_EQ(fired, 1);
}

TEST_F(LinuxRunLoopTest, WhatIsUrgentGoesFirstButGivesTheLoopNoReasonToRun) {
    std::string order;
    std::unique_ptr<RunLoopSource> urgent;
    urgent = loop.addUrgent(signal.descriptor(), [&] {
        order += 'u';
        urgent.reset();
    });
    signal.signal();
    other.signal();
    EXPECT_FALSE(loop.runOnce({0}));
    const auto readable = loop.addReadable(other.descriptor(), [&] { order += 'd'; });
    std::unique_ptr<RunLoopSource> pending;
    pending = loop.addPending([&] {
        order += 'p';
        pending.reset();
    });
    pending->setEnabled(true);
    for (int turns = 0; turns < 3; ++turns) {
        EXPECT_TRUE(loop.runOnce({0}));
    }
    EXPECT_EQ(order, "upd");
}

} // namespace
} // namespace platform
