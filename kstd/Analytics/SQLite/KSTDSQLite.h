#pragma once

#include "base/NotCopied.h"
#include "kstd/Analytics/SQLite/DatabaseEnvironment.h"
#include "kstd/Analytics/SQLite/DatabaseTexts.h"
#include "kstd/Analytics/SQLite/DateFormatter.h"
#include "kstd/Analytics/SQLite/KSTDSQLiteStatement.h"
#include "platform/Date.h"
#include "platform/Result.h"
#include "platform/Value.h"

#include <concepts>
#include <cstdint>
#include <functional>
#include <map>
#include <memory>
#include <optional>
#include <set>
#include <span>
#include <string>
#include <string_view>
#include <typeinfo>
#include <vector>

struct sqlite3;

namespace kstd {

class KSTDSQLite;

/// Knows the revision of its owner's tables and how to bring older ones up to it. Called while the
/// database is being opened, on the thread that opens it.
class KSTDSQLiteDelegate : private base::NotCopied {
  public:
    virtual ~KSTDSQLiteDelegate() = default;

    /// The revision that the tables shall have; 0 means that revisions are not used.
    [[nodiscard]] virtual std::int32_t userVersion() = 0;

    /// Brings the tables, which are of revision `fromVersion`, up to the current schema. Called
    /// inside the opening's transaction, with the database already usable. False, and all tables
    /// are dropped and made anew.
    ///
    /// That the migration was done is written after its transaction has ended. A crash in between
    /// leads to another call, for tables that are migrated already: it must do them no harm.
    [[nodiscard]] virtual bool migrateDatabase(KSTDSQLite& database, std::int32_t fromVersion) = 0;
};

/// SHA-256 of the bytes of `schema`, as 64 upper-case hexadecimal digits.
[[nodiscard]] std::string schemaHash(std::string_view schema);

/// What `type` is called in its source, without namespaces.
[[nodiscard]] std::string ownClassName(const std::type_info& type);

using ColumnNames = std::vector<std::string>;
/// Columns by their names, those that are NULL left out.
using RowList = std::vector<platform::ValueMap>;
/// Gets one row after the other; setting `stop` ends it after that row. Must not use the database
/// with the very text of the query that it is called for: that would start the query anew.
using RowVisitor = std::function<void(const platform::ValueMap& row, bool& stop)>;

/// The name that the table of a record class is named after: what its static KSTDSQLiteClassName
/// tells, or, without one, its own name, without namespaces.
template <typename Record>
[[nodiscard]] std::string KSTDSQLiteClassName() {
    if constexpr (requires { Record::KSTDSQLiteClassName(); }) {
        return Record::KSTDSQLiteClassName();
    } else {
        return ownClassName(typeid(Record));
    }
}

/// One database file, its connection, its cached statements and its table of properties.
///
/// Opening makes the tables, or makes them anew when the text of the schema is not the one that
/// built them; it counts, and the last close closes. A statement is prepared once for each text and
/// lives until then.
///
/// Failures of SQLite are written to the log and show otherwise only as a false, none or -1. Table
/// and column names are put into texts as they stand, values never: they are bound.
///
/// Takes no lock: one instance belongs to one serial queue at a time.
class KSTDSQLite : private base::NotCopied {
  public:
    /// Does not touch the file. `path` is absolute. What the environment refers to outlives the
    /// database.
    KSTDSQLite(std::string path, std::string schema, const DatabaseEnvironment& environment);
    /// Closes once. A connection that is open even then is released without a line.
    virtual ~KSTDSQLite();

    /// Supplies `userVersion` and migrates. May be null.
    [[nodiscard]] const std::shared_ptr<KSTDSQLiteDelegate>& delegate() const { return delegate_; }
    void setDelegate(std::shared_ptr<KSTDSQLiteDelegate> delegate);

    [[nodiscard]] const std::string& path() const { return path_; }
    /// The text that makes the tables.
    [[nodiscard]] const std::string& schema() const { return schema_; }
    /// SHA-256 of the schema's bytes, as 64 upper-case hexadecimal digits.
    [[nodiscard]] const std::string& schemaVersion() const { return schemaVersion_; }

    using Statements = std::map<std::string, std::shared_ptr<KSTDSQLiteStatement>, std::less<>>;
    [[nodiscard]] const Statements& statementsBySQL() const { return statementsBySQL_; }

