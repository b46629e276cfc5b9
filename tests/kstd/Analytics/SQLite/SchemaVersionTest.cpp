#include "kstd/Analytics/SQLite/KSTDSQLite.h"
#include "tests/kstd/Analytics/SQLite/DatabaseFixture.h"
#include "tests/support/ChildProcess.h"
#include "tests/support/Program.h"

#include <functional>
#include <unistd.h>
#include <utility>

namespace kstd {
namespace {

TEST(SchemaHashTest, IsUpperCaseSHA256) {
    EXPECT_EQ(schemaHash(""), "E3B0C44298FC1C149AFBF4C8996FB92427AE41E4649B934CA495991B7852B855");
    EXPECT_EQ(schemaHash("abc"),
              "BA7816BF8F01CFEA414140DE5DAE2223B00361A396177A9CB410FF61F20015AD");
}

class SchemaVersionTest : public DatabaseFixture {
  protected:
    /// Leaves a file with one row in T, built at the clock's start; the clock has then moved on.
    void leaveFile(std::int32_t userVersion = 0) {
        const auto made = database();
        made->setUserVersion(userVersion);
        ASSERT_TRUE(made->openWithError(nullptr));
        made->insertOrReplaceInto("T", {{"a", "kept"}});
        made->close();
        clock.advance(64 * platform::kNanosecondsPerSecond);
        EXPECT_EQ(lines(), Texts());
    }

    [[nodiscard]] Texts rowsOfT() { return OtherConnection(path).rows("select a from T"); }
    [[nodiscard]] std::string property(const std::string& key) {
        return OtherConnection(path).property(key);
    }
    [[nodiscard]] std::string fileVersion() {
        return OtherConnection(path).one("pragma user_version");
    }

