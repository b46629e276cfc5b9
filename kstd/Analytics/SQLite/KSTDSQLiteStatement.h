#pragma once

#include "base/NotCopied.h"
#include "platform/Value.h"

#include <cstddef>
#include <cstdint>
#include <list>
#include <optional>
#include <span>
#include <string>
#include <string_view>

struct sqlite3_stmt;

namespace kstd {

class KSTDSQLite;
struct DatabaseEnvironment;

/// A prepared statement of a database, made and cached by it.
///
/// The discipline: bind while it is reset; step until false or until the wanted row; read; reset. A
/// statement that was stepped and not reset refuses to be bound and to be finalized. A step after
/// the one that gave false would run the statement once more, so nobody steps on after false.
///
/// Failures of SQLite are logged and otherwise ignored: a parameter stays unbound, a failed step
/// reads as the end of the rows. Indexes count from 0. Belongs to the serial queue of its database.
class KSTDSQLiteStatement : private base::NotCopied {
  public:
    /// `handle` may be null, which SQLite gives for a text without a statement. The statement owns
    /// it.
    KSTDSQLiteStatement(KSTDSQLite* SQLite, const DatabaseEnvironment& environment, std::string SQL,
                        sqlite3_stmt* handle);
    /// Frees the handle, whatever state it is in.
    ~KSTDSQLiteStatement();

    [[nodiscard]] KSTDSQLite* SQLite() const { return SQLite_; }
    [[nodiscard]] const std::string& SQL() const { return SQL_; }
    /// Null after finalizeStatement.
    [[nodiscard]] sqlite3_stmt* handle() const { return handle_; }
    /// Whether it may be bound.
    [[nodiscard]] bool isReset() const { return reset_; }

    /// True when a row can be read. Fails without a handle.
    [[nodiscard]] bool step();
    /// Ends a use: what was bound is dropped. Does nothing when it is reset already.
    void reset();
    void resetAfterStepError();
    /// Frees the handle; refused, with a line, when the statement is not reset.
    void finalizeStatement();

    void bindInt(std::int32_t value, int atIndex);
    void bindInt64(std::int64_t value, int atIndex);
    /// NaN binds NULL, as SQLite has it.
    void bindDouble(double value, int atIndex);
    /// A null pointer binds NULL, an empty buffer an empty blob. The bytes are not copied: they
    /// must last until the reset.
    void bindBlob(const platform::Bytes* value, int atIndex);
    /// A null pointer binds NULL. The text is not copied: it must last until the reset. It ends at
    /// its first zero byte.
    void bindText(const std::string* value, int atIndex);
    /// Does not ask whether the statement is reset.
    void bindNullAtIndex(int index);
    /// Binds by the kind of the value, which is kept until the reset. Numbers become integers, also
    /// those with a fraction; dates a REAL of seconds since 2001; errors a property list of domain,
    /// code and description. Lists and maps are not bound.
    void bindValue(platform::Value value, int atIndex);
    /// Element i at index i.
    void bindValues(const platform::ValueList& values);

    /// Keeps the value until the next reset, where it is not moved any more.
    const platform::Value& retainedTemporaryBoundObject(platform::Value value);
    [[nodiscard]] const std::list<platform::Value>& temporaryBoundObjects() const {
        return temporaryBoundObjects_;
    }

    [[nodiscard]] int columnCount() const;
    [[nodiscard]] int columnTypeAtIndex(int index) const;
    [[nodiscard]] std::string columnNameAtIndex(int index) const;
    [[nodiscard]] std::int32_t intAtIndex(int index) const;
    [[nodiscard]] std::int64_t int64AtIndex(int index) const;
    [[nodiscard]] double doubleAtIndex(int index) const;
    /// None when SQLite gives no pointer, as it does for NULL and for an empty blob.
    [[nodiscard]] std::optional<platform::Bytes> blobAtIndex(int index) const;
    /// The bytes of a blob where SQLite has them, until the next step or reset; none when the
    /// column is no blob.
    [[nodiscard]] std::optional<std::span<const std::uint8_t>> blobBytesAtIndex(int index) const;
    /// Up to its first zero byte; none for NULL.
    [[nodiscard]] std::optional<std::string> textAtIndex(int index) const;
    /// A signed 64-bit integer, a double, a text, a buffer (an empty one for an empty blob) or
    /// null.
    [[nodiscard]] platform::Value objectAtIndex(int index) const;
    /// Every column in order, null where it is NULL.
    [[nodiscard]] platform::ValueList allObjects() const;
    /// By the columns' names, without those that are NULL.
    [[nodiscard]] platform::ValueMap allObjectsByColumnName() const;

  private:
    /// Whether it is reset; a line says when it is not.
    [[nodiscard]] bool mayBind() const;
    void checkBound(int code, std::string_view kind, int index) const;
    void bindNumber(const platform::Value& number, int index);
    void bindRetainedBlob(platform::Bytes bytes, int index);
    void bindError(const platform::Error& error, int index);
    int clearBindings();
    void logUnbindable(const platform::Value& value) const;
    void logFailure(std::string_view text, std::string_view messageId = {}) const;

    KSTDSQLite* SQLite_;
    const DatabaseEnvironment& environment_;
    std::string SQL_;
    sqlite3_stmt* handle_;
    bool reset_ = true;
    std::list<platform::Value> temporaryBoundObjects_;
};

} // namespace kstd
