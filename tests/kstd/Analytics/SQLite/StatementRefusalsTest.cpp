// What SQLite does not do by itself: the calls below are wrapped by the linker.

#include "tests/kstd/Analytics/SQLite/StatementFixture.h"

#include <utility>

namespace {

/// What the next call answers, when it is not 0.
struct Answers {
    int clearBindings = 0;
    int finalize = 0;
    int columnType = 0;
};

Answers answers;

} // namespace

// The names are the linker's: it resolves a call of x to __wrap_x, and __real_x to x.
// NOLINTBEGIN(bugprone-reserved-identifier)
extern "C" {

int __real_sqlite3_clear_bindings(sqlite3_stmt* handle);
int __real_sqlite3_finalize(sqlite3_stmt* handle);
int __real_sqlite3_column_type(sqlite3_stmt* handle, int index);

int __wrap_sqlite3_clear_bindings(sqlite3_stmt* handle) {
    const int answer = std::exchange(answers.clearBindings, 0);
    return answer != 0 ? answer : __real_sqlite3_clear_bindings(handle);
}

/// Frees the handle whatever the answer, as SQLite does.
int __wrap_sqlite3_finalize(sqlite3_stmt* handle) {
    const int code = __real_sqlite3_finalize(handle);
    const int answer = std::exchange(answers.finalize, 0);
    return answer != 0 ? answer : code;
}

int __wrap_sqlite3_column_type(sqlite3_stmt* handle, int index) {
    const int answer = std::exchange(answers.columnType, 0);
    return answer != 0 ? answer : __real_sqlite3_column_type(handle, index);
}
}
// NOLINTEND(bugprone-reserved-identifier)

namespace kstd {
namespace {

class StatementRefusalsTest : public StatementFixture {};

TEST_F(StatementRefusalsTest, BindingsThatAreNotClearedLeaveItUnreset) {
    KSTDSQLiteStatement rows = statement("select ?");
    rows.bindValue("x", 0);
    ASSERT_TRUE(rows.step());
    answers.clearBindings = SQLITE_NOMEM;
    rows.reset();
    expectLines({"KSTDSQLite: Error clearing prepared statement bindings: \"select ?\""});
    EXPECT_FALSE(rows.isReset());
    EXPECT_EQ(rows.temporaryBoundObjects().size(), 1U);
    rows.reset();
    EXPECT_TRUE(rows.isReset());
    expectLines({});
}

TEST_F(StatementRefusalsTest, BindingsThatAreNotClearedAfterAStepErrorAreIgnored) {
    KSTDSQLiteStatement rows = statement("select abs(-9223372036854775808)");
    answers.clearBindings = SQLITE_NOMEM;
    EXPECT_FALSE(rows.step());
    expectLines({"KSTDSQLite: Failed to step (1): \"select abs(-9223372036854775808)\""});
    EXPECT_TRUE(rows.isReset());
}

TEST_F(StatementRefusalsTest, AFailedFinalizingIsLogged) {
    KSTDSQLiteStatement rows = statement("select 1");
    answers.finalize = SQLITE_IOERR_WRITE;
    rows.finalizeStatement();
    expectLines({"KSTDSQLite: Error finalizing prepared statement: \"select 1\""});
    EXPECT_EQ(rows.handle(), nullptr);
}

TEST_F(StatementRefusalsTest, AnUnexpectedColumnTypeIsNull) {
    KSTDSQLiteStatement rows = statement("select 1");
    ASSERT_TRUE(rows.step());
    for (const int type : {6, -1}) {
        answers.columnType = type;
        EXPECT_EQ(rows.objectAtIndex(0), platform::Value());
        expectLines({"KSTDSQLite: Unexpected column type: " + std::to_string(type)});
    }
    EXPECT_EQ(rows.objectAtIndex(0), platform::Value(std::int64_t{1}));
}

} // namespace
} // namespace kstd
