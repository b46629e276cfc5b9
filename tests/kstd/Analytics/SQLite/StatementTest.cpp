#include "kstd/Analytics/SQLite/StatementRows.h"
#include "tests/kstd/Analytics/SQLite/StatementFixture.h"

#include <stdexcept>

namespace kstd {
namespace {

constexpr char kTwoRows[] = "select 1 union all select 2";

class StatementTest : public StatementFixture {};

TEST_F(StatementTest, ANewOneIsResetAndKnowsItsMaker) {
    auto* const maker = reinterpret_cast<KSTDSQLite*>(this);
    const KSTDSQLiteStatement made(maker, environment, "some text", nullptr);
    EXPECT_EQ(made.SQLite(), maker);
    EXPECT_EQ(made.SQL(), "some text");
    EXPECT_EQ(made.handle(), nullptr);
    EXPECT_TRUE(made.isReset());
    EXPECT_TRUE(made.temporaryBoundObjects().empty());
}

TEST_F(StatementTest, StepsThroughTheRowsToTheEnd) {
    KSTDSQLiteStatement rows = statement(kTwoRows);
    ASSERT_TRUE(rows.step());
    EXPECT_FALSE(rows.isReset());
    EXPECT_EQ(rows.intAtIndex(0), 1);
    ASSERT_TRUE(rows.step());
    EXPECT_EQ(rows.intAtIndex(0), 2);
    EXPECT_FALSE(rows.step());
    EXPECT_FALSE(rows.isReset());
    rows.reset();
    EXPECT_TRUE(rows.isReset());
    EXPECT_TRUE(rows.step());
    EXPECT_EQ(rows.intAtIndex(0), 1);
    expectLines({});
}

TEST_F(StatementTest, AStepAfterTheEndRunsItOnceMore) {
    KSTDSQLiteStatement insert = statement("insert into t (a) values (1)");
    EXPECT_FALSE(insert.step());
    EXPECT_FALSE(insert.step());
    EXPECT_EQ(stored().size(), 2U);
}

TEST_F(StatementTest, AFailedStepIsLoggedWithItsExtendedCodeAndResets) {
    execute("create unique index u on t (a)");
    execute("insert into t (a) values ('x')");
    KSTDSQLiteStatement insert = statement(kInsertA);
    insert.bindValue("x", 0);
    EXPECT_FALSE(insert.step());
    expectLines({"KSTDSQLite: Failed to step (2067): \"insert into t (a) values (?)\""});
    EXPECT_TRUE(insert.isReset());
    EXPECT_TRUE(insert.temporaryBoundObjects().empty());
    // The binding is gone.
    EXPECT_FALSE(insert.step());
    EXPECT_EQ(stored(), (std::vector<std::string>{"text|'x'", "null|NULL"}));
    expectLines({});
}

TEST_F(StatementTest, AFailureAfterRowsReadsAsTheirEnd) {
    KSTDSQLiteStatement rows =
        statement("select abs(column1) from (values (1), (-9223372036854775808))");
    EXPECT_TRUE(rows.step());
    EXPECT_FALSE(rows.step());
    expectLines({"KSTDSQLite: Failed to step (1): \"select abs(column1) from (values (1), "
                 "(-9223372036854775808))\""});
    EXPECT_TRUE(rows.isReset());
}

TEST_F(StatementTest, ADatabaseLockedByAnotherFailsTheStep) {
    sqlite3* other = nullptr;
    ASSERT_EQ(sqlite3_open(directory.file("statements.db").c_str(), &other), SQLITE_OK);
    ASSERT_EQ(sqlite3_exec(other, "begin exclusive", nullptr, nullptr, nullptr), SQLITE_OK);
    KSTDSQLiteStatement rows = statement("select a from t");
    EXPECT_FALSE(rows.step());
    expectLines({"KSTDSQLite: Failed to step (5): \"select a from t\""});
    EXPECT_EQ(sqlite3_close(other), SQLITE_OK);
    EXPECT_FALSE(rows.step());
    expectLines({});
}

TEST_F(StatementTest, ResetDropsWhatWasBound) {
    KSTDSQLiteStatement insert = statement(kInsertA);
    insert.bindValue("x", 0);
    EXPECT_FALSE(insert.step());
    EXPECT_EQ(insert.temporaryBoundObjects().size(), 1U);
    insert.reset();
    EXPECT_TRUE(insert.temporaryBoundObjects().empty());
    EXPECT_FALSE(insert.step());
    EXPECT_EQ(stored(), (std::vector<std::string>{"text|'x'", "null|NULL"}));
}

TEST_F(StatementTest, ResetOfAResetOneKeepsWhatWasBound) {
    KSTDSQLiteStatement insert = statement(kInsertA);
    insert.bindValue("x", 0);
    insert.reset();
    insert.resetAfterStepError();
    EXPECT_EQ(insert.temporaryBoundObjects().size(), 1U);
    EXPECT_FALSE(insert.step());
    EXPECT_EQ(stored(), (std::vector<std::string>{"text|'x'"}));
}

TEST_F(StatementTest, AFailedResetLeavesItUnreset) {
    execute("pragma foreign_keys = on; create table p (id integer primary key);"
            "create table c (id references p deferrable initially deferred)");
    const std::string SQL = "insert into c values (?) returning 'row'";
    KSTDSQLiteStatement insert = statement(SQL);
    insert.bindValue("x", 0);
    ASSERT_TRUE(insert.step());
    // The constraint is checked when the statement ends.
    insert.reset();
    expectLines({"KSTDSQLite: Error resetting prepared statement: \"" + SQL + "\""});
    EXPECT_FALSE(insert.isReset());
    EXPECT_EQ(insert.temporaryBoundObjects().size(), 1U);
    insert.reset();
    expectLines({});
    EXPECT_TRUE(insert.isReset());
    EXPECT_TRUE(insert.temporaryBoundObjects().empty());
}

TEST_F(StatementTest, ResetAfterAStepErrorDropsWhatWasBound) {
    KSTDSQLiteStatement rows = statement("select ? union all select 2");
    rows.bindValue("x", 0);
    ASSERT_TRUE(rows.step());
    rows.resetAfterStepError();
    EXPECT_TRUE(rows.isReset());
    EXPECT_TRUE(rows.temporaryBoundObjects().empty());
    ASSERT_TRUE(rows.step());
    EXPECT_EQ(rows.columnTypeAtIndex(0), SQLITE_NULL);
    expectLines({});
}

TEST_F(StatementTest, FinalizingFreesTheHandle) {
    KSTDSQLiteStatement rows = statement(kTwoRows);
    EXPECT_EQ(sqlite3_next_stmt(db, nullptr), rows.handle());
    rows.finalizeStatement();
    EXPECT_EQ(rows.handle(), nullptr);
    EXPECT_EQ(sqlite3_next_stmt(db, nullptr), nullptr);
    rows.finalizeStatement();
    expectLines({});
    EXPECT_FALSE(rows.step());
    expectLines({"KSTDSQLite: Failed to step (21): \"select 1 union all select 2\""});
}

TEST_F(StatementTest, FinalizingAnUnresetOneIsRefused) {
    KSTDSQLiteStatement rows = statement(kTwoRows);
    ASSERT_TRUE(rows.step());
    rows.finalizeStatement();
    expectLines(
        {"KSTDSQLite: Statement not reset after last use: \"select 1 union all select 2\""});
    EXPECT_NE(rows.handle(), nullptr);
    EXPECT_EQ(sqlite3_close(db), SQLITE_BUSY);
    // It stands where it stood.
    ASSERT_TRUE(rows.step());
    EXPECT_EQ(rows.intAtIndex(0), 2);
    rows.reset();
    rows.finalizeStatement();
    EXPECT_EQ(rows.handle(), nullptr);
    expectLines({});
}

TEST_F(StatementTest, DestructionFreesTheHandleInTheMiddleOfAUse) {
    {
        KSTDSQLiteStatement rows = statement("select ? union all select 2");
        rows.bindValue("x", 0);
        ASSERT_TRUE(rows.step());
    }
    EXPECT_EQ(sqlite3_next_stmt(db, nullptr), nullptr);
    expectLines({});
}

TEST_F(StatementTest, ATextWithoutAStatementHasNoHandle) {
    KSTDSQLiteStatement nothing = statement("");
    ASSERT_EQ(nothing.handle(), nullptr);
    EXPECT_FALSE(nothing.step());
    expectLines({"KSTDSQLite: Failed to step (21): \"\""});
    EXPECT_TRUE(nothing.isReset());
    nothing.bindInt(1, 0);
    nothing.bindNullAtIndex(0);
    expectLines(
        {"KSTDSQLite: Error binding int at 0: \"\"", "KSTDSQLite: sqlite3_bind_null error"});
    EXPECT_EQ(nothing.columnCount(), 0);
    EXPECT_EQ(nothing.columnNameAtIndex(0), "");
    EXPECT_EQ(nothing.objectAtIndex(0), platform::Value());
    EXPECT_TRUE(nothing.allObjects().empty());
    EXPECT_TRUE(nothing.allObjectsByColumnName().empty());
    nothing.reset();
    nothing.finalizeStatement();
    expectLines({});
}

TEST_F(StatementTest, AUseEndsWithAReset) {
    KSTDSQLiteStatement rows = statement(kTwoRows);
    {
        const StatementUse use(rows);
        ASSERT_TRUE(use->step());
        EXPECT_EQ(&*use, &rows);
        EXPECT_FALSE(rows.isReset());
    }
    EXPECT_TRUE(rows.isReset());
    expectLines({});
}

TEST_F(StatementTest, AUseEndsWithAResetWhenSomethingIsThrown) {
    KSTDSQLiteStatement rows = statement(kTwoRows);
    const auto visitThatThrows = [&rows] {
        const StatementUse use(rows);
        ASSERT_TRUE(use->step());
        throw std::runtime_error("visitor");
    };
    EXPECT_THROW(visitThatThrows(), std::runtime_error);
    EXPECT_TRUE(rows.isReset());
    expectLines({});
}

} // namespace
} // namespace kstd
