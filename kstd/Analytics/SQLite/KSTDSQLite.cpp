#include "kstd/Analytics/SQLite/KSTDSQLite.h"

#include "base/Concat.h"
#include "base/Saturate.h"
#include "kstd/Analytics/SQLite/DatabaseFile.h"
#include "kstd/Analytics/SQLite/DatabaseTexts.h"
#include "kstd/Analytics/SQLite/StatementRows.h"
#include "kstd/LogLines.h"
#include "platform/FailedCheck.h"
#include "platform/MessageClasses.h"

#include <array>
#include <cstdint>
#include <sha2.h>
#include <sqlite3.h>
#include <utility>

namespace kstd {

std::string schemaHash(std::string_view schema) {
    SHA2_CTX context;
    SHA256Init(&context);
    SHA256Update(&context, reinterpret_cast<const std::uint8_t*>(schema.data()), schema.size());
    std::array<std::uint8_t, SHA256_DIGEST_LENGTH> digest{};
    SHA256Final(digest.data(), &context);
    return RXUppercaseHexStringWithoutSpaces(digest);
}

namespace {

constexpr std::string_view kClosed = "KSTDSQLite: Database is closed";

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
        platform::stop({&log, kTag, "kstd/Analytics/SQLite/KSTDSQLite"},
                       "Unknown synchronous mode");
    }
}

int asMilliseconds(std::chrono::milliseconds duration) {
    return base::saturate<int>(duration.count());
}

} // namespace

KSTDSQLite::KSTDSQLite(std::string path, std::string schema, const DatabaseEnvironment& environment)
    : environment_(environment),
      causes_(environment.warnsOfCauses ? &environment.log : nullptr, path),
      path_(std::move(path)),
      schema_(std::move(schema)),
      schemaVersion_(schemaHash(schema_)) {
    environment_.causes = &causes_;
}

KSTDSQLite::~KSTDSQLite() {
    close();
    // The statements free their handles, in whatever state they are; until the last one is gone
    // SQLite keeps the connection.
    statementsBySQL_.clear();
    unfinalizedStatements_.clear();
    sqlite3_close_v2(db_);
}

void KSTDSQLite::setDelegate(std::shared_ptr<KSTDSQLiteDelegate> delegate) {
    delegate_ = std::move(delegate);
}

std::int32_t KSTDSQLite::userVersion() const {
    return delegate_ != nullptr ? delegate_->userVersion() : userVersion_;
}

void KSTDSQLite::close() {
    if (openCount_ == 0) {
        return;
    }
    if (openCount_ == 1) {
        removeAllStatements();
        // Not sqlite3_close_v2: over a statement in use that would succeed, and leave a connection
        // that nobody can close any more. This way it stays open, counted once, for another
        // attempt.
        if (sqlite3_close(db_) != SQLITE_OK) {
            logFailure("KSTDSQLite: Error closing database");
            return;
        }
        db_ = nullptr;
    }
    --openCount_;
}

void KSTDSQLite::remove() {
    removeDatabaseFiles(path_);
}

void KSTDSQLite::begin() {
    executeSQL("begin exclusive");
}

void KSTDSQLite::end() {
    executeSQL("end");
}

void KSTDSQLite::rollback() {
    executeSQL("rollback");
}

void KSTDSQLite::analyze() {
    executeSQL("analyze");
}

void KSTDSQLite::vacuum() {
    executeSQL("vacuum");
}

bool KSTDSQLite::executeSQL(std::string_view format, std::span<const FormatArgument> arguments) {
    if (db_ == nullptr) {
        logFailure(kClosed);
        return false;
    }
    const std::string text = formatText(format, arguments);
    const int code = sqlite3_exec(db_, text.c_str(), nullptr, nullptr, nullptr);
    if (code != SQLITE_OK) {
        logFailure(base::concat("KSTDSQLite: Error executing SQL: \"", text, "\" (", code, ")"),
                   platform::message::kDatabaseFailed);
        causes_.tell(code, db_);
        return false;
    }
    return true;
}