    static constexpr char kStart[] = "721692800.000000";
    static constexpr char kLater[] = "721692864.000000";
    static constexpr char kOtherSchema[] = "create table T (a, b) ;\n";
};

TEST_F(SchemaVersionTest, HashIsThatOfSha256sum) {
    const std::string schema = "create table \"gr\xc3\xb6\xc3\x9f"
                               "e\" (a);\n-- \x01\xff %@ %d\n";
    write(directory.file("schema"), schema);
    support::Program sha256sum({"/usr/bin/sha256sum", directory.file("schema")});
    const auto line = sha256sum.awaitLine("schema");
    ASSERT_TRUE(line);
    std::string expected = line->substr(0, 64);
    for (char& digit : expected) {
        digit = static_cast<char>(std::toupper(static_cast<unsigned char>(digit)));
    }
    EXPECT_EQ(database(schema)->schemaVersion(), expected);
}

TEST_F(SchemaVersionTest, UnchangedSchemaChangesNothing) {
    leaveFile();
    const auto opened = openDatabase();
    EXPECT_FALSE(opened->hasMigrated());
    EXPECT_EQ(rowsOfT(), Texts{"kept"});
    EXPECT_EQ(property("Created"), kStart);
    EXPECT_EQ(property("LastVacuum"), kStart);
    EXPECT_EQ(lines(), Texts());
}

TEST_F(SchemaVersionTest, OneMoreBlankRebuildsAndVacuums) {
    leaveFile();
    {
        OtherConnection other(path);
        ASSERT_EQ(other.run("create table stranger (x); insert into Properties values ('k', 'v')"),
                  SQLITE_OK);
    }
    const auto opened = openDatabase(kOtherSchema);
    EXPECT_TRUE(opened->hasMigrated());
    EXPECT_EQ(opened->allTableNames(), (Texts{"Properties", "T"}));
    EXPECT_EQ(rowsOfT(), Texts());
    EXPECT_EQ(OtherConnection(path).rows("select key, value from Properties order by key"),
              (Texts{std::string("Created|") + kLater, std::string("LastVacuum|") + kLater,
                     "SchemaVersion|" + opened->schemaVersion()}));
    EXPECT_EQ(lines(), Texts());
}

TEST_F(SchemaVersionTest, RebuiltFileIsNotRebuiltAgain) {
    leaveFile();
    openDatabase(kOtherSchema)->insertOrReplaceInto("T", {{"a", "new"}});
    EXPECT_FALSE(openDatabase(kOtherSchema)->hasMigrated());
    EXPECT_EQ(rowsOfT(), Texts{"new"});
}

TEST_F(SchemaVersionTest, TableOfTheAutomaticNumbersIsNeverDropped) {
    const std::string schema = "create table T (id integer primary key autoincrement);";
    openDatabase(schema)->executeSQL("insert into T values (41)");
    const auto opened = openDatabase(schema + "\n");
    EXPECT_EQ(lines(),
              Texts{"KSTDSQLite: Error executing SQL: \"drop table sqlite_sequence\" (1)"});
    EXPECT_EQ(opened->insertOrReplaceInto("T", {{"id", platform::Null()}}), 1);
}

TEST_F(SchemaVersionTest, NameThatNeedsQuotesStays) {
    leaveFile();
    ASSERT_EQ(OtherConnection(path).run("create table \"a b\" (x); insert into \"a b\" values (7)"),
              SQLITE_OK);
    const auto opened = openDatabase(kOtherSchema);
    EXPECT_EQ(lines(), Texts{"KSTDSQLite: Error executing SQL: \"drop table a b\" (1)"});
    EXPECT_EQ(opened->allTableNames(), (Texts{"a b", "Properties", "T"}));
    EXPECT_EQ(OtherConnection(path).one("select x from \"a b\""), "7");
}

TEST_F(SchemaVersionTest, BrokenSchemaIsBuiltAsFarAsItGoes) {
    const std::string broken = "create table A (x); nonsense; create table B (y);";
    const auto opened = openDatabase(broken);
    EXPECT_EQ(lines(), Texts{"KSTDSQLite: Error executing SQL: \"" + broken + "\" (1)"});
    EXPECT_EQ(opened->allTableNames(), (Texts{"Properties", "A"}));
    EXPECT_EQ(property("SchemaVersion"), opened->schemaVersion());

    EXPECT_FALSE(openDatabase(broken)->hasMigrated());
    EXPECT_EQ(lines(), Texts());
}

TEST_F(SchemaVersionTest, SchemaIsNoFormat) {
    const auto opened = openDatabase("create table A (x default '%@ %d %%');");
    EXPECT_EQ(lines(), Texts());
    EXPECT_EQ(OtherConnection(path).one("select sql from sqlite_master where name = 'A'"),
              "CREATE TABLE A (x default '%@ %d %%')");
}

TEST_F(SchemaVersionTest, FileWithoutVersionIsBuiltBesideWhatIsThere) {
    {
        OtherConnection other(path);
        ASSERT_EQ(other.run("create table stranger (x); insert into stranger values (1)"),
                  SQLITE_OK);
    }
    const auto opened = openDatabase();
    EXPECT_FALSE(opened->hasMigrated());
    EXPECT_EQ(opened->allTableNames(), (Texts{"stranger", "Properties", "T"}));
    EXPECT_EQ(OtherConnection(path).one("select x from stranger"), "1");
    EXPECT_EQ(property("SchemaVersion"), opened->schemaVersion());
}

TEST_F(SchemaVersionTest, UserVersionOfTheFileIsComparedOnlyWhenOneIsWanted) {
    leaveFile();
    ASSERT_EQ(OtherConnection(path).run("pragma user_version = 7"), SQLITE_OK);
    EXPECT_FALSE(openDatabase()->hasMigrated());
    EXPECT_EQ(rowsOfT(), Texts{"kept"});
    EXPECT_EQ(fileVersion(), "7");
}

TEST_F(SchemaVersionTest, WantedUserVersionIsStoredAndCompared) {
    leaveFile(-3);
    EXPECT_EQ(fileVersion(), "-3");
    for (const auto& [wanted, rebuilds] : {std::pair{-3, false}, {-2, true}, {-2, false}}) {
        SCOPED_TRACE(wanted);
        const auto made = database();
        made->setUserVersion(wanted);
        ASSERT_TRUE(made->openWithError(nullptr));
        EXPECT_EQ(made->hasMigrated(), rebuilds);
        EXPECT_EQ(fileVersion(), std::to_string(wanted));
    }
    EXPECT_EQ(rowsOfT(), Texts());
}

class Delegate final : public KSTDSQLiteDelegate {
  public:
    [[nodiscard]] std::int32_t userVersion() override { return version; }
    [[nodiscard]] bool migrateDatabase(KSTDSQLite& database, std::int32_t fromVersion) override {
        calls.push_back(fromVersion);
        return migrate(database);
    }

    std::int32_t version = 0;
    std::function<bool(KSTDSQLite&)> migrate = [](KSTDSQLite&) {
        return true;
    };
    std::vector<std::int32_t> calls;
};

class MigrationTest : public SchemaVersionTest {
  protected:
    [[nodiscard]] std::unique_ptr<KSTDSQLite> openMigrating(const std::string& schema) {
        auto made = database(schema);
        made->setDelegate(delegate);
        EXPECT_TRUE(made->openWithError(nullptr));
        return made;
    }

