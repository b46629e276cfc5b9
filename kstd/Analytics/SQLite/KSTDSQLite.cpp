#include "kstd/Analytics/SQLite/KSTDSQLite.h"

#include "base/Concat.h"
#include "kstd/Analytics/SQLite/DatabaseFile.h"
#include "kstd/Analytics/SQLite/SchemaHash.h"

#include <sqlite3.h>
#include <utility>

namespace kstd {
namespace {

constexpr std::string_view kClosed = "KSTDSQLite: Database is closed";

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
        logFailure(base::concat("KSTDSQLite: Error executing SQL: \"", text, "\" (", code, ")"));
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
        logFailure(base::concat("Error preparing statement: ", text));
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

void KSTDSQLite::logFailure(std::string_view text) const {
    environment_.log.write(platform::LogLevel::notice, text, {});
}

} // namespace kstd