std::shared_ptr<KSTDSQLiteStatement> KSTDSQLite::statementForSQL(std::string_view SQL) {
    if (db_ == nullptr) {
        logFailure(kClosed);
        return nullptr;
    }
    if (const auto cached = statementsBySQL_.find(SQL); cached != statementsBySQL_.end()) {
        return cached->second;
    }
    std::string text(SQL);
    sqlite3_stmt* handle = nullptr;
    if (sqlite3_prepare_v2(db_, text.c_str(), -1, &handle, nullptr) != SQLITE_OK) {
        // Nothing is cached: the same text may be a good one later, when its table is there.
        logFailure(base::concat("Error preparing statement: ", text),
                   platform::message::kDatabaseFailed);
        causes_.tell(sqlite3_extended_errcode(db_), db_);
        return nullptr;
    }
    auto statement = std::make_shared<KSTDSQLiteStatement>(this, environment_, text, handle);
    statementsBySQL_.emplace(std::move(text), statement);
    return statement;
}

void KSTDSQLite::removeAllStatements() {
    for (const auto& [text, statement] : statementsBySQL_) {
        statement->finalizeStatement();
        if (statement->handle() != nullptr) {
            unfinalizedStatements_.push_back(statement);
        }
    }
    statementsBySQL_.clear();
}

std::int64_t KSTDSQLite::lastInsertRowID() const {
    if (db_ == nullptr) {
        logFailure(kClosed);
        return -1;
    }
    return sqlite3_last_insert_rowid(db_);
}

std::int32_t KSTDSQLite::changes() const {
    if (db_ == nullptr) {
        logFailure(kClosed);
        return -1;
    }
    return sqlite3_changes(db_);
}

void KSTDSQLite::logFailure(std::string_view text, std::string_view messageId) const {
    environment_.log.write(platform::LogLevel::notice, text, {.messageId = messageId});
}

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
    // Two programs that open a new file must not both find it without tables.
    begin();
    Tables tables = makeTablesCurrent();
    if (tables != Tables::failed) {
        end();
        // On a full disk it may be the commit that fails.
        if (tables == Tables::made && hasStorageFailed()) {
            tables = Tables::failed;
        }
    }
    if (tables == Tables::failed) {
        return failToOpen(reason, error);
    }
    // Only now: SQLite vacuums outside of transactions alone. The versions come last, so that they
    // are never ahead of the tables; a crash before them has a migration called once more.
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
    // Not sqlite3_close: a delegate may have left a statement in use, and the attempt is over all
    // the same.
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
    const bool isNew = createDatabaseFile(path_);
    const int code = sqlite3_open_v2(
        path_.c_str(), &db_, SQLITE_OPEN_READWRITE | SQLITE_OPEN_CREATE, registerDatabaseFiles());
    if (code != SQLITE_OK) {
        reason.description = base::concat("Error opening db at ", path_, ", rc=", code, "(0x",
                                          base::Hex{static_cast<std::uint32_t>(code)}, ")");
        causes_.tell(code, db_);
        return false;
    }
    if (isNew) {
        keepForOwner(path_);
    }
    return true;
}

bool KSTDSQLite::configureConnection() {
    sqlite3_extended_result_codes(db_, 1);
    return sqlite3_busy_timeout(db_, asMilliseconds(environment_.busyTimeout)) == SQLITE_OK &&
           executeSQL("pragma journal_mode = WAL") &&
           executeSQL("pragma synchronous = %@",
                      synchronousModeName(synchronousMode_, environment_.log)) &&
           // A file that has its log already takes this over with its next vacuum. The order stays:
           // the first vacuum of a new file is the one of its opening.
           executeSQL("pragma auto_vacuum = FULL");
}

