#include "kstctl/database/UploadDate.h"

#include "base/Concat.h"
#include "kstctl/ExitStatus.h"
#include "kstctl/database/Connection.h"
#include "kstctl/database/DatabaseFiles.h"
#include "kstd/Analytics/SQLite/DateFormatter.h"

namespace kstctl {

namespace {

constexpr char kStore[] = "insert or replace into Properties (key, value) values "
                          "('upload_date', ?)";

/// SQLITE_OK, SQLITE_EMPTY when it is another kind of database, or why it failed.
int store(Connection& connection, const std::string& date) {
    if (const int code = connection.execute("begin immediate"); code != SQLITE_OK) {
        return code;
    }
    Query tables(connection, kTablesQuery);
    if (!tables.step()) {
        return tables.code();
    }
    if (sqlite3_column_int(tables.row(), 0) != kTableCount) {
        return SQLITE_EMPTY;
    }
    Query storing(connection, kStore, date);
    static_cast<void>(storing.step());
    return storing.isDone() ? connection.execute("commit") : storing.code();
}

} // namespace

platform::Result<std::string> storeUploadDate(const std::string& path, platform::Timestamp date,
                                              std::chrono::milliseconds patience) {
    if (const auto looked = DatabaseFiles::look(path); !looked) {
        return looked.error();
    }
    const std::string text = kstd::DateFormatter().text(date);
    Connection connection(path, Connection::Log::written, patience);
    const int code = connection.code() == SQLITE_OK ? store(connection, text) : connection.code();
    return code == SQLITE_OK ? platform::Result<std::string>(text)
                             : databaseError(path, connection, code);
}

} // namespace kstctl
