#include "platform/host/EventQueue.h"

#include <gmock/gmock.h>

#include <memory>
#include <string>
#include <vector>

namespace {

using platform::Event;
using platform::EventQueue;
using testing::ElementsAre;

class EventQueueTest : public testing::Test {
  protected:
    void record(const std::string& stream) {
        queue_.setHandler(stream, [this](const Event& event) {
            delivered_.push_back(event.stream + "/" + event.name);
        });
    }

    void deliverAll() {
        while (!queue_.empty()) {
            static_cast<void>(queue_.deliverOne());
        }
    }

    EventQueue queue_;
    std::vector<std::string> delivered_;
};

TEST_F(EventQueueTest, NewQueueIsEmpty) {
    EXPECT_TRUE(queue_.empty());
    EXPECT_FALSE(queue_.holds("a", "1"));
}

TEST_F(EventQueueTest, DeliversInTheOrderOfArrivalOverAllStreams) {
    record("a");
    record("b");
    queue_.push({"a", "1"});
    queue_.push({"b", "2"});
    queue_.push({"a", "3"});
    deliverAll();
    EXPECT_THAT(delivered_, ElementsAre("a/1", "b/2", "a/3"));
}

TEST_F(EventQueueTest, DeliversOneEventACall) {
    record("a");
    queue_.push({"a", "1"});
    queue_.push({"a", "2"});
    EXPECT_TRUE(queue_.deliverOne());
    EXPECT_THAT(delivered_, ElementsAre("a/1"));
    EXPECT_FALSE(queue_.empty());
}

TEST_F(EventQueueTest, FrontIsTheNextToBeDelivered) {
    queue_.push({"a", "1"});
    queue_.push({"b", "2"});
    EXPECT_EQ(queue_.front().name, "1");
    static_cast<void>(queue_.deliverOne());
    EXPECT_EQ(queue_.front().name, "2");
}

TEST_F(EventQueueTest, EventOnAStreamWithoutHandlerIsGone) {
    queue_.push({"a", "1"});
    EXPECT_FALSE(queue_.deliverOne());
    EXPECT_TRUE(queue_.empty());
}

TEST_F(EventQueueTest, EmptyHandlerCountsAsNone) {
    queue_.setHandler("a", nullptr);
    queue_.push({"a", "1"});
    EXPECT_FALSE(queue_.deliverOne());
    EXPECT_TRUE(queue_.empty());
}

TEST_F(EventQueueTest, EventQueuedBeforeItsHandlerIsDelivered) {
    queue_.push({"a", "1"});
    record("a");
    EXPECT_TRUE(queue_.deliverOne());
    EXPECT_THAT(delivered_, ElementsAre("a/1"));
}

TEST_F(EventQueueTest, SecondHandlerReplacesTheFirst) {
    const auto held = std::make_shared<int>(1);
    queue_.setHandler("a", [held](const Event&) { FAIL() << "the replaced handler was called"; });
    EXPECT_EQ(held.use_count(), 2);
    record("a");
    EXPECT_EQ(held.use_count(), 1) << "the replaced handler is still held";
    queue_.push({"a", "1"});
    EXPECT_TRUE(queue_.deliverOne());
    EXPECT_THAT(delivered_, ElementsAre("a/1"));
}

TEST_F(EventQueueTest, DropsOnlyWhatHasBothNames) {
    record("a");
    record("b");
    queue_.push({"a", "1"});
    queue_.push({"a", "2"});
    queue_.push({"b", "1"});
    queue_.push({"a", "1"});
    queue_.drop("a", "1");
    EXPECT_FALSE(queue_.holds("a", "1"));
    EXPECT_TRUE(queue_.holds("a", "2"));
    EXPECT_TRUE(queue_.holds("b", "1"));
    deliverAll();
    EXPECT_THAT(delivered_, ElementsAre("a/2", "b/1"));
}

TEST_F(EventQueueTest, DroppingWhatIsNotThereDoesNothing) {
    queue_.push({"a", "1"});
    queue_.drop("a", "2");
    EXPECT_TRUE(queue_.holds("a", "1"));
}

TEST_F(EventQueueTest, HandlerMayQueueAnEventThatComesLast) {
    queue_.setHandler("a", [this](const Event& event) {
        delivered_.push_back(event.name);
        if (event.name == "1") {
            queue_.push({"a", "3"});
        }
    });
    queue_.push({"a", "1"});
    queue_.push({"a", "2"});
    deliverAll();
    EXPECT_THAT(delivered_, ElementsAre("1", "2", "3"));
}

TEST_F(EventQueueTest, HandlerMayDropWhatWaitsBehindIt) {
    queue_.setHandler("a", [this](const Event& event) {
        delivered_.push_back(event.name);
        queue_.drop("a", "2");
    });
    queue_.push({"a", "1"});
    queue_.push({"a", "2"});
    deliverAll();
    EXPECT_THAT(delivered_, ElementsAre("1"));
}

TEST_F(EventQueueTest, HandlerMayReplaceItselfAndGoOn) {
    const auto held = std::make_shared<std::string>("captured");
    queue_.setHandler("a", [this, held](const Event&) {
        record("a");
        delivered_.push_back(*held);
    });
    queue_.push({"a", "1"});
    queue_.push({"a", "2"});
    deliverAll();
    EXPECT_THAT(delivered_, ElementsAre("captured", "a/2"));
}

} // namespace