KSTDSQLite::Tables KSTDSQLite::makeTablesCurrent() {
    if (select({"name"}, "sqlite_master", "type = ? AND name = ?", {"table", "Properties"})
            .empty()) {
        // The version is read from it right away. makeTables asks for it again, which does nothing
        // then.
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
    // Also when an earlier opening of this object has migrated or rebuilt: once is enough, whatever
    // the delegate says now.
    if (hasMigrated_) {
        return Tables::kept;
    }
    removeAllStatements();
    dropAllTables();
    // Migrated or rebuilt, that is. The properties went with the other tables.
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
    // A float of 32 bits knows today to about a minute. That is enough for a week, and the dates
    // read the same for everyone.
    return {leadingFloat(propertyForKey(key).value_or(""))};
}

void KSTDSQLite::storeCurrentTime(const std::string& key) {
    setProperty(fixedText(platform::timestampOf(environment_.clock.now()).secondsSince2001), key);
}

const std::shared_ptr<DateFormatter>& KSTDSQLite::dateFormatter() {
    if (dateFormatter_ == nullptr) {
        dateFormatter_ = std::make_shared<DateFormatter>();
    }
    return dateFormatter_;
}

void KSTDSQLite::setDateFormatter(std::shared_ptr<DateFormatter> formatter) {
    dateFormatter_ = std::move(formatter);
}

std::optional<std::string> KSTDSQLite::propertyForKey(const std::string& key) {
    std::optional<std::string> value;
    // Read before every event: the key is bound where it is.
    forEachRow(
        *this, "select value from Properties where key = ?",
        [&key](KSTDSQLiteStatement& statement) { statement.bindText(&key, 0); },
        [&value](const KSTDSQLiteStatement& row) {
            value = row.textAtIndex(0);
            return false;
        });
    return value;
}

void KSTDSQLite::setProperty(const std::optional<std::string>& value, const std::string& forKey) {
    if (value) {
        stepOnce(*this, "insert or replace into Properties (key, value) values (?,?)",
                 {forKey, *value});
    } else {
        removePropertyForKey(forKey);
    }
}

void KSTDSQLite::removePropertyForKey(const std::string& key) {
    stepOnce(*this, "delete from Properties where key = ?", {key});
}

std::optional<platform::Timestamp> KSTDSQLite::datePropertyForKey(const std::string& key) {
    const std::optional<std::string> text = propertyForKey(key);
    return text && !text->empty() ? dateFormatter()->date(*text) : std::nullopt;
}

void KSTDSQLite::setDateProperty(const std::optional<platform::Timestamp>& date,
                                 const std::string& forKey) {
    setProperty(date ? std::optional(dateFormatter()->text(*date)) : std::nullopt, forKey);
}

std::vector<std::string> KSTDSQLite::allTableNames() {
    std::vector<std::string> names;
    forEachRow(*this, "select name from sqlite_master where type = 'table'", {},
               [&names](const KSTDSQLiteStatement& row) {
                   names.push_back(row.textAtIndex(0).value_or(""));
                   return true;
               });
    return names;
}

void KSTDSQLite::dropAllTables() {
    for (const std::string& name : allTableNames()) {
        // SQLite keeps its own tables; that it does is nothing to be told of.
        causes_.setSilent(name.starts_with("sqlite_"));
        executeSQL("drop table %@", name);
    }
    causes_.setSilent(false);
}

std::set<std::string> KSTDSQLite::columnNamesForTable(std::string_view table) {
    std::set<std::string> names;
    forEachRow(*this, base::concat("pragma table_info(", table, ")"), {},
               [&names](const KSTDSQLiteStatement& row) {
                   names.insert(row.textAtIndex(1).value_or(""));
                   return true;
               });
    return names;
}

std::int32_t KSTDSQLite::dbUserVersion() {
    std::int32_t version = 0;
    forEachRow(*this, "pragma user_version", {}, [&version](const KSTDSQLiteStatement& row) {
        version = row.intAtIndex(0);
        return true;
    });
    return version;
}

} // namespace kstd
