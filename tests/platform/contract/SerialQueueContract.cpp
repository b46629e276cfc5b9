#include "tests/platform/contract/SerialQueueContract.h"

#include <gtest/gtest.h>

#include <atomic>
#include <csignal>
#include <stdexcept>
#include <thread>
#include <vector>

namespace contract {

TEST_P(SerialQueueContract, WorkHasRunOnReturn) {
    std::vector<int> order;
    for (int i = 0; i < 3; ++i) {
        queue_->sync([&] { order.push_back(2 * i); });
        order.push_back(2 * i + 1);
    }
    EXPECT_EQ(order, (std::vector<int>{0, 1, 2, 3, 4, 5}));
}

TEST_P(SerialQueueContract, OnlyWorkIsCurrent) {
    EXPECT_FALSE(queue_->isCurrent());
    queue_->sync([this] {
        EXPECT_TRUE(queue_->isCurrent());
        std::thread([this] { EXPECT_FALSE(queue_->isCurrent()); }).join();
    });
    EXPECT_FALSE(queue_->isCurrent());
}

TEST_P(SerialQueueContract, WorkOfSeveralThreadsRunsOneItemAtATime) {
    constexpr int kThreads = 4;
    constexpr int kItems = 500;
    int running = 0;
    int done = 0;
    std::vector<std::thread> threads;
    for (int i = 0; i < kThreads; ++i) {
        threads.emplace_back([&] {
            for (int item = 0; item < kItems; ++item) {
                queue_->sync([&] {
                    EXPECT_EQ(++running, 1);
                    EXPECT_TRUE(queue_->isCurrent());
                    ++done;
                    --running;
                });
            }
        });
    }
    for (std::thread& thread : threads) {
        thread.join();
    }
    EXPECT_EQ(done, kThreads * kItems);
}

TEST_P(SerialQueueContract, WorkOfOneThreadRunsInItsOrder) {
    constexpr int kItems = 200;
    std::vector<int> ofOther;
    std::thread other([&] {
        for (int i = 0; i < kItems; ++i) {
            queue_->sync([&ofOther, i] { ofOther.push_back(i); });
        }
    });
    std::vector<int> expected;
    for (int i = 0; i < kItems; ++i) {
        queue_->sync([&expected, i] { expected.push_back(i); });
    }
    other.join();
    EXPECT_EQ(ofOther, expected);
}

TEST_P(SerialQueueContract, WaitingWorkGetsItsTurn) {
    std::atomic<bool> hasRun = false;
    std::thread other([&] { queue_->sync([&] { hasRun = true; }); });
    while (!hasRun) {
        queue_->sync([] {});
    }
    other.join();
}

TEST_P(SerialQueueContract, ThreadThatWorkStartsWaitsForTheEndOfTheWork) {
    std::vector<int> order;
    std::thread other;
    queue_->sync([&] {
        std::atomic<bool> isThere = false;
        other = std::thread([&] {
            isThere = true;
            queue_->sync([&] { order.push_back(2); });
        });
        while (!isThere) {
            std::this_thread::yield();
        }
        order.push_back(1);
    });
    other.join();
    EXPECT_EQ(order, (std::vector<int>{1, 2}));
}

TEST_P(SerialQueueContract, ExceptionReachesTheCallerAndTheQueueGoesOn) {
    EXPECT_THROW(queue_->sync([] { throw std::runtime_error("of the work"); }), std::runtime_error);
    EXPECT_FALSE(queue_->isCurrent());
    bool hasRun = false;
    std::thread([&] { queue_->sync([&] { hasRun = true; }); }).join();
    EXPECT_TRUE(hasRun);
}

TEST_P(SerialQueueContract, WorkOfOneQueueSubmitsToAnother) {
    const auto other = fixture().queues().make("another");
    bool hasRun = false;
    queue_->sync([&] {
        EXPECT_FALSE(other->isCurrent());
        other->sync([&] {
            EXPECT_TRUE(queue_->isCurrent());
            EXPECT_TRUE(other->isCurrent());
            hasRun = true;
        });
        EXPECT_TRUE(queue_->isCurrent());
    });
    EXPECT_TRUE(hasRun);
}

TEST_P(SerialQueueContract, WorkThatSubmitsToItsOwnQueueStopsTheProcess) {
    EXPECT_EXIT(queue_->sync([this] { queue_->sync([] {}); }), testing::KilledBySignal(SIGABRT),
                "\"queue of the test\" submits to its own queue");
}

TEST_P(SerialQueueContract, SubmittingBackThroughAnotherQueueStopsTheProcess) {
    const auto other = fixture().queues().make("another");
    EXPECT_EXIT(queue_->sync([&] { other->sync([&] { queue_->sync([] {}); }); }),
                testing::KilledBySignal(SIGABRT), "\"queue of the test\" submits to its own queue");
}

} // namespace contract
