#include "keystrand-sim/RequestLog.h"

#include <gtest/gtest.h>

namespace keystrand::sim::test {

namespace {

LoggedRequest controlRequest(std::uint32_t code, bool acknowledged = false) {
    LoggedRequest request;
    request.command = 26;
    request.control = code;
    request.acknowledged = acknowledged;
    return request;
}

TEST(RequestLogTest, IndexesBeginAtOne) {
    RequestLog log;
    log.record({});
    log.record(controlRequest(3));
    ASSERT_EQ(log.entries().size(), 2U);
    EXPECT_EQ(log.entries()[0].index, 1U);
    EXPECT_EQ(log.entries()[1].index, 2U);
    EXPECT_EQ(log.count(), 2U);
}

TEST(RequestLogTest, CountsControlCodesAndAcknowledgements) {
    RequestLog log;
    log.record(controlRequest(7, true));
    log.record(controlRequest(7, false));
    log.record(controlRequest(3));
    EXPECT_EQ(log.controlCount(7), 2U);
    EXPECT_EQ(log.controlCount(3), 1U);
    EXPECT_EQ(log.controlCount(5), 0U);
    EXPECT_EQ(log.acknowledgements(), 1U);
}

TEST(RequestLogTest, OldEntriesGoAndTheCountGoesOn) {
    RequestLog log;
    for (std::size_t i = 0; i < RequestLog::kMaxEntries + 1; ++i) {
        log.record({});
    }
    EXPECT_EQ(log.entries().size(), RequestLog::kMaxEntries);
    EXPECT_EQ(log.entries().front().index, 2U);
    EXPECT_EQ(log.count(), RequestLog::kMaxEntries + 1);
}

TEST(RequestLogTest, PayloadsAreBoundedTogether) {
    constexpr std::size_t kHalf = RequestLog::kMaxPayloadBytes / 2;
    RequestLog log;
    LoggedRequest large;
    large.payload.resize(kHalf);
    log.record(large);
    log.record(large);
    EXPECT_EQ(log.entries().size(), 2U);
    large.payload.resize(1);
    log.record(large);
    EXPECT_EQ(log.entries().size(), 2U);
    EXPECT_EQ(log.entries().front().index, 2U);
}

TEST(RequestLogTest, ControlCodesCountedOneByOneHaveALimit) {
    RequestLog log;
    for (std::uint32_t code = 0; code <= RequestLog::kMaxCountedControls; ++code) {
        log.record(controlRequest(code));
    }
    log.record(controlRequest(0));
    EXPECT_EQ(log.controlCount(0), 2U);
    EXPECT_EQ(log.controlCount(RequestLog::kMaxCountedControls - 1), 1U);
    EXPECT_EQ(log.controlCount(RequestLog::kMaxCountedControls), 0U);
}

TEST(RequestLogTest, ClearStartsAnew) {
    RequestLog log;
    log.record(controlRequest(7, true));
    log.clear();
    EXPECT_EQ(log.count(), 0U);
    EXPECT_EQ(log.acknowledgements(), 0U);
    EXPECT_EQ(log.controlCount(7), 0U);
    log.record({});
    EXPECT_EQ(log.entries().front().index, 1U);
}

TEST(RequestLogTest, ObserverSeesTheNewCount) {
    RequestLog log;
    std::uint64_t seen = 0;
    log.setObserver([&] { seen = log.count(); });
    log.record({});
    EXPECT_EQ(seen, 1U);
}

} // namespace

} // namespace keystrand::sim::test
