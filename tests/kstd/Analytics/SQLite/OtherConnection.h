#pragma once

#include "base/NotCopied.h"

#include <gtest/gtest.h>

#include <sqlite3.h>
#include <string>
#include <vector>

namespace kstd {

/// Looks at a database file, and works on it, without the code under test.
class OtherConnection : private base::NotCopied {
  public:
    explicit OtherConnection(const std::string& path) {
        EXPECT_EQ(sqlite3_open_v2(path.c_str(), &db_, SQLITE_OPEN_READWRITE | SQLITE_OPEN_CREATE,
                                  nullptr),
                  SQLITE_OK);
    }
    ~OtherConnection() { EXPECT_EQ(sqlite3_close(db_), SQLITE_OK); }

    /// The result code.
    int run(const std::string& SQL) {
        return sqlite3_exec(db_, SQL.c_str(), nullptr, nullptr, nullptr);
    }

    /// Each row as its columns with a bar between them.
    [[nodiscard]] std::vector<std::string> rows(const std::string& SQL) {
        std::vector<std::string> rows;
        EXPECT_EQ(sqlite3_exec(db_, SQL.c_str(), appendRow, &rows, nullptr), SQLITE_OK)
            << SQL << ": " << sqlite3_errmsg(db_);
        return rows;
    }

    /// The only column of the only row.
    [[nodiscard]] std::string one(const std::string& SQL) {
        const std::vector<std::string> found = rows(SQL);
        EXPECT_EQ(found.size(), 1U) << SQL;
        return found.empty() ? std::string() : found.front();
    }

    [[nodiscard]] std::string property(const std::string& key) {
        return one("select value from Properties where key = '" + key + "'");
    }

  private:
    static int appendRow(void* rows, int count, char** columns, char** /*names*/) {
        std::string row;
        for (int i = 0; i < count; ++i) {
            row += i == 0 ? "" : "|";
            row += columns[i] == nullptr ? "NULL" : columns[i];
        }
        static_cast<std::vector<std::string>*>(rows)->push_back(row);
        return 0;
    }

    sqlite3* db_ = nullptr;
};

} // namespace kstd
