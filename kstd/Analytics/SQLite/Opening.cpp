#include "base/Concat.h"
#include "base/Saturate.h"
#include "common/AssertLine.h"
#include "kstd/Analytics/SQLite/DatabaseFile.h"
#include "kstd/Analytics/SQLite/KSTDSQLite.h"
#include "kstd/Analytics/SQLite/NumberText.h"
#include "kstd/LogLines.h"

#include <sqlite3.h>
#include <utility>

namespace kstd {
namespace {

constexpr char kSchemaVersionKey[] = "SchemaVersion";
constexpr char kCreatedKey[] = "Created";
constexpr char kLastVacuumKey[] = "LastVacuum";
constexpr double kSecondsBetweenVacuums = 604'800;

std::string_view synchronousModeName(std::int64_t mode, platform::SystemLog& log) {
    switch (mode) {
    case 0:
        return "off";
    case 1:
        return "normal";
    case 2:
        return "full";
    default:
        kst::stop({&log, kTag, "kstd/Analytics/SQLite/KSTDSQLite"}, "Unknown synchronous mode");
    }
}

int asMilliseconds(std::chrono::milliseconds duration) {
    return base::saturate<int>(duration.count());
}

} // namespace

bool KSTDSQLite::openWithError(platform::Error* error) {
    if (openCount_ > 0) {
        ++openCount_;
        return true;
    }
    platform::Error reason{platform::kGenericErrorDomain, 0,
                           base::concat("Error opening db at ", path_, ", ")};
    if (!openConnection(reason) || !configureConnection()) {
        return failToOpen(reason, error);
    }
    begin();
    Tables tables = makeTablesCurrent();
    if (tables != Tables::failed) {
        end();
        if (tables == Tables::made && hasStorageFailed()) {
            tables = Tables::failed;
        }
    }
    if (tables == Tables::failed) {
        return failToOpen(reason, error);
    }
    if (shouldVacuum_) {
        periodicVacuum();
    }
    if (tables != Tables::kept || hasMigrated_) {
        storeVersions();
    }
    ++openCount_;
    return true;
}

bool KSTDSQLite::failToOpen(platform::Error& reason, platform::Error* error) {
    if (db_ != nullptr && sqlite3_get_autocommit(db_) == 0) {
        rollback();
    }
    // They belong to this connection; the next one has its own.
    removeAllStatements();
    sqlite3_close_v2(std::exchange(db_, nullptr));
    if (error != nullptr) {
        *error = std::move(reason);
    }
    return false;
}

void KSTDSQLite::open() {
    platform::Error error;
    if (!openWithError(&error)) {
        logFailure(
            base::concat("KSTDSQLite: Error opening db at ", path_, ": ", error.description));
    }
}

/// Sets `reason` when it knows better than the caller.
bool KSTDSQLite::openConnection(platform::Error& reason) {
    if (auto failure = makeParentDirectories(path_)) {
        reason = *std::move(failure);
        causes_.tellOfDirectory(reason.description);
        return false;
    }
    createDatabaseFile(path_);
    const int code = sqlite3_open_v2(
        path_.c_str(), &db_, SQLITE_OPEN_READWRITE | SQLITE_OPEN_CREATE, registerDatabaseFiles());
    if (code != SQLITE_OK) {
        reason.description = base::concat("Error opening db at ", path_, ", rc=", code, "(0x",
                                          base::Hex{static_cast<std::uint32_t>(code)}, ")");
        causes_.tell(code, db_);
        return false;
    }
    return true;
}

bool KSTDSQLite::configureConnection() {
    sqlite3_extended_result_codes(db_, 1);
    return sqlite3_busy_timeout(db_, asMilliseconds(environment_.busyTimeout)) == SQLITE_OK &&
           executeSQL("pragma journal_mode = WAL") &&
           executeSQL("pragma synchronous = %@",
                      synchronousModeName(synchronousMode_, environment_.log)) &&
           executeSQL("pragma auto_vacuum = FULL");
}

KSTDSQLite::Tables KSTDSQLite::makeTablesCurrent() {
    if (select({"name"}, "sqlite_master", "type = ? AND name = ?", {"table", "Properties"})
            .empty()) {
        createPropertiesTable();
        if (hasStorageFailed()) {
            return Tables::failed;
        }
    }
    const std::optional<std::string> storedVersion = propertyForKey(kSchemaVersionKey);
    const std::int32_t fileVersion = dbUserVersion();
    if (!storedVersion) {
        return makeTables();
    }
    const std::int32_t wantedVersion = userVersion();
    if (*storedVersion == schemaVersion_ && (wantedVersion == 0 || wantedVersion == fileVersion)) {
        return Tables::kept;
    }
    if (delegate_ != nullptr && delegate_->migrateDatabase(*this, fileVersion)) {
        hasMigrated_ = true;
    }
    if (hasMigrated_) {
        return Tables::kept;
    }
    removeAllStatements();
    dropAllTables();
    hasMigrated_ = true;
    createPropertiesTable();
    executeSQL("%@", schema_);
    storeCurrentTime(kCreatedKey);
    return Tables::rebuilt;
}

/// A file without a version has nothing to lose: when the storage is at fault nothing is left of
/// the attempt, and the next opening makes another.
KSTDSQLite::Tables KSTDSQLite::makeTables() {
    createPropertiesTable();
    if (hasStorageFailed()) {
        return Tables::failed;
    }
    executeSQL("%@", schema_);
    if (hasStorageFailed()) {
        return Tables::failed;
    }
    storeCurrentTime(kCreatedKey);
    return hasStorageFailed() ? Tables::failed : Tables::made;
}

/// Of what was done last on the connection.
bool KSTDSQLite::hasStorageFailed() const {
    constexpr int kPrimaryCodeMask = 0xff;
    switch (sqlite3_errcode(db_) & kPrimaryCodeMask) {
    case SQLITE_FULL:
    case SQLITE_IOERR:
    case SQLITE_NOMEM:
    case SQLITE_READONLY:
    case SQLITE_CANTOPEN:
        return true;
    default:
        return false;
    }
}

void KSTDSQLite::createPropertiesTable() {
    executeSQL("create table if not exists Properties (\n"
               "    key    text primary key,\n"
               "    value  text\n"
               ");\n");
}

void KSTDSQLite::storeVersions() {
    setProperty(schemaVersion_, kSchemaVersionKey);
    if (const std::int32_t version = userVersion(); version != 0) {
        executeSQL("pragma user_version = %ld", version);
    }
}

void KSTDSQLite::periodicVacuum() {
    const platform::Timestamp now = platform::timestampOf(environment_.clock.now());
    if (now.secondsSince2001 - storedTime(kLastVacuumKey).secondsSince2001 >
        kSecondsBetweenVacuums) {
        executeSQL("VACUUM");
        storeCurrentTime(kLastVacuumKey);
    }
}

platform::Timestamp KSTDSQLite::creationDate() {
    return storedTime(kCreatedKey);
}

/// The epoch when there is no such property.
platform::Timestamp KSTDSQLite::storedTime(const std::string& key) {
    return {leadingFloat(propertyForKey(key).value_or(""))};
}

void KSTDSQLite::storeCurrentTime(const std::string& key) {
    setProperty(fixedText(platform::timestampOf(environment_.clock.now()).secondsSince2001), key);
}

} // namespace kstd
