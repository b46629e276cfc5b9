#include "base/Concat.h"
#include "kstd/Analytics/SQLite/KSTDSQLite.h"
#include "kstd/Analytics/SQLite/StatementRows.h"

namespace kstd {

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
