#include "tests/kstd/Analytics/EventStoreFixture.h"
#include "tests/kstd/Analytics/SQLite/LockHolder.h"
#include "tests/kstd/Analytics/SQLite/SleeplessFiles.h"
#include "tests/kstd/Analytics/SQLite/SmallDisk.h"
#include "tests/support/ChildProcess.h"

#include <iostream>

namespace kstd {
namespace {

using platform::LogLevel;
using platform::Timestamp;
using platform::ValueList;

class EventStoreFailuresTest : public EventStoreFixture {
  protected:
    [[nodiscard]] std::string cannotOpen(const std::string& file) const {
        return "Error opening db at " + file + ", rc=14(0xe)";
    }
    [[nodiscard]] std::string cannotSetUp(const std::string& file) const {
        return "Error opening db at " + file + ", ";
    }
    [[nodiscard]] static std::string failedToRun(const std::string& text, int code) {
        return "KSTDSQLite: Error executing SQL: \"" + text + "\" (" + std::to_string(code) + ")";
    }
    [[nodiscard]] static std::string failedToInsert(int code) {
        return "KSTDSQLite: Failed to step (" + std::to_string(code) + "): \"" + kInsertText + "\"";
    }
    [[nodiscard]] static Texts preceded(const std::string& first, const Texts& others) {
        Texts all{first};
        all.insert(all.end(), others.begin(), others.end());
        return all;
    }
    /// The first line of `lines` is the attempt to open, behind which `inserted` comes.
    [[nodiscard]] static Texts insertedSecond(Texts lines, const std::string& inserted) {
        lines.insert(lines.begin() + 1, inserted);
        return lines;
    }
    void expectSound(const std::string& file) {
        EXPECT_EQ(OtherConnection(file).one("pragma integrity_check"), "ok");
    }
};

TEST_F(EventStoreFailuresTest, EveryOperationOfAClosedStoreTriesToOpenItFirst) {
    ASSERT_TRUE(std::filesystem::create_directory(path));
    const Store store = makeStore();
    EXPECT_FALSE(store->isOpen());
    EXPECT_EQ(lines(), linesAtOpening(cannotOpen(path)));

    const Texts expected = linesWhenClosed(cannotOpen(path));
    EXPECT_FALSE(store->tryToOpenDatabase());
    EXPECT_EQ(log.lines()[0].level, LogLevel::warning);
    EXPECT_EQ(log.lines()[1].level, LogLevel::error);
    EXPECT_EQ(lines(), expected);
    store->addEventDict(event(1), kEventTable);
    EXPECT_EQ(lines(), expected);
    EXPECT_EQ(store->allEvents(), ValueList());
    EXPECT_EQ(lines(), expected);
    store->visitEvents([](auto /*data*/) { ADD_FAILURE(); });
    EXPECT_EQ(lines(), expected);
    EXPECT_EQ(store->uploadDate(), std::nullopt);
    EXPECT_EQ(lines(), expected);
    store->setUploadDate(Timestamp{0});
    EXPECT_EQ(lines(), expected);
    store->clearAllData();
    EXPECT_EQ(lines(), expected);
    EXPECT_TRUE(std::filesystem::is_empty(path));

    std::filesystem::remove(path);
    store->addEventDict(event(2), kEventTable);
    EXPECT_EQ(lines(), lineOfRecovery());
    EXPECT_TRUE(store->tryToOpenDatabase());
    EXPECT_EQ(store->allEvents(), ValueList{event(2)});
    EXPECT_EQ(lines(), Texts());
}

TEST_F(EventStoreFailuresTest, OpeningAtEveryRequestForAStoreThatIsClosed) {
    ASSERT_TRUE(std::filesystem::create_directory(path));
    const Store store = makeStore();
    static_cast<void>(makeStore());
    EXPECT_EQ(store->openCount(), 0U);
    EXPECT_EQ(lines().size(), 2U);
    std::filesystem::remove(path);
    EXPECT_EQ(makeStore(), store);
    EXPECT_EQ(store->openCount(), 1U);
    EXPECT_EQ(lines(), Texts());
}

TEST_F(EventStoreFailuresTest, DirectoryThatCannotBeMade) {
    write(directory.file("file"), "");
    const std::string below = directory.file("file/sub/x.db");
    const std::string reason =
        "Cannot make the directory " + directory.file("file/sub") + ": Not a directory";
    const Store store = storeAt(below);
    EXPECT_EQ(lines(), linesAtOpening(reason));
    store->addEventDict(event(1), kEventTable);
    EXPECT_EQ(lines(), linesWhenClosed(reason));

    std::filesystem::remove(directory.file("file"));
    store->addEventDict(event(2), kEventTable);
    EXPECT_EQ(store->allEvents(), ValueList{event(2)});
    EXPECT_EQ(lines(), lineOfRecovery());
}

TEST_F(EventStoreFailuresTest, FileThatIsNoDatabase) {
    write(path, std::string(100, 'x'));
    const std::string failed = failedToRun("pragma journal_mode = WAL", 26);
    const Store store = makeStore();
    EXPECT_EQ(lines(), preceded(failed, linesAtOpening(cannotSetUp(path))));
    store->addEventDict(event(1), kEventTable);
    EXPECT_EQ(lines(), insertedSecond(linesWhenClosed(cannotSetUp(path)), failed));

    store->remove();
    store->addEventDict(event(2), kEventTable);
    EXPECT_EQ(store->allEvents(), ValueList{event(2)});
    EXPECT_EQ(lines(), lineOfRecovery());
}

TEST_F(EventStoreFailuresTest, FileWithoutItsLastPage) {
    makeStore()->addEventDict(event(1), kEventTable);
    TQAnalyticsLoggerSQLiteStore::releaseStores();
    std::filesystem::resize_file(path, std::filesystem::file_size(path) - 4096);
    const std::string failed = failedToRun("pragma journal_mode = WAL", 11);
    const Store store = makeStore();
    EXPECT_EQ(lines(), preceded(failed, linesAtOpening(cannotSetUp(path))));

    store->remove();
    store->addEventDict(event(2), kEventTable);
    EXPECT_EQ(store->allEvents(), ValueList{event(2)});
    expectSound(path);
}

/// A page that nobody reads keeps nobody from storing.
TEST_F(EventStoreFailuresTest, PageDamagedAmongTheEvents) {
    constexpr std::int64_t kEvents = 300;
    {
        const Store store = makeStore();
        for (std::int64_t i = 0; i < kEvents; ++i) {
            store->addEventDict(event(i), kEventTable);
        }
    }
    TQAnalyticsLoggerSQLiteStore::releaseStores();
    const std::string page = OtherConnection(path).one(
        "select pageno from dbstat where name = 'all_events' and pagetype = 'leaf' "
        "order by path limit 1 offset 3");
    std::string content = read(path);
    content.replace((std::stoul(page) - 1) * 4096, 4096, std::string(4096, '\xff'));
    write(path, content);

    const Store store = makeStore();
    store->addEventDict(event(kEvents), kEventTable);
    EXPECT_EQ(lines(), Texts());
    const std::size_t readable = store->allEvents().size();
    EXPECT_GT(readable, 0U);
    EXPECT_LT(readable, static_cast<std::size_t>(kEvents));
    EXPECT_EQ(lines(), Texts{"KSTDSQLite: Failed to step (11): \"select data from all_events\""});
    store->clearAllData();
    EXPECT_EQ(lines(),
              Texts{"KSTDSQLite: Failed to step (11): \"delete from all_events where id >= 0\""});
    EXPECT_EQ(store->allEvents().size(), readable);
}

/// SQLite takes the first part of a log that is not as it was written for its end.
TEST_F(EventStoreFailuresTest, TableThatIsGoneHasNoEvents) {
    const Store store = makeStore();
    store->addEventDict(event(1), kEventTable);
    EXPECT_TRUE(store->executeSQL("drop table all_events"));
    static_cast<void>(lines());
    EXPECT_EQ(store->allEvents(), platform::ValueList());
    EXPECT_EQ(lines(), Texts{"Error preparing statement: select data from all_events"});
}

TEST_F(EventStoreFailuresTest, DamagedLogEndsBeforeTheDamage) {
    const Store store = makeStore();
    ASSERT_EQ(OtherConnection(path).run("pragma wal_checkpoint(TRUNCATE)"), SQLITE_OK);
    for (const std::int64_t i : {1, 2, 3}) {
        store->addEventDict(event(i), kEventTable);
    }
    // As a power cut leaves them, and then some.
    const std::string copy = directory.file("copy.db");
    write(copy, read(path));
    std::string logged = read(path + "-wal");
    logged[logged.size() - 100] = static_cast<char>(logged[logged.size() - 100] ^ 1);
    write(copy + "-wal", logged);

    const Store damaged = storeAt(copy);
    EXPECT_EQ(damaged->allEvents(), (ValueList{event(1), event(2)}));
    damaged->addEventDict(event(4), kEventTable);
    EXPECT_EQ(damaged->allEvents(), (ValueList{event(1), event(2), event(4)}));
    EXPECT_EQ(lines(), Texts());
}

TEST_F(EventStoreFailuresTest, EmptyFileIsANewDatabase) {
    write(path, "");
    const Store store = makeStore();
    store->addEventDict(event(1), kEventTable);
    EXPECT_EQ(store->allEvents(), ValueList{event(1)});
    EXPECT_EQ(lines(), Texts());
}

TEST_F(EventStoreFailuresTest, LockHeldForLongerThanTheBusyTimeout) {
    LockHolder holder(path);
    std::int64_t waited = 0;
    const SleeplessFiles sleepless([&waited](int microseconds) { waited += microseconds; });
    environment.busyTimeout = DatabaseEnvironment{log, clock, propertyLists}.busyTimeout;
    const Store store = makeStore();
    EXPECT_EQ(waited, 0);
    holder.lock();
    store->addEventDict(event(1), kEventTable);
    EXPECT_EQ(lines(), Texts{failedToInsert(SQLITE_BUSY)});
    EXPECT_EQ(waited, 300'000'000);
    EXPECT_EQ(store->allEvents(), ValueList());

    holder.unlock();
    store->addEventDict(event(2), kEventTable);
    EXPECT_EQ(store->allEvents(), ValueList{event(2)});
    EXPECT_EQ(waited, 300'000'000);
    EXPECT_EQ(lines(), Texts());
}

TEST_F(EventStoreFailuresTest, LockHeldForShorterThanTheBusyTimeout) {
    LockHolder holder(path);
    int sleeps = 0;
    const SleeplessFiles sleepless([&holder, &sleeps](int /*microseconds*/) {
        if (++sleeps == 5) {
            holder.unlock();
        }
    });
    environment.busyTimeout = std::chrono::minutes(5);
    const Store store = makeStore();
    holder.lock();
    store->addEventDict(event(1), kEventTable);
    EXPECT_EQ(sleeps, 5);
    EXPECT_EQ(store->allEvents(), ValueList{event(1)});
    EXPECT_EQ(lines(), Texts());
}

TEST_F(EventStoreFailuresTest, LockHeldWhileTheStoreIsOpened) {
    LockHolder holder(path);
    makeStore()->addEventDict(event(1), kEventTable);
    TQAnalyticsLoggerSQLiteStore::releaseStores();
    int sleeps = 0;
    const SleeplessFiles sleepless([&sleeps](int /*microseconds*/) { ++sleeps; });
    holder.lock();
    const std::string failed = failedToRun("pragma auto_vacuum = FULL", 5);
    const Store store = makeStore();
    EXPECT_EQ(lines(), preceded(failed, linesAtOpening(cannotSetUp(path))));
    EXPECT_GT(sleeps, 0);
    store->addEventDict(event(2), kEventTable);
    EXPECT_EQ(lines(), insertedSecond(linesWhenClosed(cannotSetUp(path)), failed));

    holder.unlock();
    store->addEventDict(event(3), kEventTable);
    EXPECT_EQ(store->allEvents(), (ValueList{event(1), event(3)}));
    EXPECT_EQ(lines(), lineOfRecovery());
}

TEST_F(EventStoreFailuresTest, DiskThatIsFullWhenAnEventComes) {
    const SmallDisk disk(directory.file("disk"));
    if (!disk.isMounted()) {
        GTEST_SKIP() << "mounting a small file system needs root";
    }
    const std::string file = disk.file("x.db");
    const Store store = storeAt(file);
    store->addEventDict(event(1), kEventTable);
    disk.fill();
    store->addEventDict(event(2), kEventTable);
    EXPECT_EQ(lines(), Texts{failedToInsert(SQLITE_FULL)});
    EXPECT_EQ(store->allEvents(), ValueList{event(1)});
    store->setUploadDate(Timestamp{0});
    EXPECT_EQ(lines(), Texts{"KSTDSQLite: Failed to step (13): \"insert or replace into Properties "
                             "(key, value) values (?,?)\""});

    disk.makeRoom();
    store->addEventDict(event(3), kEventTable);
    EXPECT_EQ(store->allEvents(), (ValueList{event(1), event(3)}));
    EXPECT_EQ(lines(), Texts());
    expectSound(file);
}

TEST_F(EventStoreFailuresTest, DiskThatIsFullWhenTheFileIsMade) {
    const SmallDisk disk(directory.file("disk"));
    if (!disk.isMounted()) {
        GTEST_SKIP() << "mounting a small file system needs root";
    }
    const std::string file = disk.file("x.db");
    disk.fill();
    const Store store = storeAt(file);
    const std::string failed = failedToRun("pragma journal_mode = WAL", SQLITE_FULL);
    EXPECT_EQ(lines(), preceded(failed, linesAtOpening(cannotSetUp(file))));
    store->addEventDict(event(1), kEventTable);
    EXPECT_EQ(lines(), insertedSecond(linesWhenClosed(cannotSetUp(file)), failed));

    disk.makeRoom();
    store->addEventDict(event(2), kEventTable);
    EXPECT_EQ(store->allEvents(), ValueList{event(2)});
    EXPECT_EQ(lines(), lineOfRecovery());
    expectSound(file);
}

/// Directories of mode 0500 hold root up as little as any other: a child that is nobody tries them.
class UnprivilegedTest : public EventStoreFailuresTest {
  protected:
    static constexpr uid_t kNobody = 65534;

