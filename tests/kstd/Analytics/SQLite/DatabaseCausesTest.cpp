// The causes of failures, which are told as warnings.

#include "kstd/Analytics/SQLite/DatabaseEnvironment.h"
#include "tests/kstd/Analytics/SQLite/DatabaseFixture.h"

#include <sqlite3.h>

namespace kstd {
namespace {

class DatabaseCausesTest : public DatabaseFixture {
  protected:
    DatabaseCausesTest() { environment.warnsOfCauses = true; }

    /// The warnings since the last call. All else is at the default level.
    Texts warnings() {
        Texts texts;
        for (const platform::FakeSystemLog::Line& line : log.lines()) {
            if (line.level == platform::LogLevel::warning) {
                texts.push_back(line.text);
            } else {
                EXPECT_EQ(line.level, platform::LogLevel::notice) << line.text;
            }
        }
        log.clear();
        return texts;
    }

    [[nodiscard]] std::string told(const std::string& cause) const {
        return "kstd: Database: " + path + ": " + cause + ".";
    }

    static void insert(KSTDSQLite& database, const platform::Value& value) {
        database.insertOrReplaceInto("T", {{"a", value}});
    }

    /// No page more than the file has.
    static void fill(KSTDSQLite& database) {
        EXPECT_TRUE(database.executeSQL("pragma max_page_count = 1"));
    }
    static void empty(KSTDSQLite& database) {
        EXPECT_TRUE(database.executeSQL("pragma max_page_count = 100000"));
    }

