#include "kstctl/database/Connection.h"

#include "base/Concat.h"
#include "base/Saturate.h"
#include "kstctl/database/ReadOnlyFiles.h"

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
    // Without the first the index beside the log would be made and written.
    text += "?readonly_shm=1";
    return text + (log == Connection::Log::ignored ? "&immutable=1" : "");
}

} // namespace

Connection::Connection(const std::string& path, Log log, std::chrono::milliseconds patience) {
    const char* const files = registerReadOnlyFiles();
    if (files == nullptr) {
        return;
    }
    sqlite3* db = nullptr;
    code_ = sqlite3_open_v2(link(path, log).c_str(), &db, SQLITE_OPEN_READONLY | SQLITE_OPEN_URI,
                            files);
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

std::string Connection::message() const {
    return sqlite3_errmsg(get());
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

bool Query::step() {
    if (code_ == SQLITE_OK || code_ == SQLITE_ROW) {
        code_ = sqlite3_step(row());
    }
    return code_ == SQLITE_ROW;
}

} // namespace kstctl
