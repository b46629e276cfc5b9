#include "kstd/Analytics/SQLite/DatabaseFile.h"
#include "tests/kstd/Analytics/SQLite/DatabaseFixture.h"
#include "tests/support/ChildProcess.h"

#include <fcntl.h>

namespace kstd {
namespace {

constexpr char kClosed[] = "KSTDSQLite: Database is closed";

class KSTDSQLiteTest : public DatabaseFixture {
  protected:
    [[nodiscard]] bool exists(const std::string& suffix) const {
        return std::filesystem::exists(path + suffix);
    }
};

TEST_F(KSTDSQLiteTest, ConstructionTouchesNoFile) {
    const auto made = database();
    EXPECT_FALSE(exists(""));
    EXPECT_EQ(made->delegate(), nullptr);
    EXPECT_EQ(made->path(), path);
    EXPECT_EQ(made->schema(), kSchema);
    EXPECT_EQ(made->schemaVersion().size(), 64U);
    EXPECT_TRUE(made->statementsBySQL().empty());
    EXPECT_EQ(made->objectClassPrefix(), "RX");
    EXPECT_EQ(made->synchronousMode(), 1);
    EXPECT_EQ(made->userVersion(), 0);
    EXPECT_EQ(made->db(), nullptr);
    EXPECT_EQ(made->openCount(), 0U);
    EXPECT_FALSE(made->isOpen());
    EXPECT_FALSE(made->hasMigrated());
    EXPECT_TRUE(made->shouldVacuum());
    EXPECT_FALSE(made->corrupt());
    EXPECT_FALSE(made->traced());
}

TEST_F(KSTDSQLiteTest, FieldsKeepWhatIsSet) {
    const auto made = database();
    made->setObjectClassPrefix("AB");
    EXPECT_EQ(made->objectClassPrefix(), "AB");
    made->setSynchronousMode(2);
    EXPECT_EQ(made->synchronousMode(), 2);
    made->setCorrupt(true);
    EXPECT_TRUE(made->corrupt());
    made->setTraced(true);
    EXPECT_TRUE(made->traced());
    made->setShouldVacuum(false);
    EXPECT_FALSE(made->shouldVacuum());
    made->setOpenCount(7);
    EXPECT_EQ(made->openCount(), 7U);
    made->setOpenCount(0);
}

TEST_F(KSTDSQLiteTest, ConnectionMadeElsewhereCanBeSet) {
    sqlite3* connection = nullptr;
    ASSERT_EQ(sqlite3_open(path.c_str(), &connection), SQLITE_OK);
    const auto made = database();
    made->setDb(connection);
    made->setOpenCount(1);
    EXPECT_TRUE(made->executeSQL("create table A (x)"));
    made->close();
    EXPECT_EQ(made->db(), nullptr);
    EXPECT_EQ(lines(), Texts());
}

TEST_F(KSTDSQLiteTest, ClosedDatabaseRefusesEverything) {
    const auto made = database();
    EXPECT_FALSE(made->executeSQL("select 1"));
    EXPECT_EQ(made->statementForSQL("select 1"), nullptr);
    EXPECT_EQ(made->lastInsertRowID(), -1);
    EXPECT_EQ(made->changes(), -1);
    EXPECT_EQ(lines(), Texts(4, kClosed));
    made->begin();
    made->end();
    made->rollback();
    made->analyze();
    made->vacuum();
    made->dropAllTables();
    made->setProperty("v", "k");
    made->removePropertyForKey("k");
    EXPECT_EQ(lines(), Texts(8, kClosed));
    EXPECT_EQ(made->propertyForKey("k"), std::nullopt);
    EXPECT_EQ(made->allTableNames(), Texts());
    EXPECT_EQ(made->columnNamesForTable("T"), std::set<std::string>());
    EXPECT_EQ(made->dbUserVersion(), 0);
    EXPECT_EQ(lines(), Texts(4, kClosed));
    for (const platform::FakeSystemLog::Line& line : log.lines()) {
        EXPECT_EQ(line.level, platform::LogLevel::notice);
    }
}

TEST_F(KSTDSQLiteTest, ClosingAClosedDatabaseDoesNothing) {
    const auto made = database();
    made->close();
    EXPECT_EQ(made->openCount(), 0U);
    EXPECT_EQ(lines(), Texts());
}

TEST_F(KSTDSQLiteTest, LastCloseCloses) {
    const auto opened = openDatabase();
    EXPECT_TRUE(opened->openWithError(nullptr));
    opened->close();
    EXPECT_TRUE(opened->isOpen());
    EXPECT_FALSE(opened->statementsBySQL().empty());
    opened->close();
    EXPECT_FALSE(opened->isOpen());
    EXPECT_EQ(opened->openCount(), 0U);
    EXPECT_TRUE(opened->statementsBySQL().empty());
    // SQLite removes these with the last connection.
    EXPECT_FALSE(exists("-wal"));
    EXPECT_FALSE(exists("-shm"));
}

TEST_F(KSTDSQLiteTest, StatementLeftUnresetKeepsTheDatabaseOpen) {
    const auto opened = openDatabase();
    const auto statement = opened->statementForSQL("select 1");
    ASSERT_TRUE(statement->step());
    const Texts refused{"KSTDSQLite: Statement not reset after last use: \"select 1\"",
                        "KSTDSQLite: Error closing database"};
    opened->close();
    EXPECT_EQ(lines(), refused);
    EXPECT_TRUE(opened->isOpen());
    EXPECT_EQ(opened->openCount(), 1U);
    EXPECT_TRUE(opened->statementsBySQL().empty());

    opened->close();
    EXPECT_EQ(lines(), Texts{"KSTDSQLite: Error closing database"});

    statement->reset();
    statement->finalizeStatement();
    opened->close();
    EXPECT_FALSE(opened->isOpen());
    EXPECT_EQ(lines(), Texts());
}

TEST_F(KSTDSQLiteTest, UnresetStatementThatNobodyHoldsKeepsItOpenToo) {
    const auto opened = openDatabase();
    ASSERT_TRUE(opened->statementForSQL("select 1")->step());
    opened->close();
    EXPECT_TRUE(opened->isOpen());
}

TEST_F(KSTDSQLiteTest, DestructionClosesOnceAndReleasesTheRestQuietly) {
    auto opened = openDatabase();
    EXPECT_TRUE(opened->openWithError(nullptr));
    opened.reset();
    EXPECT_EQ(lines(), Texts());
    EXPECT_FALSE(exists("-wal"));

    opened = openDatabase();
    ASSERT_TRUE(opened->statementForSQL("select 1")->step());
    opened.reset();
    EXPECT_EQ(lines(), (Texts{"KSTDSQLite: Statement not reset after last use: \"select 1\"",
                              "KSTDSQLite: Error closing database"}));
    EXPECT_FALSE(exists("-wal"));
}

TEST_F(KSTDSQLiteTest, StatementMayBeFreedAfterItsDatabase) {
    auto opened = openDatabase();
    auto statement = opened->statementForSQL("select 1");
    ASSERT_TRUE(statement->step());
    opened.reset();
    EXPECT_TRUE(exists("-wal"));
    statement.reset();
    EXPECT_FALSE(exists("-wal"));
}

TEST_F(KSTDSQLiteTest, RemoveDeletesTheFileAndItsCompanions) {
    const auto made = database();
    made->remove();
    openDatabase()->close();
    for (const char* const suffix : {"-journal", "-wal", "-shm", "-other"}) {
        write(path + suffix, "x");
    }
    made->remove();
    for (const char* const suffix : {"", "-journal", "-wal", "-shm"}) {
        EXPECT_FALSE(exists(suffix)) << suffix;
    }
    EXPECT_TRUE(exists("-other"));
    EXPECT_EQ(lines(), Texts());
}

TEST_F(KSTDSQLiteTest, RemoveDoesNotClose) {
    const auto opened = openDatabase();
    opened->remove();
    EXPECT_TRUE(opened->isOpen());
    EXPECT_FALSE(exists(""));
}

/// Whether another process finds a lock on the file.
bool isLocked(const std::string& file) {
    return support::exitStatusOfChild([&file] {
               const int descriptor = ::open(file.c_str(), O_RDWR);
               struct flock whole {};
               whole.l_type = F_WRLCK;
               return ::fcntl(descriptor, F_GETLK, &whole) == 0 && whole.l_type != F_UNLCK ? 1 : 0;
           }) == 1;
}

TEST_F(KSTDSQLiteTest, NewFileIsTheOwnersAlone) {
    const std::string fresh = directory.file("fresh.db");
    for (const mode_t mask : {mode_t{0}, mode_t{0777}}) {
        const mode_t former = ::umask(mask);
        EXPECT_TRUE(createDatabaseFile(fresh));
        ::umask(former);
        EXPECT_EQ(std::filesystem::status(fresh).permissions(),
                  std::filesystem::perms::owner_read | std::filesystem::perms::owner_write);
        EXPECT_FALSE(createDatabaseFile(fresh));
        std::filesystem::remove(fresh);
    }
    EXPECT_TRUE(createDatabaseFile(directory.file("nowhere/fresh.db")));
}

TEST_F(KSTDSQLiteTest, ParentDirectoriesAreMadeFromTheFirst) {
    const std::string current = std::filesystem::current_path();
    std::filesystem::current_path(directory.file(""));
    EXPECT_FALSE(makeParentDirectories("d/e//f/x.db").has_value());
    std::filesystem::current_path(current);
    EXPECT_TRUE(std::filesystem::is_directory(directory.file("d/e/f")));
    EXPECT_FALSE(std::filesystem::exists(directory.file("d/e/f/x.db")));
}

TEST_F(KSTDSQLiteTest, SecondObjectLeavesTheLocksOfTheFirst) {
    const auto first = openDatabase();
    ASSERT_TRUE(isLocked(path));
    EXPECT_FALSE(createDatabaseFile(path));
    EXPECT_TRUE(isLocked(path));
    const auto second = openDatabase();
    EXPECT_TRUE(isLocked(path));
}

TEST_F(KSTDSQLiteTest, TransactionsCommitAndRollBack) {
    const auto opened = openDatabase();
    opened->begin();
    opened->insertOrReplaceInto("T", {{"a", 1}});
    OtherConnection other(path);
    EXPECT_EQ(other.run("begin immediate"), SQLITE_BUSY);
    opened->rollback();
    EXPECT_EQ(other.one("select count(*) from T"), "0");
    opened->begin();
    opened->insertOrReplaceInto("T", {{"a", 2}});
    opened->end();
    EXPECT_EQ(other.rows("select a from T"), Texts{"2"});
    EXPECT_EQ(lines(), Texts());
    opened->end();
    opened->rollback();
    EXPECT_EQ(lines(), (Texts{"KSTDSQLite: Error executing SQL: \"end\" (1)",
                              "KSTDSQLite: Error executing SQL: \"rollback\" (1)"}));
}

TEST_F(KSTDSQLiteTest, AnalyzeAndVacuumRun) {
    const auto opened = openDatabase("create table T (a); create index I on T (a);");
    opened->insertOrReplaceInto("T", {{"a", 1}});
    opened->analyze();
    EXPECT_EQ(OtherConnection(path).one("select stat from sqlite_stat1 where tbl = 'T'"), "1 1");
    opened->vacuum();
    EXPECT_EQ(lines(), Texts());
    opened->begin();
    opened->vacuum();
    EXPECT_EQ(lines(), Texts{"KSTDSQLite: Error executing SQL: \"vacuum\" (1)"});
}

TEST_F(KSTDSQLiteTest, ExecuteReadsTheFormatAndNoArgument) {
    const auto opened = openDatabase();
    const std::string argument = "100%d %@ %s %%";
    EXPECT_TRUE(opened->executeSQL("insert into T values ('%@', %d)", argument, 7));
    EXPECT_TRUE(opened->executeSQL("insert into T values (1, 1); insert into T values (%ld, '%%')",
                                   std::int64_t{1} << 40));
    EXPECT_EQ(OtherConnection(path).rows("select a, b from T"),
              (Texts{argument + "|7", "1|1", "1099511627776|%"}));
}

TEST_F(KSTDSQLiteTest, FailureIsLoggedWithTextAndExtendedCode) {
    const auto opened = openDatabase("create table T (a unique);");
    EXPECT_FALSE(opened->executeSQL("insert into %@ values (1); insert into T values (1)", "T"));
    EXPECT_FALSE(opened->executeSQL("nonsense %%"));
    EXPECT_EQ(lines(), (Texts{"KSTDSQLite: Error executing SQL: \"insert into T values (1); insert "
                              "into T values (1)\" (2067)",
                              "KSTDSQLite: Error executing SQL: \"nonsense %\" (1)"}));
}

TEST_F(KSTDSQLiteTest, StatementIsPreparedOnceForItsText) {
    const auto opened = openDatabase();
    const std::size_t before = opened->statementsBySQL().size();
    const auto first = opened->statementForSQL("select 1");
    EXPECT_EQ(opened->statementForSQL("select 1"), first);
    EXPECT_NE(opened->statementForSQL("select  1"), first);
    ASSERT_TRUE(first->step());
    EXPECT_EQ(opened->statementForSQL("select 1"), first);
    first->reset();
    EXPECT_EQ(opened->statementsBySQL().size(), before + 2);
    EXPECT_EQ(first->SQLite(), opened.get());
    EXPECT_EQ(first->SQL(), "select 1");
}

TEST_F(KSTDSQLiteTest, TextThatIsNoSQLIsLoggedAndNotCached) {
    const auto opened = openDatabase();
    const std::size_t before = opened->statementsBySQL().size();
    EXPECT_EQ(opened->statementForSQL("nonsense"), nullptr);
    EXPECT_EQ(lines(), Texts{"Error preparing statement: nonsense"});
    EXPECT_EQ(opened->statementsBySQL().size(), before);
}

TEST_F(KSTDSQLiteTest, EmptyTextIsAStatementWithoutAHandle) {
    const auto opened = openDatabase();
    const auto statement = opened->statementForSQL("");
    ASSERT_NE(statement, nullptr);
    EXPECT_EQ(statement->handle(), nullptr);
    EXPECT_EQ(opened->statementForSQL(""), statement);
    opened->close();
    EXPECT_FALSE(opened->isOpen());
    EXPECT_EQ(lines(), Texts());
}

TEST_F(KSTDSQLiteTest, RemovedStatementsArePreparedAnew) {
    const auto opened = openDatabase();
    const auto first = opened->statementForSQL("select 1");
    opened->removeAllStatements();
    EXPECT_TRUE(opened->statementsBySQL().empty());
    EXPECT_EQ(first->handle(), nullptr);
    const auto second = opened->statementForSQL("select 1");
    EXPECT_NE(second, first);
    EXPECT_TRUE(second->step());
    second->reset();
}

TEST_F(KSTDSQLiteTest, ChangesAndLastRow) {
    const auto opened = openDatabase();
    ASSERT_TRUE(opened->executeSQL("insert into T values (1, 0), (2, 0), (3, 0)"));
    EXPECT_EQ(opened->lastInsertRowID(), 3);
    EXPECT_EQ(opened->changes(), 3);
    ASSERT_TRUE(opened->executeSQL("update T set b = 1 where a < 3"));
    EXPECT_EQ(opened->changes(), 2);
    ASSERT_TRUE(opened->executeSQL("insert into T (rowid, a) values (9223372036854775807, 4)"));
    EXPECT_EQ(opened->lastInsertRowID(), INT64_MAX);
}

TEST_F(KSTDSQLiteTest, TablesAndColumns) {
    const auto opened = openDatabase("create table Z (c, a, b); create table A (x); create view V "
                                     "as select * from A; create index I on A (x);");
    EXPECT_EQ(opened->allTableNames(), (Texts{"Properties", "Z", "A"}));
    EXPECT_EQ(opened->columnNamesForTable("Z"), (std::set<std::string>{"a", "b", "c"}));
    EXPECT_EQ(opened->columnNamesForTable("none"), std::set<std::string>());
    EXPECT_TRUE(opened->executeSQL("pragma user_version = %ld", -5));
    EXPECT_EQ(opened->dbUserVersion(), -5);
    EXPECT_EQ(lines(), Texts());
    EXPECT_EQ(opened->columnNamesForTable("not a name"), std::set<std::string>());
    EXPECT_EQ(lines(), Texts{"Error preparing statement: pragma table_info(not a name)"});
}

TEST_F(KSTDSQLiteTest, DroppingAllTablesDropsTheProperties) {
    const auto opened = openDatabase();
    opened->dropAllTables();
    EXPECT_EQ(opened->allTableNames(), Texts());
    EXPECT_EQ(lines(), Texts());
}

} // namespace
} // namespace kstd