    /// What the name of a class begins with before the name of its table.
    [[nodiscard]] const std::string& objectClassPrefix() const { return objectClassPrefix_; }
    void setObjectClassPrefix(std::string prefix) { objectClassPrefix_ = std::move(prefix); }

    /// 0 off, 1 normal, 2 full. Opening with any other stops the process.
    [[nodiscard]] std::int64_t synchronousMode() const { return synchronousMode_; }
    void setSynchronousMode(std::int64_t mode) { synchronousMode_ = mode; }

    /// The revision of the tables that is wanted, 0 when revisions are not used. The delegate's
    /// answer when there is a delegate.
    [[nodiscard]] std::int32_t userVersion() const;
    void setUserVersion(std::int32_t version) { userVersion_ = version; }

    /// Null while closed.
    [[nodiscard]] sqlite3* db() const { return db_; }
    void setDb(sqlite3* db) { db_ = db; }

    /// How many opens are not closed yet.
    [[nodiscard]] std::uint64_t openCount() const { return openCount_; }
    void setOpenCount(std::uint64_t count) { openCount_ = count; }

    /// How dates are written as properties. Made by the first call unless one was set.
    [[nodiscard]] const std::shared_ptr<DateFormatter>& dateFormatter();
    void setDateFormatter(std::shared_ptr<DateFormatter> formatter);

    /// Whether an opening has migrated or rebuilt the tables. Stays so: a later opening of this
    /// object finds nothing to rebuild.
    [[nodiscard]] bool hasMigrated() const { return hasMigrated_; }

    /// Whether opening vacuums a file that was not vacuumed for a week. A new file gets its
    /// automatic vacuum by the first such one only.
    [[nodiscard]] bool shouldVacuum() const { return shouldVacuum_; }
    void setShouldVacuum(bool shouldVacuum) { shouldVacuum_ = shouldVacuum; }

    /// Marks of the owner's; nothing here looks at them.
    [[nodiscard]] bool corrupt() const { return corrupt_; }
    void setCorrupt(bool corrupt) { corrupt_ = corrupt; }
    [[nodiscard]] bool traced() const { return traced_; }
    void setTraced(bool traced) { traced_ = traced; }

    /// Opens the database, or counts one more opening. False leaves it closed and says why in
    /// `error`, which may be null.
    ///
    /// Of building the tables nothing makes it fail but this: the file has none yet, and a
    /// statement failed for the storage (full, not writable, an I/O error, no memory). Nothing is
    /// left of the attempt then. What a schema text that is wrong in itself has made by its first
    /// mistake stays, and counts as built.
    [[nodiscard]] bool openWithError(platform::Error* error);
    /// openWithError that writes a failure to the log.
    void open();
    /// Takes one opening back; the last closes. Stays open when a statement was left unreset.
    void close();
    [[nodiscard]] bool isOpen() const { return db_ != nullptr; }
    /// Deletes the file and what SQLite keeps beside it. Does not close.
    void remove();

    /// Begins an exclusive transaction.
    void begin();
    void end();
    void rollback();
    void analyze();
    void vacuum();

    /// Runs the text, which may hold several statements, and drops their rows. Only `format` is
    /// read for placeholders, never an argument.
    template <typename... Arguments>
    requires(std::constructible_from<FormatArgument, const Arguments&>&&...) bool executeSQL(
        std::string_view format, const Arguments&... arguments) {
        return executeSQL(format, std::span<const FormatArgument>(
                                      std::initializer_list<FormatArgument>{arguments...}));
    }
    bool executeSQL(std::string_view format, std::span<const FormatArgument> arguments);

    /// The cached statement of exactly that text, whatever its state; prepared when there is none.
    /// Null on failure. Must not be kept beyond the database.
    [[nodiscard]] std::shared_ptr<KSTDSQLiteStatement> statementForSQL(std::string_view SQL);
    /// Finalizes and forgets every cached statement. One that is not reset refuses and keeps the
    /// connection from being closed until its holder resets and finalizes it.
    void removeAllStatements();

    [[nodiscard]] std::int64_t lastInsertRowID() const;
    /// How many rows the last statement changed.
    [[nodiscard]] std::int32_t changes() const;

    [[nodiscard]] std::vector<std::string> allTableNames();
    /// Also drops the properties.
    void dropAllTables();
    [[nodiscard]] std::set<std::string> columnNamesForTable(std::string_view table);
    [[nodiscard]] std::int32_t dbUserVersion();

