#include "bench/support/BareDatabase.h"

#include "base/Concat.h"
#include "kstd/Analytics/TQAnalyticsLoggerSQLiteStore.h"

#include <sqlite3.h>
#include <stdexcept>

namespace bench {

namespace {

std::runtime_error failure(std::string_view what, sqlite3* database) {
    return std::runtime_error(
        base::concat(what, ": ", database == nullptr ? "no memory" : sqlite3_errmsg(database)));
}

} // namespace

void BareDatabase::Close::operator()(sqlite3* database) const {
    sqlite3_close_v2(database);
}

BareDatabase::BareDatabase(const std::string& path) {
    sqlite3* database = nullptr;
    const int code = sqlite3_open_v2(path.c_str(), &database,
                                     SQLITE_OPEN_READWRITE | SQLITE_OPEN_CREATE, nullptr);
    database_.reset(database);
    if (code != SQLITE_OK) {
        throw failure("cannot open " + path, database);
    }
}

void BareDatabase::execute(const char* text) {
    if (sqlite3_exec(handle(), text, nullptr, nullptr, nullptr) != SQLITE_OK) {
        throw failure(text, handle());
    }
}

void BareStatement::Finalize::operator()(sqlite3_stmt* statement) const {
    sqlite3_finalize(statement);
}

BareStatement::BareStatement(const BareDatabase& database, const char* text) {
    sqlite3_stmt* statement = nullptr;
    if (sqlite3_prepare_v3(database.handle(), text, -1, SQLITE_PREPARE_PERSISTENT, &statement,
                           nullptr) != SQLITE_OK) {
        throw failure(text, database.handle());
    }
    statement_.reset(statement);
}

void BareStatement::insert(double number, std::span<const std::uint8_t> bytes) {
    if (sqlite3_bind_double(statement_.get(), 1, number) != SQLITE_OK ||
        sqlite3_bind_blob64(statement_.get(), 2, bytes.data(), bytes.size(), SQLITE_STATIC) !=
            SQLITE_OK ||
        step()) {
        throw failure("cannot insert", sqlite3_db_handle(statement_.get()));
    }
    reset();
}

bool BareStatement::step() {
    const int code = sqlite3_step(statement_.get());
    if (code != SQLITE_ROW && code != SQLITE_DONE) {
        throw failure(sqlite3_sql(statement_.get()), sqlite3_db_handle(statement_.get()));
    }
    return code == SQLITE_ROW;
}

std::span<const std::uint8_t> BareStatement::firstColumn() const {
    const auto* const bytes =
        static_cast<const std::uint8_t*>(sqlite3_column_blob(statement_.get(), 0));
    return {bytes, static_cast<std::size_t>(sqlite3_column_bytes(statement_.get(), 0))};
}

void BareStatement::reset() {
    sqlite3_reset(statement_.get());
}

void configureAsEventStore(BareDatabase& database) {
    database.execute("pragma journal_mode = WAL");
    database.execute("pragma synchronous = normal");
    database.execute("pragma auto_vacuum = FULL");
}

void makeEventTables(BareDatabase& database) {
    database.execute("create table Properties (key text primary key, value text)");
    database.execute(kstd::kEventSchema);
    // Nothing but this lets a file that has its tables take automatic vacuum.
    database.execute("vacuum");
}

} // namespace bench
