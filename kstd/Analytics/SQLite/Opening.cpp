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
        sqlite3_close_v2(std::exchange(db_, nullptr));
        if (error != nullptr) {
            *error = std::move(reason);
        }
        return false;
    }
    begin();
    const bool built = makeTablesCurrent();
    end();
    if (shouldVacuum_) {
        periodicVacuum();
    }
    if (built || hasMigrated_) {
        storeVersions();
    }
    ++openCount_;
    return true;
}

void KSTDSQLite::open() {
    platform::Error error;
    if (!openWithError(&error)) {
        logError(base::concat("KSTDSQLite: Error opening db at ", path_, ": ", error.description));
    }
}

/// Sets `reason` when it knows better than the caller.
bool KSTDSQLite::openConnection(platform::Error& reason) {
    if (auto failure = makeParentDirectories(path_)) {
        reason = *std::move(failure);
        return false;
    }
    createDatabaseFile(path_);
    const int code = sqlite3_open_v2(
        path_.c_str(), &db_, SQLITE_OPEN_READWRITE | SQLITE_OPEN_CREATE, registerDatabaseFiles());
    if (code != SQLITE_OK) {
        reason.description = base::concat("Error opening db at ", path_, ", rc=", code, "(0x",
                                          base::Hex{static_cast<std::uint32_t>(code)}, ")");
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

/// Whether the tables were built.
bool KSTDSQLite::makeTablesCurrent() {
    if (select({"name"}, "sqlite_master", "type = ? AND name = ?", {"table", "Properties"})
            .empty()) {
        createPropertiesTable();
    }
    const std::optional<std::string> storedVersion = propertyForKey(kSchemaVersionKey);
    const std::int32_t fileVersion = dbUserVersion();
    if (storedVersion) {
        const std::int32_t wantedVersion = userVersion();
        if (*storedVersion == schemaVersion_ &&
            (wantedVersion == 0 || wantedVersion == fileVersion)) {
            return false;
        }
        if (delegate_ != nullptr && delegate_->migrateDatabase(*this, fileVersion)) {
            hasMigrated_ = true;
        }
        if (hasMigrated_) {
            return false;
        }
        removeAllStatements();
        dropAllTables();
        hasMigrated_ = true;
    }
    buildTables();
    return true;
}

void KSTDSQLite::buildTables() {
    createPropertiesTable();
    executeSQL("%@", schema_);
    storeCurrentTime(kCreatedKey);
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
