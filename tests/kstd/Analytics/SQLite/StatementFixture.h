#pragma once

#include "kstd/Analytics/SQLite/DatabaseEnvironment.h"
#include "kstd/Analytics/SQLite/KSTDSQLiteStatement.h"
#include "platform/fake/FakeClock.h"
#include "platform/fake/FakeFormats.h"
#include "platform/fake/FakeSystemLog.h"
#include "tests/support/TemporaryDirectory.h"

#include <gtest/gtest.h>

#include <sqlite3.h>
#include <string>
#include <vector>

namespace kstd {

/// A database file with an empty table t (a, b) and statements on it, without the class of the
/// database.
class StatementFixture : public testing::Test {
  protected:
    static constexpr char kInsertA[] = "insert into t (a) values (?)";

    StatementFixture() {
        EXPECT_EQ(sqlite3_open(directory.file("statements.db").c_str(), &db), SQLITE_OK);
        EXPECT_EQ(sqlite3_extended_result_codes(db, 1), SQLITE_OK);
        execute("pragma synchronous = off; pragma journal_mode = memory; create table t (a, b)");
    }
    /// Fails when a statement was left behind.
    ~StatementFixture() override { EXPECT_EQ(sqlite3_close(db), SQLITE_OK); }

    void execute(const std::string& SQL) {
        EXPECT_EQ(sqlite3_exec(db, SQL.c_str(), nullptr, nullptr, nullptr), SQLITE_OK);
    }

    /// The rows' columns with a bar between them.
    std::vector<std::string> query(const std::string& SQL) {
        std::vector<std::string> rows;
        const auto append = [](void* captured, int count, char** texts, char** /*names*/) {
            std::string row;
            for (int i = 0; i < count; ++i) {
                row += i == 0 ? "" : "|";
                row += texts[i] == nullptr ? "null" : texts[i];
            }
            static_cast<std::vector<std::string>*>(captured)->push_back(row);
            return 0;
        };
        EXPECT_EQ(sqlite3_exec(db, SQL.c_str(), append, &rows, nullptr), SQLITE_OK);
        return rows;
    }

    /// What column a holds, as type and SQL literal.
    std::vector<std::string> stored() {
        return query("select typeof(a), quote(a) from t order by rowid");
    }

    KSTDSQLiteStatement statement(const std::string& SQL) {
        sqlite3_stmt* handle = nullptr;
        EXPECT_EQ(sqlite3_prepare_v2(db, SQL.c_str(), -1, &handle, nullptr), SQLITE_OK);
        return {nullptr, environment, SQL, handle};
    }

    void expectLines(const std::vector<std::string>& texts) {
        EXPECT_EQ(log.texts(), texts);
        for (const platform::FakeSystemLog::Line& line : log.lines()) {
            EXPECT_EQ(line.level, platform::LogLevel::notice);
        }
        log.clear();
    }

    support::TemporaryDirectory directory;
    platform::FakeSystemLog log;
    platform::FakeClock clock;
    platform::FakePropertyLists propertyLists;
    DatabaseEnvironment environment{log, clock, propertyLists};
    sqlite3* db = nullptr;
};

} // namespace kstd