    [[nodiscard]] std::optional<std::string> propertyForKey(const std::string& key);
    /// No value removes the property.
    void setProperty(const std::optional<std::string>& value, const std::string& forKey);
    void removePropertyForKey(const std::string& key);
    [[nodiscard]] std::optional<platform::Timestamp> datePropertyForKey(const std::string& key);
    /// No date removes the property.
    void setDateProperty(const std::optional<platform::Timestamp>& date, const std::string& forKey);
    /// When the tables were made, to the precision of a 32-bit float.
    [[nodiscard]] platform::Timestamp creationDate();

    using Where = std::optional<std::string_view>;
    using OrderBy = std::optional<ColumnNames>;
    using Limit = std::optional<std::int64_t>;

    // Queries. Element i of `bindings` takes the place of question mark i. These add " where "
    // whenever there is a clause, even an empty one; all others only when it is not empty.
    [[nodiscard]] RowList select(const ColumnNames& columns, std::string_view from);
    [[nodiscard]] RowList select(const ColumnNames& columns, std::string_view from, Where where,
                                 const platform::ValueList& bindings);

    /// No columns select all. A null `block` has the rows dropped.
    void select(const ColumnNames& columns, std::string_view from, Where where,
                const platform::ValueList& bindings, const OrderBy& orderBy, Limit limit,
                const RowVisitor& block);
    void selectFrom(std::string_view table, Where where, const platform::ValueList& bindings,
                    const OrderBy& orderBy, Limit limit, const RowVisitor& block);
    [[nodiscard]] RowList selectFrom(std::string_view table, Where where,
                                     const platform::ValueList& bindings, Limit limit);
    [[nodiscard]] RowList selectAllFrom(std::string_view table, Where where,
                                        const platform::ValueList& bindings);
    [[nodiscard]] std::uint64_t selectCountFrom(std::string_view table, Where where,
                                                const platform::ValueList& bindings);

    void update(std::string_view table, std::string_view set, Where where,
                const platform::ValueList& bindings, Limit limit);
    /// The identifier of the row, or of an earlier one when there was a failure.
    std::int64_t insertOrReplaceInto(std::string_view table, platform::ValueMap values);
    /// Deletes the rows whose columns have all these values; Null stands for NULL.
    void deleteFrom(std::string_view table, const platform::ValueMap& matchingValues);
    void deleteFrom(std::string_view table, std::string_view where,
                    const platform::ValueList& bindings);

    /// The name of a record class without the prefix; none, with a line, when it does not begin
    /// with it.
    template <typename Record>
    [[nodiscard]] std::optional<std::string> tableNameForClass() const {
        return tableNameForClassNamed(KSTDSQLiteClassName<Record>());
    }

  protected:
    [[nodiscard]] const DatabaseEnvironment& environment() const { return environment_; }
    /// A failure of this class, at the default level.
    void logFailure(std::string_view text, std::string_view messageId = {}) const;

  private:
    /// What an opening has done about the tables.
    enum class Tables { kept, made, rebuilt, failed };

    [[nodiscard]] std::optional<std::string>
    tableNameForClassNamed(std::string_view className) const;
    [[nodiscard]] bool openConnection(platform::Error& reason);
    [[nodiscard]] bool configureConnection();
    [[nodiscard]] Tables makeTablesCurrent();
    [[nodiscard]] Tables makeTables();
    [[nodiscard]] bool hasStorageFailed() const;
    [[nodiscard]] bool failToOpen(platform::Error& reason, platform::Error* error);
    void createPropertiesTable();
    void storeVersions();
    void periodicVacuum();
    [[nodiscard]] platform::Timestamp storedTime(const std::string& key);
    void storeCurrentTime(const std::string& key);

    DatabaseEnvironment environment_;
    DatabaseCauses causes_;
    std::shared_ptr<KSTDSQLiteDelegate> delegate_;
    std::string path_;
    std::string schema_;
    std::string schemaVersion_;
    Statements statementsBySQL_;
    /// Those that refused to be finalized: freeing them would break their holders' use.
    std::vector<std::shared_ptr<KSTDSQLiteStatement>> unfinalizedStatements_;
    std::string objectClassPrefix_ = "RX";
    std::int64_t synchronousMode_ = 1;
    std::int32_t userVersion_ = 0;
    sqlite3* db_ = nullptr;
    std::uint64_t openCount_ = 0;
    std::shared_ptr<DateFormatter> dateFormatter_;
    bool hasMigrated_ = false;
    bool shouldVacuum_ = true;
    bool corrupt_ = false;
    bool traced_ = false;
};

} // namespace kstd
