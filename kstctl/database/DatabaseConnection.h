#pragma once

#include "kstctl/ExitStatus.h"
#include "platform/Result.h"

#include <chrono>
#include <memory>
#include <optional>
#include <sqlite3.h>
#include <string>
#include <sys/stat.h>

namespace kstctl {

/// What stands at the path of a database, and beside it.
struct DatabaseFiles {
    /// The database's file is in WAL mode.
    bool usesLog = false;
    bool hasLog = false;
    /// The log has something in it.
    bool isLogFilled = false;
    /// The index of the log is there.
    bool hasIndex = false;
    /// Changes with every write to the database's own file.
    struct stat state {};

    /// Nobody has the database open, and all of it is in its own file.
    [[nodiscard]] bool isAtRest() const {
        return usesLog && (!hasLog || (!isLogFilled && !hasIndex));
    }

    /// Whether all is as it was. For a database that was at rest that means that nothing was
    /// written between the two looks; of one in use it tells whether somebody came or went.
    [[nodiscard]] bool isSameAs(const DatabaseFiles& earlier) const;

    /// Fails with ExitStatus::missing, ::unreadable or ::malformed (not a regular file).
    [[nodiscard]] static platform::Result<DatabaseFiles> look(const std::string& path);
};

/// A connection that makes no database, and only reads unless it is told. Codes are SQLite's,
/// extended.
class DatabaseConnection {
  public:
    /// How the files beside the database are dealt with.
    enum class Log {
        /// As SQLite does, without making any. A log with no index beside it cannot be read.
        used,
        /// There is none, and nobody may write while the connection is open: nothing is locked.
        ignored,
        /// As SQLite does, by a connection that writes.
        written,
    };

    DatabaseConnection(const std::string& path, Log log, std::chrono::milliseconds patience);

    /// SQLITE_OK when the connection can be used.
    [[nodiscard]] int code() const { return code_; }

    [[nodiscard]] int execute(const char* SQL) const;

    /// SQLite's own words for a failure, as exact as they still are to be had.
    [[nodiscard]] std::string message(int code) const;

    [[nodiscard]] sqlite3* get() const { return db_.get(); }

  private:
    struct Closer {
        void operator()(sqlite3* db) const { sqlite3_close_v2(db); }
    };

    std::unique_ptr<sqlite3, Closer> db_;
    int code_ = SQLITE_CANTOPEN;
};

/// SQLITE_OK when the database has the tables of one of events, SQLITE_NOTFOUND when it has nothing
/// at all, as while the daemon makes it, SQLITE_EMPTY when it is another kind of database, or why
/// that cannot be read. Within a transaction of the caller's.
[[nodiscard]] int checkTables(DatabaseConnection& connection);

/// The error for a code that is a failure, those of checkTables among them.
[[nodiscard]] platform::Error databaseError(const std::string& path,
                                            const DatabaseConnection& connection, int code);

/// A statement that is run once. `code` is that of the last step, SQLITE_ROW while there is a row.
class Query {
  public:
    Query(DatabaseConnection& connection, const char* SQL);
    /// With an integer in the place of its question mark.
    Query(DatabaseConnection& connection, const char* SQL, std::int64_t bound);
    /// With a text there.
    Query(DatabaseConnection& connection, const char* SQL, const std::string& bound);

    /// Whether there is a row.
    [[nodiscard]] bool step();
    [[nodiscard]] int code() const { return code_; }
    /// Whether it ran to its end.
    [[nodiscard]] bool isDone() const { return code_ == SQLITE_DONE; }
    [[nodiscard]] sqlite3_stmt* row() const { return statement_.get(); }

  private:
    struct Finalizer {
        void operator()(sqlite3_stmt* statement) const { sqlite3_finalize(statement); }
    };

    std::unique_ptr<sqlite3_stmt, Finalizer> statement_;
    int code_ = SQLITE_ERROR;
};

} // namespace kstctl
