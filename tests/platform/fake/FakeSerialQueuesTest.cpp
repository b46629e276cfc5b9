#include "platform/fake/FakeSerialQueues.h"

#include <gtest/gtest.h>

#include <stdexcept>

namespace {

TEST(FakeSerialQueuesTest, RecordsNamesAndWork) {
    platform::FakeSerialQueues queues;
    EXPECT_EQ(queues.names(), std::vector<std::string>());
    EXPECT_EQ(queues.workItems(), 0U);

    const auto first = queues.make("first");
    const auto second = queues.make("second");
    EXPECT_EQ(queues.names(), (std::vector<std::string>{"first", "second"}));
    EXPECT_EQ(queues.workItems(), 0U);

    first->sync([&] { second->sync([] {}); });
    EXPECT_EQ(queues.workItems(), 2U);
    EXPECT_THROW(second->sync([] { throw std::runtime_error("of the work"); }), std::runtime_error);
    EXPECT_EQ(queues.workItems(), 3U);
}

} // namespace
