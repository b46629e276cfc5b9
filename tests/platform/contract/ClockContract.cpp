#include "tests/platform/contract/ClockContract.h"

#include <gtest/gtest.h>

#include <thread>

namespace contract {

TEST_P(ClockContract, ShowsTheTime) {
    const platform::Date before = fixture().reference();
    const platform::Date now = clock().now();
    const platform::Date after = fixture().reference();
    EXPECT_LE(before, now);
    EXPECT_LE(now, after);
}

TEST_P(ClockContract, IsReadByAnyThread) {
    const platform::Date before = fixture().reference();
    platform::Date there;
    std::thread other([&] { there = clock().now(); });
    const platform::Date here = clock().now();
    other.join();
    EXPECT_LE(before, here);
    EXPECT_LE(before, there);
}

} // namespace contract
