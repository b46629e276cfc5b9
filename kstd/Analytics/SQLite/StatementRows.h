#pragma once

#include "base/NotCopied.h"
#include "kstd/Analytics/SQLite/KSTDSQLite.h"
#include "kstd/Analytics/SQLite/KSTDSQLiteStatement.h"

#include <concepts>
#include <string_view>
#include <utility>

namespace kstd {

/// One use of a statement: ends with its reset, also when something is thrown in between.
class StatementUse : private base::NotCopied {
  public:
    explicit StatementUse(KSTDSQLiteStatement& statement) : statement_(statement) {}
    ~StatementUse() { statement_.reset(); }

    KSTDSQLiteStatement& operator*() const { return statement_; }
    KSTDSQLiteStatement* operator->() const { return &statement_; }

  private:
    KSTDSQLiteStatement& statement_;
};

/// Runs the statement of that text, bound by `bind`, and calls `takeRow` with it, standing on a
/// row, for each row until it gives false. Without a statement there are no rows.
template <std::invocable<KSTDSQLiteStatement&> Binder, typename RowTaker>
void forEachRow(KSTDSQLite& database, std::string_view SQL, Binder&& bind, RowTaker&& takeRow) {
    const auto statement = database.statementForSQL(SQL);
    if (statement == nullptr) {
        return;
    }
    const StatementUse use(*statement);
    bind(*statement);
    while (use->step()) {
        if (!takeRow(*statement)) {
            return;
        }
    }
}

/// The same with element i of `bindings` in the place of question mark i.
template <typename RowTaker>
void forEachRow(KSTDSQLite& database, std::string_view SQL, const platform::ValueList& bindings,
                RowTaker&& takeRow) {
    forEachRow(
        database, SQL,
        [&bindings](KSTDSQLiteStatement& statement) { statement.bindValues(bindings); },
        std::forward<RowTaker>(takeRow));
}

/// Runs the statement of that text and takes its first step only.
inline void stepOnce(KSTDSQLite& database, std::string_view SQL,
                     const platform::ValueList& bindings) {
    forEachRow(database, SQL, bindings, [](const KSTDSQLiteStatement&) { return false; });
}

/// Runs the statement of that text to its end.
inline void stepThrough(KSTDSQLite& database, std::string_view SQL,
                        const platform::ValueList& bindings) {
    forEachRow(database, SQL, bindings, [](const KSTDSQLiteStatement&) { return true; });
}

} // namespace kstd
