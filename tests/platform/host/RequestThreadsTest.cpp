#include "platform/host/RequestThreads.h"

#include "tests/support/NoThreads.h"

#include <gtest/gtest.h>

#include <atomic>
#include <fstream>
#include <future>
#include <memory>
#include <string>

namespace {

using platform::RequestThreads;

std::size_t mappedPages() {
    std::size_t pages = 0;
    std::ifstream("/proc/self/statm") >> pages;
    return pages;
}

TEST(RequestThreadsTest, DestructionWaitsForAllAndForThoseThatTheyStart) {
    std::atomic<int> ended{0};
    const auto held = std::make_shared<int>();
    {
        RequestThreads threads;
        for (int i = 0; i < 8; ++i) {
            EXPECT_TRUE(threads.start([&, held] {
                EXPECT_TRUE(threads.start([&, held] { ++ended; }));
                ++ended;
            }));
        }
    }
    EXPECT_EQ(ended, 16);
    EXPECT_EQ(held.use_count(), 1) << "what the work holds is gone";
}

TEST(RequestThreadsTest, ThreadsThatHaveEndedAreNotKept) {
    constexpr std::size_t kRounds = 400;
    constexpr std::size_t kStackPages = 8UL * 1024 * 1024 / 4096;
    RequestThreads threads;
    const auto round = [&] {
        const auto ran = std::make_shared<std::promise<void>>();
        EXPECT_TRUE(threads.start([ran] { ran->set_value(); }));
        ran->get_future().get();
    };
    round();
    const std::size_t before = mappedPages();
    for (std::size_t i = 0; i < kRounds; ++i) {
        round();
    }
    EXPECT_LT(mappedPages(), before + kRounds * kStackPages / 2);
}

TEST(RequestThreadsTest, WorkWithoutAThreadIsNotRun) {
    auto threads = std::make_unique<RequestThreads>();
    {
        const support::NoThreads none;
        EXPECT_FALSE(threads->start([] { ADD_FAILURE(); }));
    }
    bool ran = false;
    EXPECT_TRUE(threads->start([&] { ran = true; }));
    threads.reset();
    EXPECT_TRUE(ran);
}

} // namespace
