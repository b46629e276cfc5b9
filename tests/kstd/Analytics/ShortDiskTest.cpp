// A file system with little room left, at every amount of it, or at every kStep-th KiB in the short
// form. Its blocks are smaller than a page: what is mapped has holes then.

#include "tests/kstd/Analytics/EventStoreFixture.h"
#include "tests/kstd/Analytics/SQLite/SmallDisk.h"
#include "tests/support/ChildProcess.h"

#include <functional>
#include <iostream>
#include <regex>

namespace kstd {
namespace {

constexpr std::uint64_t kKiB = 1024;
constexpr std::uint64_t kStep = KSTD_SHORT_DISK_STEP;

class ShortDiskTest : public EventStoreFixture {
  protected:
    /// More than making a database and storing an event ever needs.
    static constexpr std::uint64_t kEnough = 160;

    /// Lets a child process store events at every amount of free space, from none to enough, each
    /// time on what `arrange` leaves. It has failed when one of its expectations was not met, and
    /// when it was killed.
    void atEveryAmount(const std::function<void()>& arrange) {
        const SmallDisk disk(directory.file("disk"), SmallDisk::Blocks::ofOneKiB);
        if (!disk.isMounted()) {
            GTEST_SKIP() << "mounting a file system from a file needs root, mkfs.ext4 and a loop "
                            "device";
        }
        file = disk.file("x.db");
        for (std::uint64_t free = 0; free <= kEnough; free += kStep) {
            SCOPED_TRACE(std::to_string(free) + " KiB free");
            arrange();
            disk.leaveFree(free * kKiB);
            ASSERT_EQ(support::exitStatusOfChild([&] {
                          storeBeforeAndAfter(disk, free);
                          TQAnalyticsLoggerSQLiteStore::releaseStores();
                          std::cout.flush();
                          return HasFailure() ? 1 : 0;
                      }),
                      0);
            disk.makeRoom();
        }
    }

    void removeDatabase() const {
        for (const char* const suffix : {"", "-wal", "-shm"}) {
            std::filesystem::remove(file + suffix);
        }
    }

    /// An event comes while there is little room, and another one when there is room again.
    void storeBeforeAndAfter(const SmallDisk& disk, std::uint64_t free) {
        const Store store = storeAt(file);
        if (!store->isOpen()) {
            EXPECT_LT(free, kEnough);
            expectFullDisk(lines());
        }
        store->addEventDict(event(1), kEventTable);
        const Texts said = lines();
        platform::ValueList expected;
        if (said.empty()) {
            expected.emplace_back(event(1));
        } else {
            EXPECT_LT(free, kEnough);
            expectFullDisk(said);
        }
        EXPECT_EQ(store->allEvents(), expected);

        disk.makeRoom();
        store->addEventDict(event(2), kEventTable);
        expected.emplace_back(event(2));
        EXPECT_EQ(store->allEvents(), expected);
    }

    /// One of the lines gives SQLite's number for a full disk, and none another one.
    static void expectFullDisk(const Texts& said) {
        static const std::regex number("^KSTDSQLite: .*\\((\\d+)\\)");
        int full = 0;
        for (const std::string& line : said) {
            std::smatch found;
            if (std::regex_search(line, found, number)) {
                EXPECT_EQ(found[1], "13") << line;
                ++full;
            }
        }
        EXPECT_GT(full, 0) << testing::PrintToString(said);
    }

    std::string file;
};

TEST_F(ShortDiskTest, WhileTheDatabaseIsMade) {
    atEveryAmount([this] { removeDatabase(); });
}

TEST_F(ShortDiskTest, WhenOneIsThere) {
    atEveryAmount([this] {
        removeDatabase();
        KSTDSQLite made(file, kEventSchema, environment);
        ASSERT_TRUE(made.openWithError(nullptr));
    });
}

} // namespace
} // namespace kstd