    const platform::Value large{platform::Bytes(100000)};
};

TEST_F(DatabaseCausesTest, WhatCannotBeOpenedIsToldOnceWithTheSystemsReason) {
    ASSERT_TRUE(std::filesystem::create_directory(path));
    const auto made = database();
    EXPECT_FALSE(made->openWithError(nullptr));
    EXPECT_EQ(warnings(), Texts{told("unable to open database file (14), Is a directory")});
    EXPECT_FALSE(made->openWithError(nullptr));
    EXPECT_EQ(warnings(), Texts());
}

TEST_F(DatabaseCausesTest, WhatPassesIsToldAgainAfterARowWasWritten) {
    const std::pair<int, bool> kCodes[] = {
        {SQLITE_BUSY, true},        {SQLITE_LOCKED, true}, {SQLITE_NOMEM, true},
        {SQLITE_READONLY, true},    {SQLITE_IOERR, true},  {SQLITE_FULL, true},
        {SQLITE_CANTOPEN, true},    {SQLITE_ERROR, false}, {SQLITE_CORRUPT, false},
        {SQLITE_CONSTRAINT, false}, {SQLITE_NOTADB, false}};
    for (const auto& [code, passes] : kCodes) {
        // An extended code is told by its own number and is of its primary code's kind.
        for (const int told : {code, code | (1 << 8)}) {
            SCOPED_TRACE(told);
            DatabaseCauses causes(&log, path);
            causes.tell(told, nullptr);
            causes.tell(told, nullptr);
            EXPECT_EQ(warnings().size(), 1U);
            causes.wrote();
            causes.tell(told, nullptr);
            EXPECT_EQ(warnings().size(), passes ? 1U : 0U);
        }
    }
}

TEST_F(DatabaseCausesTest, SystemsReasonIsToldOnlyWhereItBelongsToTheFailure) {
    sqlite3* db = nullptr;
    ASSERT_EQ(sqlite3_open_v2(directory.path().c_str(), &db, SQLITE_OPEN_READWRITE, nullptr),
              SQLITE_CANTOPEN);
    const std::pair<int, std::string> kCodes[] = {
        {SQLITE_IOERR, "disk I/O error (10), Is a directory"},
        {SQLITE_CANTOPEN, "unable to open database file (14), Is a directory"},
        {SQLITE_FULL, "database or disk is full (13)"},
        {SQLITE_ERROR, "SQL logic error (1)"}};
    for (const auto& [code, cause] : kCodes) {
        DatabaseCauses(&log, path).tell(code, db);
        EXPECT_EQ(warnings(), Texts{told(cause)});
    }
    sqlite3_close_v2(db);
    DatabaseCauses(&log, path).tell(SQLITE_IOERR, nullptr);
    EXPECT_EQ(warnings(), Texts{told("disk I/O error (10)")});
}

TEST_F(DatabaseCausesTest, DirectoryIsToldAgainAfterARowWasWritten) {
    DatabaseCauses causes(&log, path);
    for (int round = 0; round < 2; ++round) {
        causes.tellOfDirectory("there is no directory");
        causes.tellOfDirectory("there is no directory");
        EXPECT_EQ(warnings(), Texts{"kstd: Database: there is no directory."});
        causes.wrote();
    }
}

TEST_F(DatabaseCausesTest, TextThatCannotBePreparedIsToldWithItsCause) {
    const auto opened = openDatabase();
    EXPECT_EQ(opened->statementForSQL("nonsense"), nullptr);
    ASSERT_EQ(log.lines().size(), 2U);
    EXPECT_EQ(log.lines()[0].text, "Error preparing statement: nonsense");
    EXPECT_EQ(log.lines()[1].text, told("SQL logic error (1)"));
}

TEST_F(DatabaseCausesTest, OthersLocksAreAwaitedFiveMinutes) {
    const DatabaseEnvironment usual{
        .log = log, .clock = environment.clock, .propertyLists = environment.propertyLists};
    EXPECT_EQ(usual.busyTimeout, std::chrono::minutes(5));
}

TEST_F(DatabaseCausesTest, DirectoryThatCannotBeMadeIsTold) {
    write(directory.file("file"), "");
    KSTDSQLite made(directory.file("file/sub/x.db"), kSchema, environment);
    const Texts expected{"kstd: Database: Cannot make the directory " + directory.file("file/sub") +
                         ": Not a directory."};
    made.open();
    EXPECT_EQ(warnings(), expected);
    made.open();
    EXPECT_EQ(warnings(), Texts());
}

TEST_F(DatabaseCausesTest, FullDatabaseIsToldOnceUntilARowWasWritten) {
    const auto opened = openDatabase();
    EXPECT_EQ(warnings(), Texts());
    for (int round = 0; round < 2; ++round) {
        fill(*opened);
        insert(*opened, large);
        insert(*opened, large);
        EXPECT_EQ(warnings(), Texts{told("database or disk is full (13)")}) << round;
        empty(*opened);
        insert(*opened, large);
        EXPECT_EQ(warnings(), Texts());
    }
}

TEST_F(DatabaseCausesTest, ReadingARowEndsNoCause) {
    const auto opened = openDatabase();
    fill(*opened);
    insert(*opened, large);
    EXPECT_EQ(warnings().size(), 1U);
    EXPECT_EQ(opened->selectCountFrom("T", std::nullopt, {}), 0U);
    insert(*opened, large);
    EXPECT_EQ(warnings(), Texts());
}

TEST_F(DatabaseCausesTest, WhatDoesNotPassIsToldOnceAlsoBetweenSuccesses) {
    const auto opened = openDatabase();
    for (int round = 0; round < 2; ++round) {
        EXPECT_FALSE(opened->executeSQL("nonsense"));
        EXPECT_EQ(warnings(), round == 0 ? Texts{told("SQL logic error (1)")} : Texts());
        EXPECT_EQ(opened->statementForSQL("nonsense"), nullptr);
        insert(*opened, platform::Value(std::int64_t{1}));
        EXPECT_EQ(warnings(), Texts());
    }
}

TEST_F(DatabaseCausesTest, TablesThatSQLiteKeepsAreNoCause) {
    const auto opened = openDatabase("create table T (id integer primary key autoincrement);\n");
    opened->dropAllTables();
    EXPECT_FALSE(log.lines().empty());
    EXPECT_EQ(warnings(), Texts());
    EXPECT_FALSE(opened->executeSQL("nonsense"));
    EXPECT_EQ(warnings(), Texts{told("SQL logic error (1)")});
}

TEST_F(DatabaseCausesTest, EveryCauseIsToldOfItsOwn) {
    const auto opened = openDatabase();
    fill(*opened);
    insert(*opened, large);
    EXPECT_FALSE(opened->executeSQL("nonsense"));
    EXPECT_EQ(warnings(),
              (Texts{told("database or disk is full (13)"), told("SQL logic error (1)")}));
}

TEST_F(DatabaseCausesTest, MistakesOfTheCallerHaveNoCause) {
    const auto made = database();
    EXPECT_FALSE(made->executeSQL("select 1"));
    EXPECT_TRUE(made->openWithError(nullptr));
    const auto statement = made->statementForSQL("select ?");
    EXPECT_TRUE(statement->step());
    statement->bindInt(1, 0);
    statement->reset();
    EXPECT_EQ(warnings(), Texts());
}

TEST_F(DatabaseCausesTest, NothingIsToldWhereThatIsNotWanted) {
    environment.warnsOfCauses = false;
    ASSERT_TRUE(std::filesystem::create_directory(path));
    database()->open();
    EXPECT_EQ(log.lines().size(), 1U);
    EXPECT_EQ(warnings(), Texts());
}

} // namespace
} // namespace kstd
