#include "base/Concat.h"
#include "kstd/Analytics/SQLite/KSTDSQLite.h"
#include "kstd/Analytics/SQLite/StatementRows.h"

#include <cstdlib>
#include <cxxabi.h>
#include <memory>
#include <utility>

namespace kstd {
namespace {

std::string joined(const ColumnNames& names, std::string_view separator) {
    std::string text;
    std::string_view before;
    for (const std::string& name : names) {
        text += before;
        text += name;
        before = separator;
    }
    return text;
}

void appendWhere(std::string& text, const KSTDSQLite::Where& where) {
    // Here an empty clause is none.
    if (where && !where->empty()) {
        text += " where ";
        text += *where;
    }
}

void appendOrderBy(std::string& text, const KSTDSQLite::OrderBy& orderBy) {
    if (orderBy) {
        text += " order by ";
        text += joined(*orderBy, ", ");
    }
}

void appendLimit(std::string& text, KSTDSQLite::Limit limit) {
    if (limit) {
        text += " limit ";
        base::append(text, *limit);
    }
}

RowList collectRows(KSTDSQLite& database, std::string_view SQL,
                    const platform::ValueList& bindings) {
    RowList rows;
    forEachRow(database, SQL, bindings, [&rows](const KSTDSQLiteStatement& row) {
        rows.push_back(row.allObjectsByColumnName());
        return true;
    });
    return rows;
}

void visitRows(KSTDSQLite& database, std::string_view SQL, const platform::ValueList& bindings,
               const RowVisitor& visitor) {
    if (!visitor) {
        stepThrough(database, SQL, bindings);
        return;
    }
    forEachRow(database, SQL, bindings, [&visitor](const KSTDSQLiteStatement& row) {
        bool stop = false;
        visitor(row.allObjectsByColumnName(), stop);
        return !stop;
    });
}

std::string insertText(std::string_view table, const platform::ValueMap& values) {
    // Names of tables and columns are the program's own and stand in the text as they are; values
    // never do. A map is sorted, so the same columns always find the same cached statement.
    std::string text = base::concat("insert or replace into ", table, " (");
    std::string marks;
    for (const auto& [column, value] : values) {
        if (!marks.empty()) {
            text += ',';
            marks += ',';
        }
        text += column;
        marks += '?';
    }
    text += ") values (";
    text += marks;
    text += ')';
    return text;
}

} // namespace

RowList KSTDSQLite::select(const ColumnNames& columns, std::string_view from) {
    return select(columns, from, std::nullopt, {});
}

RowList KSTDSQLite::select(const ColumnNames& columns, std::string_view from, Where where,
                           const platform::ValueList& bindings) {
    // Here an empty clause is one, and an error of SQL, unlike everywhere else.
    std::string text = base::concat("select ", joined(columns, ", "), " from ", from);
    if (where) {
        text += " where ";
        text += *where;
    }
    return collectRows(*this, text, bindings);
}

void KSTDSQLite::select(const ColumnNames& columns, std::string_view from, Where where,
                        const platform::ValueList& bindings, const OrderBy& orderBy, Limit limit,
                        const RowVisitor& block) {
    std::string text =
        base::concat("select ", columns.empty() ? "*" : joined(columns, ", "), " from ", from);
    appendWhere(text, where);
    appendOrderBy(text, orderBy);
    appendLimit(text, limit);
    visitRows(*this, text, bindings, block);
}

void KSTDSQLite::selectFrom(std::string_view table, Where where,
                            const platform::ValueList& bindings, const OrderBy& orderBy,
                            Limit limit, const RowVisitor& block) {
    select({}, table, where, bindings, orderBy, limit, block);
}

RowList KSTDSQLite::selectFrom(std::string_view table, Where where,
                               const platform::ValueList& bindings, Limit limit) {
    std::string text = base::concat("select * from ", table);
    appendWhere(text, where);
    appendLimit(text, limit);
    return collectRows(*this, text, bindings);
}

RowList KSTDSQLite::selectAllFrom(std::string_view table, Where where,
                                  const platform::ValueList& bindings) {
    return selectFrom(table, where, bindings, std::nullopt);
}

std::uint64_t KSTDSQLite::selectCountFrom(std::string_view table, Where where,
                                          const platform::ValueList& bindings) {
    const RowList rows = select({"count(*) as n"}, table, where, bindings);
    // A count has always its row; a table that is not there has none.
    if (rows.empty()) {
        return 0;
    }
    const auto count = rows.front().find("n");
    if (count == rows.front().end()) {
        return 0;
    }
    const auto* const number = count->second.as<std::int64_t>();
    return number != nullptr ? static_cast<std::uint64_t>(*number) : 0;
}

void KSTDSQLite::update(std::string_view table, std::string_view set, Where where,
                        const platform::ValueList& bindings, Limit limit) {
    std::string text = base::concat("update ", table, " set ", set);
    appendWhere(text, where);
    appendLimit(text, limit);
    stepThrough(*this, text, bindings);
}

// The values are moved out of their map. NOLINTNEXTLINE(performance-unnecessary-value-param)
std::int64_t KSTDSQLite::insertOrReplaceInto(std::string_view table, platform::ValueMap values) {
    if (const auto statement = statementForSQL(insertText(table, values))) {
        const StatementUse use(*statement);
        int index = 0;
        for (auto& [column, value] : values) {
            use->bindValue(std::move(value), index++);
        }
        static_cast<void>(use->step());
    }
    return lastInsertRowID();
}

void KSTDSQLite::deleteFrom(std::string_view table, const platform::ValueMap& matchingValues) {
    std::string where;
    platform::ValueList bindings;
    for (const auto& [column, value] : matchingValues) {
        if (!where.empty()) {
            where += " AND ";
        }
        where += column;
        if (value.is<platform::Null>()) {
            where += " is NULL";
        } else {
            where += "=?";
            bindings.push_back(value);
        }
    }
    deleteFrom(table, where, bindings);
}

void KSTDSQLite::deleteFrom(std::string_view table, std::string_view where,
                            const platform::ValueList& bindings) {
    stepOnce(*this, base::concat("delete from ", table, " where ", where), bindings);
}

std::string ownClassName(const std::type_info& type) {
    const std::unique_ptr<char, decltype(&std::free)> readable(
        abi::__cxa_demangle(type.name(), nullptr, nullptr, nullptr), &std::free);
    const std::string_view name = readable != nullptr ? readable.get() : type.name();
    const std::size_t scope = name.rfind("::");
    return std::string(scope == std::string_view::npos ? name : name.substr(scope + 2));
}

std::optional<std::string> KSTDSQLite::tableNameForClassNamed(std::string_view className) const {
    if (!className.starts_with(objectClassPrefix_)) {
        logFailure(base::concat("KSTDSQLite: Object class \"", className,
                                "\" does not have prefix \"", objectClassPrefix_, "\""));
        return std::nullopt;
    }
    return std::string(className.substr(objectClassPrefix_.size()));
}

} // namespace kstd
