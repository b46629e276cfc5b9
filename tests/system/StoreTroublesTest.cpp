// The real daemon when its analytics database cannot be used: the figures are acknowledged all the
// same, and the next event is kept once the cause is gone.

#include "tests/kstd/Analytics/SQLite/SmallDisk.h"
#include "tests/system/AnalyticsFixture.h"

#include <filesystem>
#include <functional>

namespace system_tests {
namespace {

namespace fs = std::filesystem;

using kstd::SmallDisk;

constexpr char kOpening[] = "TQAnalyticsLogger: db is closed, attempting to open";

std::string failedToRun(const std::string& SQL, int code) {
    return "KSTDSQLite: Error executing SQL: \"" + SQL + "\" (" + std::to_string(code) + ")";
}

class StoreTroublesTest : public AnalyticsFixture {
  protected:
    void SetUp() override { startKernel(); }

    /// What an event says that finds the database closed throughout: an attempt for each of its
    /// three operations. `before` comes ahead of the failure's own line.
    [[nodiscard]] static Lines linesWhenClosed(const std::string& reason, const Lines& before) {
        Lines lines;
        for (int operation = 0; operation < 3; ++operation) {
            lines.emplace_back(kOpening);
            lines.insert(lines.end(), before.begin(), before.end());
            lines.push_back("TQAnalyticsLogger: failed to open db with error " + reason);
        }
        return lines;
    }

    /// What the first event of a daemon says: an attempt at the start, and those of any event.
    [[nodiscard]] static Lines linesOfFirstEvent(const std::string& reason, const Lines& before) {
        Lines lines = before;
        lines.push_back(
            "TQAnalyticsLogger: could not open db at init, will try again later. Error: " + reason);
        const Lines more = linesWhenClosed(reason, before);
        lines.insert(lines.end(), more.begin(), more.end());
        return lines;
    }

    /// Two events meet the trouble, and the one after `repair` does not.
    void expectTrouble(const std::string& rest, const Lines& before,
                       const std::function<void()>& repair) {
        const std::string reason = "Error opening db at " + database() + ", " + rest;
        launch();
        EXPECT_EQ(publishEvent(), linesOfFirstEvent(reason, before));
        EXPECT_EQ(publishEvent(), linesWhenClosed(reason, before));
        repair();
        EXPECT_EQ(publishEvent(), Lines{kOpening});
        EXPECT_EQ(storedEvents(), 1);
        EXPECT_EQ(OtherConnection(database()).one("pragma integrity_check"), "ok");
    }

    void removeDatabase() const {
        for (const char* const suffix : {"", "-wal", "-shm"}) {
            fs::remove(database() + suffix);
        }
    }
};

TEST_F(StoreTroublesTest, FileThatIsNoDatabase) {
    putFile(kDatabaseFile, std::vector<std::uint8_t>(100, 'x'));
    expectTrouble("", {failedToRun("pragma journal_mode = WAL", SQLITE_NOTADB)},
                  [this] { removeDatabase(); });
}

TEST_F(StoreTroublesTest, FileWithoutItsLastPage) {
    launch();
    EXPECT_EQ(publishEvent(), Lines());
    daemon.reset();
    // Whoever closes a database last brings everything into the one file.
    EXPECT_EQ(storedEvents(), 1);
    fs::resize_file(database(), fs::file_size(database()) - 4096);
    expectTrouble("", {failedToRun("pragma journal_mode = WAL", SQLITE_CORRUPT)},
                  [this] { removeDatabase(); });
}

TEST_F(StoreTroublesTest, DirectoryInThePlaceOfTheFile) {
    fs::create_directory(database());
    expectTrouble("rc=14(0xe)", {}, [this] { fs::remove(database()); });
}

TEST_F(StoreTroublesTest, DiskThatIsFullAtTheFirstEvent) {
    const SmallDisk disk(real("/var/root"));
    if (!disk.isMounted()) {
        GTEST_SKIP() << "mounting a small file system needs root";
    }
    disk.fill();
    expectTrouble("", {failedToRun("pragma journal_mode = WAL", SQLITE_FULL)},
                  [&disk] { disk.makeRoom(); });
}

TEST_F(StoreTroublesTest, DiskThatBecomesFull) {
    const SmallDisk disk(real("/var/root"));
    if (!disk.isMounted()) {
        GTEST_SKIP() << "mounting a small file system needs root";
    }
    launch();
    EXPECT_EQ(publishEvent(), Lines());
    disk.fill();
    const Lines expected = {"KSTDSQLite: Failed to step (13): \"insert or replace into all_events "
                            "(data,timestamp) values (?,?)\""};
    EXPECT_EQ(publishEvent(), expected);
    EXPECT_EQ(publishPolicyEvent(), expected);
    EXPECT_EQ(storedEvents(), 1);
    disk.makeRoom();
    EXPECT_EQ(publishEvent(), Lines());
    EXPECT_EQ(storedEvents(), 2);
    EXPECT_EQ(OtherConnection(database()).one("pragma integrity_check"), "ok");
}

} // namespace
} // namespace system_tests