    /// Runs `steps` as nobody, who owns the directory. The child's expectations are its own: it
    /// ends with 1 when one of them failed.
    void asNobody(const std::function<void()>& steps) {
        const bool isRoot = ::geteuid() == 0;
        if (isRoot) {
            ASSERT_EQ(::chown(directory.path().c_str(), kNobody, kNobody), 0);
        }
        EXPECT_EQ(support::exitStatusOfChild([&] {
                      if (isRoot && (::setresgid(kNobody, kNobody, kNobody) != 0 ||
                                     ::setresuid(kNobody, kNobody, kNobody) != 0)) {
                          return 2;
                      }
                      steps();
                      TQAnalyticsLoggerSQLiteStore::releaseStores();
                      std::cout.flush();
                      return HasFailure() ? 1 : 0;
                  }),
                  0);
    }

    void setMode(mode_t mode) { ASSERT_EQ(::chmod(directory.path().c_str(), mode), 0); }
};

TEST_F(UnprivilegedTest, DirectoryThatCannotBeWritten) {
    asNobody([this] {
        setMode(0500);
        const Store store = makeStore();
        EXPECT_EQ(lines(), linesAtOpening(cannotOpen(path)));
        store->addEventDict(event(1), kEventTable);
        EXPECT_EQ(lines(), linesWhenClosed(cannotOpen(path)));

        setMode(0700);
        store->addEventDict(event(2), kEventTable);
        EXPECT_EQ(store->allEvents(), ValueList{event(2)});
        EXPECT_EQ(lines(), lineOfRecovery());
    });
}

TEST_F(UnprivilegedTest, ParentThatCannotBeWritten) {
    asNobody([this] {
        setMode(0500);
        const std::string reason =
            "Cannot make the directory " + directory.file("sub") + ": Permission denied";
        const Store store = storeAt(directory.file("sub/x.db"));
        EXPECT_EQ(lines(), linesAtOpening(reason));

        setMode(0700);
        store->addEventDict(event(2), kEventTable);
        EXPECT_EQ(store->allEvents(), ValueList{event(2)});
        EXPECT_EQ(lines(), lineOfRecovery());
    });
}

TEST_F(UnprivilegedTest, FileThatCannotBeWritten) {
    asNobody([this] {
        makeStore()->addEventDict(event(1), kEventTable);
        TQAnalyticsLoggerSQLiteStore::releaseStores();
        ASSERT_EQ(::chmod(path.c_str(), 0400), 0);
        const Store store = makeStore();
        EXPECT_FALSE(store->isOpen());
        EXPECT_EQ(lines(), preceded(failedToRun("pragma auto_vacuum = FULL", SQLITE_READONLY),
                                    linesAtOpening(cannotSetUp(path))));

        // SQLite has given what it keeps beside the file the file's own mode.
        for (const char* const suffix : {"", "-wal", "-shm"}) {
            ASSERT_EQ(::chmod((path + suffix).c_str(), 0600), 0) << suffix;
        }
        store->addEventDict(event(2), kEventTable);
        EXPECT_EQ(store->allEvents(), (ValueList{event(1), event(2)}));
        EXPECT_EQ(lines(), lineOfRecovery());
    });
}

} // namespace
} // namespace kstd
