#include "kstctl/database/DatabaseConnection.h"

#include "base/Concat.h"
#include "base/FileDescriptor.h"
#include "base/Saturate.h"
#include "kstctl/ExitStatus.h"
#include "kstd/Analytics/SQLite/DatabaseFile.h"

#include <array>
#include <cerrno>
#include <fcntl.h>
#include <sqlite3.h>
#include <string_view>
#include <unistd.h>

namespace kstctl {

namespace {

/// Where a database's file says how it is written and read; 2 in both is WAL mode.
constexpr off_t kVersionOffset = 18;
constexpr unsigned char kLogVersion = 2;

bool isInLogMode(int descriptor) {
    std::array<unsigned char, 2> versions{};
    return ::pread(descriptor, versions.data(), versions.size(), kVersionOffset) ==
               static_cast<ssize_t>(versions.size()) &&
           versions[0] == kLogVersion && versions[1] == kLogVersion;
}

bool isSame(const timespec& one, const timespec& other) {
    return one.tv_sec == other.tv_sec && one.tv_nsec == other.tv_nsec;
}

} // namespace

platform::Result<DatabaseFiles> DatabaseFiles::look(const std::string& path) {
    // Closing this descriptor drops the locks that this process has on the file: there must be no
    // connection open. Not blocking, because opening a pipe would wait for its writer.
    const base::FileDescriptor file(
        ::open(path.c_str(), O_RDONLY | O_NONBLOCK | O_CLOEXEC | O_NOCTTY));
    DatabaseFiles files;
    if (!file.isOpen() || ::fstat(file.get(), &files.state) != 0) {
        return fileError(path, errno);
    }
    if (!S_ISREG(files.state.st_mode)) {
        return failure(ExitStatus::malformed, base::concat(path, " is not a regular file"));
    }
    files.usesLog = isInLogMode(file.get());
    struct stat beside {};
    files.hasLog = ::stat(base::concat(path, "-wal").c_str(), &beside) == 0;
    files.isLogFilled = files.hasLog && beside.st_size > 0;
    files.hasIndex = ::stat(base::concat(path, "-shm").c_str(), &beside) == 0;
    return files;
}

bool DatabaseFiles::isSameAs(const DatabaseFiles& earlier) const {
    if (usesLog != earlier.usesLog || hasLog != earlier.hasLog || hasIndex != earlier.hasIndex ||
        state.st_dev != earlier.state.st_dev || state.st_ino != earlier.state.st_ino) {
        return false;
    }
    return !earlier.isAtRest() || (isAtRest() && state.st_size == earlier.state.st_size &&
                                   isSame(state.st_mtim, earlier.state.st_mtim) &&
                                   isSame(state.st_ctim, earlier.state.st_ctim));
}

namespace {

constexpr char kName[] = "kstctl-read-only";

sqlite3_vfs* systemFiles = nullptr;

/// Without this a connection that may only read a database would still make the log beside it.
int openToRead(sqlite3_vfs* /*files*/, const char* path, sqlite3_file* file, int flags,
               int* outFlags) {
    constexpr int kWriting = SQLITE_OPEN_READWRITE | SQLITE_OPEN_CREATE | SQLITE_OPEN_DELETEONCLOSE;
    const int reading = (flags & ~kWriting) | SQLITE_OPEN_READONLY;
    return systemFiles->xOpen(systemFiles, path, file, reading, outFlags);
}

int refuseToDelete(sqlite3_vfs* /*files*/, const char* /*path*/, int /*syncDirectory*/) {
    return SQLITE_IOERR_DELETE;
}

/// Registers with SQLite, once in the process, a way to its files that only reads: whatever SQLite
/// does through it, no file is made, changed or deleted. A file that is not there cannot be opened.
///
/// Returns the name that connections are opened with, or null when SQLite has no files at all.
const char* registerReadOnlyFiles() {
    static sqlite3_vfs files = [] {
        systemFiles = sqlite3_vfs_find(kstd::registerDatabaseFiles());
        sqlite3_vfs copy = systemFiles != nullptr ? *systemFiles : sqlite3_vfs{};
        copy.pNext = nullptr;
        copy.zName = kName;
        copy.xOpen = openToRead;
        copy.xDelete = refuseToDelete;
        return copy;
    }();
    static const bool isRegistered =
        systemFiles != nullptr && sqlite3_vfs_register(&files, 0) == SQLITE_OK;
    return isRegistered ? kName : nullptr;
}

/// The path as a link that SQLite takes; only what is plain stands for itself.
std::string link(std::string_view path, DatabaseConnection::Log log) {
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
    if (log != DatabaseConnection::Log::written) {
        // Without it the index beside the log would be made and written.
        text += "?readonly_shm=1";
    }
    return text + (log == DatabaseConnection::Log::ignored ? "&immutable=1" : "");
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

DatabaseConnection::DatabaseConnection(const std::string& path, Log log,
                                       std::chrono::milliseconds patience) {
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

int DatabaseConnection::execute(const char* SQL) const {
    return sqlite3_exec(get(), SQL, nullptr, nullptr, nullptr);
}

std::string DatabaseConnection::message(int code) const {
    // What was finalized since may have succeeded.
    return sqlite3_extended_errcode(get()) == code ? sqlite3_errmsg(get()) : sqlite3_errstr(code);
}

platform::Error databaseError(const std::string& path, const DatabaseConnection& connection,
                              int code) {
    switch (code) {
    case SQLITE_NOTFOUND:
        return failure(ExitStatus::missing, base::concat(path, ": nothing is stored in it yet"));
    case SQLITE_EMPTY:
        return failure(ExitStatus::malformed,
                       base::concat(path, ": not a database of kstd's events"));
    default:
        return failure(statusOfCode(code),
                       base::concat(path, ": ", connection.message(code), " (", code, ')'));
    }
}

int checkTables(DatabaseConnection& connection) {
    constexpr int kTableCount = 2;
    Query tables(connection, "select count(*), count(*) filter (where type = 'table' and name in "
                             "('all_events', 'Properties')) from sqlite_master");
    if (!tables.step()) {
        return tables.code();
    }
    if (sqlite3_column_int(tables.row(), 0) == 0) {
        return SQLITE_NOTFOUND;
    }
    return sqlite3_column_int(tables.row(), 1) == kTableCount ? SQLITE_OK : SQLITE_EMPTY;
}

Query::Query(DatabaseConnection& connection, const char* SQL) {
    sqlite3_stmt* statement = nullptr;
    code_ = sqlite3_prepare_v2(connection.get(), SQL, -1, &statement, nullptr);
    statement_.reset(statement);
}

Query::Query(DatabaseConnection& connection, const char* SQL, std::int64_t bound)
    : Query(connection, SQL) {
    if (code_ == SQLITE_OK) {
        code_ = sqlite3_bind_int64(row(), 1, bound);
    }
}

Query::Query(DatabaseConnection& connection, const char* SQL, const std::string& bound)
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
