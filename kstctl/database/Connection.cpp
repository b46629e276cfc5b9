#include "kstctl/database/Connection.h"

#include "base/Concat.h"
#include "base/Saturate.h"
#include "kstctl/database/ReadOnlyFiles.h"
#include "kstd/Analytics/SQLite/DatabaseFile.h"

#include <string_view>

namespace kstctl {

namespace {

/// The path as a link that SQLite takes; only what is plain stands for itself.
std::string link(std::string_view path, Connection::Log log) {
    constexpr std::string_view kUnescaped =
        "abcdefghijklmnopqrstuvwxyzABCDEFGHIJKLMNOPQRSTUVWXYZ0123456789/._-";
    constexpr char kDigits[] = "0123456789abcdef";
    std::string text = "file:";
    for (const char character : path) {
        if (kUnescaped.find(character) != std::string_view::npos) {
            text += character;
        } else {
            const auto byte = static_cast<unsigned char>(character);
            text += base::concat('%', kDigits[byte >> 4U], kDigits[byte & 0xfU]);
        }
    }
    if (log != Connection::Log::written) {
        // Without it the index beside the log would be made and written.
        text += "?readonly_shm=1";
    }
    return text + (log == Connection::Log::ignored ? "&immutable=1" : "");
}

ExitStatus statusOfCode(int code) {
    constexpr int kPrimaryCodeMask = 0xff;
    switch (code & kPrimaryCodeMask) {
    case SQLITE_NOTADB:
    case SQLITE_CORRUPT:
    case SQLITE_FORMAT:
    case SQLITE_ERROR: // Of texts that are always the same: the tables are others.
        return ExitStatus::malformed;
    case SQLITE_PERM:
    case SQLITE_AUTH:
        return ExitStatus::unreadable;
    default:
        return ExitStatus::failed;
    }
}

} // namespace

Connection::Connection(const std::string& path, Log log, std::chrono::milliseconds patience) {
    const bool isWritten = log == Log::written;
    const char* const files = isWritten ? kstd::registerDatabaseFiles() : registerReadOnlyFiles();
    if (files == nullptr) {
        return;
    }
    sqlite3* db = nullptr;
    const int access = isWritten ? SQLITE_OPEN_READWRITE : SQLITE_OPEN_READONLY;
    code_ = sqlite3_open_v2(link(path, log).c_str(), &db, access | SQLITE_OPEN_URI, files);
    db_.reset(db);
    if (code_ == SQLITE_OK) {
        sqlite3_extended_result_codes(db, 1);
        // Whoever made the file decides what is in its schema.
        sqlite3_db_config(db, SQLITE_DBCONFIG_DEFENSIVE, 1, nullptr);
        sqlite3_db_config(db, SQLITE_DBCONFIG_TRUSTED_SCHEMA, 0, nullptr);
        code_ = sqlite3_busy_timeout(db, base::saturate<int>(patience.count()));
    }
}

int Connection::execute(const char* SQL) const {
    return sqlite3_exec(get(), SQL, nullptr, nullptr, nullptr);
}

std::string Connection::message(int code) const {
    // What was finalized since may have succeeded.
    return sqlite3_extended_errcode(get()) == code ? sqlite3_errmsg(get()) : sqlite3_errstr(code);
}

platform::Error databaseError(const std::string& path, const Connection& connection, int code) {
    return code == SQLITE_EMPTY
               ? failure(ExitStatus::malformed,
                         base::concat(path, ": not a database of kstd's events"))
               : failure(statusOfCode(code),
                         base::concat(path, ": ", connection.message(code), " (", code, ')'));
}

Query::Query(Connection& connection, const char* SQL) {
    sqlite3_stmt* statement = nullptr;
    code_ = sqlite3_prepare_v2(connection.get(), SQL, -1, &statement, nullptr);
    statement_.reset(statement);
}

Query::Query(Connection& connection, const char* SQL, std::int64_t bound) : Query(connection, SQL) {
    if (code_ == SQLITE_OK) {
        code_ = sqlite3_bind_int64(row(), 1, bound);
    }
}

Query::Query(Connection& connection, const char* SQL, const std::string& bound)
    : Query(connection, SQL) {
    if (code_ == SQLITE_OK) {
        code_ = sqlite3_bind_text64(row(), 1, bound.data(), bound.size(), SQLITE_TRANSIENT,
                                    SQLITE_UTF8);
    }
}

bool Query::step() {
    if (code_ == SQLITE_OK || code_ == SQLITE_ROW) {
        code_ = sqlite3_step(row());
    }
    return code_ == SQLITE_ROW;
}

} // namespace kstctl
