#include "kstd/Analytics/SQLite/KSTDSQLiteStatement.h"

#include "base/Saturate.h"
#include "kstd/Analytics/SQLite/DatabaseEnvironment.h"
#include "kstd/Analytics/SQLite/DatabaseTexts.h"
#include "kstd/Analytics/SQLite/KSTDValueType.h"
#include "platform/MessageClasses.h"

#include <algorithm>
#include <concepts>
#include <limits>
#include <sqlite3.h>
#include <utility>
#include <variant>

namespace kstd {

namespace {

/// An extended result code holds the primary one in its low byte.
constexpr int kPrimaryCodeMask = 0xff;

/// SQLite counts parameters from 1.
int parameterNumber(int index) {
    return std::min(index, std::numeric_limits<int>::max() - 1) + 1;
}

/// The number in the value: an integer reduced to the bits of `To`, a real without its fraction
/// and held within the range of `To`.
template <std::signed_integral To>
To integerIn(const platform::Value& number) {
    return std::visit(
        [](const auto& content) -> To {
            using Kind = std::remove_cvref_t<decltype(content)>;
            if constexpr (std::floating_point<Kind>) {
                return base::saturate<To>(content);
            } else if constexpr (std::integral<Kind>) {
                return static_cast<To>(content);
            } else {
                return 0;
            }
        },
        number.content());
}

bool isBoundWith32Bits(const KSTDValueType& type) {
    return type.isIntegerNumber() ? type.size() <= sizeof(std::int32_t)
                                  : type.code() == KSTDValueType::kFloatCode;
}

platform::Value archiveOf(const platform::Error& error) {
    return platform::ValueMap{
        {"code", error.code}, {"description", error.description}, {"domain", error.domain}};
}

} // namespace

KSTDSQLiteStatement::KSTDSQLiteStatement(KSTDSQLite* SQLite, const DatabaseEnvironment& environment,
                                         std::string SQL, sqlite3_stmt* handle)
    : SQLite_(SQLite), environment_(environment), SQL_(std::move(SQL)), handle_(handle) {}

KSTDSQLiteStatement::~KSTDSQLiteStatement() {
    static_cast<void>(sqlite3_finalize(handle_));
}

bool KSTDSQLiteStatement::step() {
    reset_ = false;
    const int code = sqlite3_step(handle_);
    switch (code & kPrimaryCodeMask) {
    case SQLITE_ROW:
        return true;
    case SQLITE_DONE:
        // That something could be read says nothing about a disk that is full.
        if (environment_.causes != nullptr && sqlite3_stmt_readonly(handle_) == 0) {
            environment_.causes->wrote();
        }
        return false;
    default:
        resetAfterStepError();
        logFailure(formatText("KSTDSQLite: Failed to step (%d): \"%@\"", {code, SQL_}),
                   platform::message::kDatabaseFailed);
        if (environment_.causes != nullptr) {
            environment_.causes->tell(code, sqlite3_db_handle(handle_));
        }
        return false;
    }
}

void KSTDSQLiteStatement::reset() {
    // What was bound and not stepped stays bound.
    if (reset_) {
        return;
    }
    if (sqlite3_reset(handle_) != SQLITE_OK) {
        logFailure(formatText("KSTDSQLite: Error resetting prepared statement: \"%@\"", {SQL_}));
        return;
    }
    if (clearBindings() != SQLITE_OK) {
        logFailure(
            formatText("KSTDSQLite: Error clearing prepared statement bindings: \"%@\"", {SQL_}));
        return;
    }
    temporaryBoundObjects_.clear();
    reset_ = true;
}

void KSTDSQLiteStatement::resetAfterStepError() {
    if (reset_) {
        return;
    }
    // It gives the step's error once more, which is told already.
    static_cast<void>(sqlite3_reset(handle_));
    static_cast<void>(clearBindings());
    temporaryBoundObjects_.clear();
    reset_ = true;
}

void KSTDSQLiteStatement::finalizeStatement() {
    if (!reset_) {
        // Not freed: its holder is in the middle of it, and the line brings the missing reset to
        // light.
        logFailure(formatText("KSTDSQLite: Statement not reset after last use: \"%@\"", {SQL_}));
        return;
    }
    if (sqlite3_finalize(std::exchange(handle_, nullptr)) != SQLITE_OK) {
        logFailure(formatText("KSTDSQLite: Error finalizing prepared statement: \"%@\"", {SQL_}));
    }
}

void KSTDSQLiteStatement::bindInt(std::int32_t value, int atIndex) {
    if (mayBind()) {
        checkBound(sqlite3_bind_int(handle_, parameterNumber(atIndex), value), "int", atIndex);
    }
}

void KSTDSQLiteStatement::bindInt64(std::int64_t value, int atIndex) {
    if (mayBind()) {
        checkBound(sqlite3_bind_int64(handle_, parameterNumber(atIndex), value), "int64", atIndex);
    }
}

void KSTDSQLiteStatement::bindDouble(double value, int atIndex) {
    if (mayBind()) {
        checkBound(sqlite3_bind_double(handle_, parameterNumber(atIndex), value), "double",
                   atIndex);
    }
}

void KSTDSQLiteStatement::bindBlob(const platform::Bytes* value, int atIndex) {
    if (!mayBind()) {
        return;
    }
    const int number = parameterNumber(atIndex);
    int code = SQLITE_OK;
    if (value == nullptr) {
        code = sqlite3_bind_null(handle_, number);
    } else if (value->empty()) {
        // An empty vector may have no address, which SQLite would take for NULL.
        code = sqlite3_bind_zeroblob(handle_, number, 0);
    } else {
        code = sqlite3_bind_blob64(handle_, number, value->data(), value->size(), SQLITE_STATIC);
    }
    checkBound(code, "blob", atIndex);
}

void KSTDSQLiteStatement::bindText(const std::string* value, int atIndex) {
    // Up to the first zero byte, which is also as far as it is read back.
    if (mayBind()) {
        checkBound(sqlite3_bind_text(handle_, parameterNumber(atIndex),
                                     value == nullptr ? nullptr : value->c_str(), -1,
                                     SQLITE_STATIC),
                   "text", atIndex);
    }
}

void KSTDSQLiteStatement::bindNullAtIndex(int index) {
    // Does not ask whether it may: SQLite refuses while the statement runs, and the line is this
    // one.
    if (sqlite3_bind_null(handle_, parameterNumber(index)) != SQLITE_OK) {
        logFailure("KSTDSQLite: sqlite3_bind_null error");
    }
}

void KSTDSQLiteStatement::bindValue(platform::Value value, int atIndex) {
    if (KSTDValueType::typeForValue(value).isNumber()) {
        bindNumber(value, atIndex);
    } else if (value.is<platform::Bytes>()) {
        bindBlob(retainedTemporaryBoundObject(std::move(value)).as<platform::Bytes>(), atIndex);
    } else if (const auto* const identifier = value.as<platform::UniqueIdentifier>()) {
        bindRetainedBlob({identifier->bytes.begin(), identifier->bytes.end()}, atIndex);
    } else if (value.is<std::string>()) {
        bindText(retainedTemporaryBoundObject(std::move(value)).as<std::string>(), atIndex);
    } else if (value.is<platform::Null>()) {
        bindNullAtIndex(atIndex);
    } else if (const auto* const date = value.as<platform::Timestamp>()) {
        bindDouble(date->secondsSince2001, atIndex);
    } else if (const auto* const error = value.as<platform::Error>()) {
        bindError(*error, atIndex);
    } else if (const auto* const link = value.as<platform::Link>()) {
        bindText(retainedTemporaryBoundObject(link->text).as<std::string>(), atIndex);
    } else {
        logUnbindable(value);
    }
}

void KSTDSQLiteStatement::bindValues(const platform::ValueList& values) {
    int index = 0;
    for (const platform::Value& value : values) {
        bindValue(value, index++);
    }
}

const platform::Value& KSTDSQLiteStatement::retainedTemporaryBoundObject(platform::Value value) {
    return temporaryBoundObjects_.emplace_back(std::move(value));
}

int KSTDSQLiteStatement::columnCount() const {
    return sqlite3_column_count(handle_);
}

int KSTDSQLiteStatement::columnTypeAtIndex(int index) const {
    return sqlite3_column_type(handle_, index);
}

std::string KSTDSQLiteStatement::columnNameAtIndex(int index) const {
    // Not every SQLite answers this for a null handle.
    const char* const name = handle_ == nullptr ? nullptr : sqlite3_column_name(handle_, index);
    return name == nullptr ? std::string() : name;
}

std::int32_t KSTDSQLiteStatement::intAtIndex(int index) const {
    return sqlite3_column_int(handle_, index);
}

std::int64_t KSTDSQLiteStatement::int64AtIndex(int index) const {
    return sqlite3_column_int64(handle_, index);
}

double KSTDSQLiteStatement::doubleAtIndex(int index) const {
    return sqlite3_column_double(handle_, index);
}

std::optional<platform::Bytes> KSTDSQLiteStatement::blobAtIndex(int index) const {
    const auto* const bytes = static_cast<const std::uint8_t*>(sqlite3_column_blob(handle_, index));
    if (bytes == nullptr) {
        return std::nullopt;
    }
    return platform::Bytes(bytes, bytes + sqlite3_column_bytes(handle_, index));
}

std::optional<std::span<const std::uint8_t>>
KSTDSQLiteStatement::blobBytesAtIndex(int index) const {
    // One lock of the connection for three questions. The value itself has none, which it can do
    // without: a statement belongs to one queue.
    sqlite3_value* const value = sqlite3_column_value(handle_, index);
    if (sqlite3_value_type(value) != SQLITE_BLOB) {
        return std::nullopt;
    }
    const auto* const bytes = static_cast<const std::uint8_t*>(sqlite3_value_blob(value));
    return std::span(bytes, static_cast<std::size_t>(sqlite3_value_bytes(value)));
}

std::optional<std::string> KSTDSQLiteStatement::textAtIndex(int index) const {
    const unsigned char* const text = sqlite3_column_text(handle_, index);
    if (text == nullptr) {
        return std::nullopt;
    }
    return reinterpret_cast<const char*>(text);
}

platform::Value KSTDSQLiteStatement::objectAtIndex(int index) const {
    const int type = columnTypeAtIndex(index);
    switch (type) {
    case SQLITE_INTEGER:
        return int64AtIndex(index);
    case SQLITE_FLOAT:
        return doubleAtIndex(index);
    case SQLITE_TEXT: {
        std::optional<std::string> text = textAtIndex(index);
        return text ? platform::Value(std::move(*text)) : platform::Value();
    }
    case SQLITE_BLOB:
        return blobAtIndex(index).value_or(platform::Bytes());
    case SQLITE_NULL:
        return {};
    default:
        logFailure(formatText("KSTDSQLite: Unexpected column type: %d", {type}));
        return {};
    }
}

platform::ValueList KSTDSQLiteStatement::allObjects() const {
    platform::ValueList objects;
    const int count = columnCount();
    for (int index = 0; index < count; ++index) {
        objects.push_back(objectAtIndex(index));
    }
    return objects;
}

platform::ValueMap KSTDSQLiteStatement::allObjectsByColumnName() const {
    platform::ValueMap objects;
    const int count = columnCount();
    for (int index = 0; index < count; ++index) {
        platform::Value object = objectAtIndex(index);
        if (!object.is<platform::Null>()) {
            objects.insert_or_assign(columnNameAtIndex(index), std::move(object));
        }
    }
    return objects;
}

bool KSTDSQLiteStatement::mayBind() const {
    if (!reset_) {
        logFailure(formatText("KSTDSQLite: Statement is not reset: \"%@\"", {SQL_}));
    }
    return reset_;
}

void KSTDSQLiteStatement::checkBound(int code, std::string_view kind, int index) const {
    if (code != SQLITE_OK) {
        logFailure(formatText("KSTDSQLite: Error binding %s at %ld: \"%@\"", {kind, index, SQL_}));
    }
}

void KSTDSQLiteStatement::bindNumber(const platform::Value& number, int index) {
    // A real, too, is stored as an integer, without its fraction. Files have always been written
    // so, and nothing but a date is expected to be a real in them.
    if (isBoundWith32Bits(KSTDValueType::typeForValue(number))) {
        bindInt(integerIn<std::int32_t>(number), index);
    } else {
        bindInt64(integerIn<std::int64_t>(number), index);
    }
}

void KSTDSQLiteStatement::bindRetainedBlob(platform::Bytes bytes, int index) {
    bindBlob(retainedTemporaryBoundObject(std::move(bytes)).as<platform::Bytes>(), index);
}

void KSTDSQLiteStatement::bindError(const platform::Error& error, int index) {
    platform::Result<platform::Bytes> archive = environment_.propertyLists.binary(archiveOf(error));
    if (archive) {
        bindRetainedBlob(std::move(archive).value(), index);
    } else {
        logUnbindable(error);
    }
}

int KSTDSQLiteStatement::clearBindings() {
    // Not every SQLite answers this for a null handle.
    return handle_ == nullptr ? SQLITE_OK : sqlite3_clear_bindings(handle_);
}

void KSTDSQLiteStatement::logUnbindable(const platform::Value& value) const {
    logFailure(formatText("KSTDSQLite: Can't bind object of type %@", {kindName(value)}));
}

void KSTDSQLiteStatement::logFailure(std::string_view text, std::string_view messageId) const {
    environment_.log.write(platform::LogLevel::notice, text, {.messageId = messageId});
}

} // namespace kstd
