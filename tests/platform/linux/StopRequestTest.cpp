#include "platform/linux/StopRequest.h"

#include "tests/support/TerminationSignal.h"

#include <gtest/gtest.h>

#include <cerrno>
#include <poll.h>
#include <sys/resource.h>
#include <thread>

namespace platform {
namespace {

using support::TerminationSignal;

class StopRequestTest : public testing::Test {
  private:
    const TerminationSignal signal_;
};

bool isReadable(int descriptor) {
    pollfd watched{descriptor, POLLIN, 0};
    return ::poll(&watched, 1, 0) > 0;
}

TEST_F(StopRequestTest, TheSignalIsNotedAndEndsNothing) {
    const StopRequest stop;
    EXPECT_FALSE(stop.isMade());
    EXPECT_FALSE(isReadable(stop.descriptor()));
    TerminationSignal::send();
    EXPECT_TRUE(stop.isMade());
    EXPECT_TRUE(isReadable(stop.descriptor()));
}

TEST_F(StopRequestTest, EveryoneSeesItAsOftenAsTheyLook) {
    const StopRequest stop;
    TerminationSignal::send();
    TerminationSignal::send();
    bool seenElsewhere = false;
    std::thread([&] { seenElsewhere = stop.isMade() && isReadable(stop.descriptor()); }).join();
    EXPECT_TRUE(seenElsewhere);
    EXPECT_TRUE(stop.isMade());
    EXPECT_TRUE(StopRequest().isMade());
}

TEST_F(StopRequestTest, ItStaysNotedWhenNobodyLooksAnyMore) {
    { const StopRequest stop; }
    TerminationSignal::send();
    EXPECT_TRUE(TerminationSignal::isBlocked());
    EXPECT_TRUE(StopRequest().isMade());
}

TEST_F(StopRequestTest, WithoutADescriptorTheSignalEndsTheProcessAsEver) {
    rlimit before{};
    ASSERT_EQ(::getrlimit(RLIMIT_NOFILE, &before), 0);
    const rlimit none{0, before.rlim_max};
    ASSERT_EQ(::setrlimit(RLIMIT_NOFILE, &none), 0);
    const StopRequest stop;
    ASSERT_EQ(::setrlimit(RLIMIT_NOFILE, &before), 0);
    EXPECT_EQ(stop.descriptor(), -1);
    EXPECT_EQ(stop.failure(), EMFILE);
    EXPECT_FALSE(stop.isMade());
    EXPECT_FALSE(TerminationSignal::isBlocked());
}

} // namespace
} // namespace platform