    const std::shared_ptr<Delegate> delegate = std::make_shared<Delegate>();
};

TEST_F(MigrationTest, DelegateAnswersForTheUserVersion) {
    const auto made = database();
    made->setUserVersion(5);
    made->setDelegate(delegate);
    delegate->version = 9;
    EXPECT_EQ(made->userVersion(), 9);
    made->setDelegate(nullptr);
    EXPECT_EQ(made->userVersion(), 5);
}

TEST_F(MigrationTest, NewAndCurrentFilesAreNotMigrated) {
    delegate->version = 4;
    EXPECT_FALSE(openMigrating(kSchema)->hasMigrated());
    EXPECT_FALSE(openMigrating(kSchema)->hasMigrated());
    EXPECT_EQ(delegate->calls, std::vector<std::int32_t>());
    EXPECT_EQ(fileVersion(), "4");
}

TEST_F(MigrationTest, MigratedDataStaysAndVersionsAreStored) {
    leaveFile(2);
    delegate->version = 3;
    delegate->migrate = [](KSTDSQLite& migrated) {
        EXPECT_TRUE(migrated.executeSQL("alter table T add column c"));
        migrated.update("T", "c = ?", std::nullopt, {"added"}, std::nullopt);
        return true;
    };
    const auto opened = openMigrating("create table T (a, b, c);");
    EXPECT_TRUE(opened->hasMigrated());
    EXPECT_EQ(delegate->calls, std::vector<std::int32_t>{2});
    EXPECT_EQ(OtherConnection(path).rows("select a, c from T"), Texts{"kept|added"});
    EXPECT_EQ(property("SchemaVersion"), opened->schemaVersion());
    EXPECT_EQ(property("Created"), kStart);
    EXPECT_EQ(fileVersion(), "3");
    EXPECT_EQ(lines(), Texts());
}

TEST_F(MigrationTest, UserVersionAloneMigratesToo) {
    leaveFile(2);
    delegate->version = 3;
    EXPECT_TRUE(openMigrating(kSchema)->hasMigrated());
    EXPECT_EQ(rowsOfT(), Texts{"kept"});
    EXPECT_EQ(fileVersion(), "3");
}

TEST_F(MigrationTest, RefusedMigrationRebuilds) {
    leaveFile(2);
    delegate->version = 3;
    delegate->migrate = [](KSTDSQLite&) {
        return false;
    };
    EXPECT_TRUE(openMigrating(kOtherSchema)->hasMigrated());
    EXPECT_EQ(rowsOfT(), Texts());
    EXPECT_EQ(property("Created"), kLater);
    EXPECT_EQ(fileVersion(), "3");
}

/// The first question for the time after a migration comes from the vacuum, behind its transaction.
class CrashingClock final : public platform::Clock {
  public:
    [[nodiscard]] platform::Date now() override { ::_exit(17); }
};

TEST_F(MigrationTest, CrashAfterTheMigrationCallsTheDelegateAgain) {
    leaveFile();
    const auto crash = [this] {
        CrashingClock crashing;
        KSTDSQLite made(path, kOtherSchema, {log, crashing, propertyLists});
        made.setDelegate(delegate);
        delegate->migrate = [](KSTDSQLite& migrated) {
            return migrated.executeSQL("insert into T values ('migrated', 1)");
        };
        return made.openWithError(nullptr) ? 1 : 2;
    };
    ASSERT_EQ(support::exitStatusOfChild(crash), 17);
    EXPECT_EQ(rowsOfT(), (Texts{"kept", "migrated"}));

    const auto opened = openMigrating(kOtherSchema);
    EXPECT_EQ(delegate->calls, std::vector<std::int32_t>{0});
    EXPECT_EQ(rowsOfT(), (Texts{"kept", "migrated"}));
    EXPECT_EQ(property("SchemaVersion"), opened->schemaVersion());
}

TEST_F(MigrationTest, ObjectThatHasMigratedNeverRebuilds) {
    leaveFile();
    const auto opened = openDatabase(kOtherSchema);
    opened->insertOrReplaceInto("T", {{"a", "new"}});
    opened->close();
    ASSERT_EQ(OtherConnection(path).run(
                  "update Properties set value = 'older' where key = 'SchemaVersion'"),
              SQLITE_OK);
    delegate->migrate = [](KSTDSQLite&) {
        return false;
    };
    opened->setDelegate(delegate);
    ASSERT_TRUE(opened->openWithError(nullptr));
    EXPECT_TRUE(opened->hasMigrated());
    EXPECT_EQ(delegate->calls.size(), 1U);
    EXPECT_EQ(rowsOfT(), Texts{"new"});
    EXPECT_EQ(property("SchemaVersion"), opened->schemaVersion());
}

TEST_F(MigrationTest, FailedVacuumCountsAsOne) {
    leaveFile();
    ASSERT_EQ(OtherConnection(path).run("delete from Properties where key = 'LastVacuum'"),
              SQLITE_OK);
    std::shared_ptr<KSTDSQLiteStatement> unfinished;
    delegate->migrate = [&unfinished](KSTDSQLite& migrated) {
        unfinished = migrated.statementForSQL("select * from T");
        return unfinished->step();
    };
    const auto opened = openMigrating(kOtherSchema);
    EXPECT_EQ(lines(), Texts{"KSTDSQLite: Error executing SQL: \"VACUUM\" (1)"});
    EXPECT_EQ(property("LastVacuum"), kLater);
    unfinished->reset();
}

} // namespace
} // namespace kstd
