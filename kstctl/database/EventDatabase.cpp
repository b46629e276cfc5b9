#include "kstctl/database/EventDatabase.h"

#include "base/Concat.h"
#include "kstctl/ExitStatus.h"
#include "kstctl/Output.h"
#include "kstctl/database/DatabaseConnection.h"
#include "kstd/Analytics/SQLite/DateFormatter.h"

#include <poll.h>
#include <utility>

namespace kstctl {

namespace {

/// How often the daemon may start or end between two looks before reading is given up.
constexpr int kAttempts = 8;
constexpr int kMillisecondsBetweenLooks = 5;

constexpr int kPrimaryCodeMask = 0xff;

StoredEvent eventOf(sqlite3_stmt* row) {
    StoredEvent event{.id = sqlite3_column_int64(row, 0), .added = {}, .data = {}};
    if (const int type = sqlite3_column_type(row, 1);
        type == SQLITE_FLOAT || type == SQLITE_INTEGER) {
        event.added = sqlite3_column_double(row, 1);
    }
    if (sqlite3_column_type(row, 2) == SQLITE_BLOB) {
        const auto* const bytes = static_cast<const std::uint8_t*>(sqlite3_column_blob(row, 2));
        const auto size = static_cast<std::size_t>(sqlite3_column_bytes(row, 2));
        event.data.emplace();
        if (size > 0) {
            event.data->assign(bytes, bytes + size);
        }
    }
    return event;
}

/// Reads what is wanted through one connection. Each step gives SQLite's code when it fails.
class Reader {
  public:
    Reader(DatabaseConnection& connection, const EventQuery& query)
        : connection_(connection), query_(query) {}

    /// SQLITE_OK, or what databaseError knows.
    [[nodiscard]] int read(EventDatabase& database) {
        if (const int code = connection_.execute("begin"); code != SQLITE_OK) {
            return code;
        }
        int code = checkTables(connection_);
        code = code == SQLITE_OK ? readNumbers(database) : code;
        code = code == SQLITE_OK && query_.withEvents ? readEvents(database) : code;
        return code;
    }

  private:
    [[nodiscard]] int readNumbers(EventDatabase& database) {
        Query count(connection_, "select count(*) from all_events");
        if (!count.step()) {
            return count.code();
        }
        database.count = static_cast<std::uint64_t>(sqlite3_column_int64(count.row(), 0));
        Query date(connection_, "select value from Properties where key = 'upload_date'");
        if (date.step()) {
            const auto* const text = sqlite3_column_text(date.row(), 0);
            if (text != nullptr) {
                database.uploadDate = reinterpret_cast<const char*>(text);
            }
            return SQLITE_OK;
        }
        return date.isDone() ? SQLITE_OK : date.code();
    }

    [[nodiscard]] int readEvents(EventDatabase& database) {
        Query events =
            query_.id
                ? Query(connection_, "select id, timestamp, data from all_events where id = ?",
                        *query_.id)
                : Query(connection_, "select id, timestamp, data from all_events order by id");
        if (query_.progress != nullptr) {
            query_.progress->begin("reading events", query_.id ? 1 : database.count);
        }
        while (events.step()) {
            if (!database.events.add(eventOf(events.row()))) {
                return SQLITE_OK;
            }
            if (query_.progress != nullptr) {
                query_.progress->advance();
            }
        }
        return events.isDone() ? SQLITE_OK : events.code();
    }

    DatabaseConnection& connection_;
    const EventQuery& query_;
};

/// The connection is closed when this returns. `code` is SQLite's.
platform::Result<EventDatabase> readOnce(const std::string& path, DatabaseConnection::Log log,
                                         const EventQuery& query,
                                         std::chrono::milliseconds patience, int& code) {
    DatabaseConnection connection(path, log, patience);
    EventDatabase database;
    code = connection.code() == SQLITE_OK ? Reader(connection, query).read(database)
                                          : connection.code();
    if (database.events.problem()) {
        return *database.events.problem();
    }
    if (code == SQLITE_OK) {
        return database;
    }
    return databaseError(path, connection, code);
}

/// Whether the log or its index was there to be seen and was not there to be opened, as when one
/// writer ends; another one that begins makes them look as before.
bool haveVanished(int code, const DatabaseFiles& files) {
    const int primary = code & kPrimaryCodeMask;
    return !files.isAtRest() && (primary == SQLITE_CANTOPEN || primary == SQLITE_READONLY);
}

/// Whether what was read, or why it was not, may come from files that changed meanwhile.
bool isDoubtful(bool isRead, const std::string& path, const DatabaseFiles& before) {
    if (isRead && !before.isAtRest()) {
        return false;
    }
    const auto now = DatabaseFiles::look(path);
    return now && !now.value().isSameAs(before);
}

} // namespace

platform::Result<EventDatabase> readEventDatabase(const std::string& path, const EventQuery& query,
                                                  std::chrono::milliseconds patience) {
    platform::Error reason =
        failure(ExitStatus::failed, base::concat(path, ": changes faster than it can be read"));
    for (int i = 0; i < kAttempts; ++i) {
        const auto looked = DatabaseFiles::look(path);
        if (!looked) {
            return looked.error();
        }
        const DatabaseFiles& files = looked.value();
        if (files.isLogFilled && !files.hasIndex) {
            // A writer that ends leaves them like this for a moment.
            reason.description = base::concat(path, ": there is a log beside it, and no index of "
                                                    "that log; only who writes to it can read it");
            ::poll(nullptr, 0, kMillisecondsBetweenLooks);
            continue;
        }
        int code = SQLITE_OK;
        auto result = readOnce(path,
                               files.isAtRest() ? DatabaseConnection::Log::ignored
                                                : DatabaseConnection::Log::used,
                               query, patience, code);
        if (haveVanished(code, files)) {
            reason = result.error();
            ::poll(nullptr, 0, kMillisecondsBetweenLooks);
            continue;
        }
        if (!isDoubtful(static_cast<bool>(result), path, files)) {
            return result;
        }
    }
    return reason;
}

namespace {

constexpr char kStore[] = "insert or replace into Properties (key, value) values "
                          "('upload_date', ?)";

/// SQLITE_OK, or what databaseError knows.
int store(DatabaseConnection& connection, const std::string& date) {
    if (const int code = connection.execute("begin immediate"); code != SQLITE_OK) {
        return code;
    }
    if (const int code = checkTables(connection); code != SQLITE_OK) {
        return code;
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
    DatabaseConnection connection(path, DatabaseConnection::Log::written, patience);
    const int code = connection.code() == SQLITE_OK ? store(connection, text) : connection.code();
    return code == SQLITE_OK ? platform::Result<std::string>(text)
                             : databaseError(path, connection, code);
}

} // namespace kstctl
