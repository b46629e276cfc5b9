#include "kstd/Analytics/SQLite/KSTDSQLite.h"
#include "kstd/Analytics/SQLite/StatementRows.h"

#include <utility>

namespace kstd {

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

} // namespace kstd
