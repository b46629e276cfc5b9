#include "kstctl/database/EventRows.h"

#include "kstctl/ExitStatus.h"
#include "tests/support/TemporaryDirectory.h"

#include <gtest/gtest.h>

#include <cstdlib>
#include <filesystem>
#include <vector>

namespace kstctl {
namespace {

namespace fs = std::filesystem;

StoredEvent eventOf(std::int64_t id, std::size_t size) {
    return {.id = id, .added = 0.5, .data = platform::Bytes(size, static_cast<std::uint8_t>(id))};
}

std::vector<StoredEvent> all(const EventRows& rows) {
    std::vector<StoredEvent> events;
    EXPECT_FALSE(rows.visit([&events](const auto& event) { events.push_back(event); }));
    return events;
}

class EventRowsTest : public testing::Test {
  protected:
    EventRowsTest() { ::setenv("TMPDIR", directory.path().c_str(), 1); }
    ~EventRowsTest() override { ::unsetenv("TMPDIR"); }

    void expectWhole(const EventRows& rows, std::size_t count, std::size_t size) {
        const auto events = all(rows);
        ASSERT_EQ(events.size(), count);
        EXPECT_EQ(rows.size(), count);
        for (std::size_t i = 0; i < count; ++i) {
            EXPECT_EQ(events[i].id, static_cast<std::int64_t>(i));
            ASSERT_EQ(events[i].data, eventOf(events[i].id, size).data) << i;
        }
        EXPECT_TRUE(fs::is_empty(directory.path()));
    }

    support::TemporaryDirectory directory;
};

TEST_F(EventRowsTest, RowsOfEveryKind) {
    EventRows rows;
    EXPECT_EQ(all(rows).size(), 0U);
    ASSERT_TRUE(rows.add({.id = -3, .added = {}, .data = {}}));
    ASSERT_TRUE(rows.add({.id = 1L << 62, .added = -1.25, .data = platform::Bytes()}));
    ASSERT_TRUE(rows.add({.id = 0, .added = 0.0, .data = platform::Bytes{0, 255}}));
    for (int round = 0; round < 2; ++round) {
        const auto events = all(rows);
        ASSERT_EQ(events.size(), 3U);
        EXPECT_EQ(events[0].id, -3);
        EXPECT_FALSE(events[0].added);
        EXPECT_FALSE(events[0].data);
        EXPECT_EQ(events[1].id, 1L << 62);
        EXPECT_EQ(events[1].added, -1.25);
        EXPECT_EQ(events[1].data, platform::Bytes());
        EXPECT_EQ(events[2].added, 0.0);
        EXPECT_EQ(events[2].data, (platform::Bytes{0, 255}));
    }
}

TEST_F(EventRowsTest, ManyAreInAFileWithoutAName) {
    EventRows rows;
    constexpr std::size_t kSize = 1000;
    constexpr std::size_t kCount = 5 * EventRows::kBytesInMemory / kSize / 2;
    for (std::size_t i = 0; i < kCount; ++i) {
        ASSERT_TRUE(rows.add(eventOf(static_cast<std::int64_t>(i), kSize)));
    }
    expectWhole(rows, kCount, kSize);
    expectWhole(rows, kCount, kSize);
}

TEST_F(EventRowsTest, RowsLargerThanAnyPiece) {
    EventRows rows;
    constexpr std::size_t kSize = EventRows::kBytesInMemory + 1;
    for (std::int64_t i = 0; i < 3; ++i) {
        ASSERT_TRUE(rows.add(eventOf(i, kSize)));
    }
    expectWhole(rows, 3, kSize);
}

TEST_F(EventRowsTest, AFileIsMadeOnlyWhenItIsNeeded) {
    const std::string missing = directory.path() / "missing";
    ::setenv("TMPDIR", missing.c_str(), 1);
    EventRows one;
    ASSERT_TRUE(one.add(eventOf(0, 0)));
    constexpr std::size_t kHead = 32;
    for (const std::size_t spare : {1U, 0U}) {
        EventRows rows;
        EXPECT_TRUE(rows.add(eventOf(0, EventRows::kBytesInMemory - kHead - spare)));
        EXPECT_FALSE(rows.problem());
    }
    EventRows rows;
    EXPECT_FALSE(rows.add(eventOf(0, EventRows::kBytesInMemory - kHead + 1)));
    ASSERT_TRUE(rows.problem());
    EXPECT_EQ(statusOf(*rows.problem()), ExitStatus::failed);
    EXPECT_EQ(rows.problem()->description,
              "cannot keep what was read: " + missing + ": No such file or directory");
    EXPECT_FALSE(rows.add(eventOf(1, 0)));
}

} // namespace
} // namespace kstctl
