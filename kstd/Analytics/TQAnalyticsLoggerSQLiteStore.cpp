#include "kstd/Analytics/TQAnalyticsLoggerSQLiteStore.h"

#include "base/Concat.h"
#include "base/FileNames.h"
#include "platform/MessageClasses.h"

#include <map>
#include <mutex>
#include <span>
#include <sqlite3.h>
#include <utility>

namespace kstd {
namespace {

constexpr char kUploadDateKey[] = "upload_date";

/// The stores of the process by their paths.
struct Registry {
    std::mutex mutex;
    std::map<std::string, std::shared_ptr<TQAnalyticsLoggerSQLiteStore>> stores;
};

/// Never destroyed: its stores would outlive what their environments refer to.
Registry& registry() {
    static Registry& registry = *new Registry;
    return registry;
}

} // namespace

std::shared_ptr<TQAnalyticsLoggerSQLiteStore>
TQAnalyticsLoggerSQLiteStore::storeWithPath(const std::string& path, const std::string& schema,
                                            const DatabaseEnvironment& environment) {
    const std::lock_guard lock(registry().mutex);
    const std::string standardised = base::withoutDots(path);
    std::shared_ptr<TQAnalyticsLoggerSQLiteStore>& store = registry().stores[standardised];
    if (store == nullptr) {
        // The schema of the first one counts.
        store = std::make_shared<TQAnalyticsLoggerSQLiteStore>(standardised, schema, environment);
    }
    if (!store->isOpen()) {
        store->knownDate_.reset();
    }
    platform::Error error;
    // Every time: a store that is open counts one opening more, which nobody gives back. It stays
    // open as long as the process lives.
    if (!store->openWithError(&error)) {
        store->logError(
            platform::message::kDatabaseNotOpened,
            base::concat(
                "TQAnalyticsLogger: could not open db at init, will try again later. Error: ",
                error.description));
    }
    return store;
}

void TQAnalyticsLoggerSQLiteStore::releaseStores() {
    const std::lock_guard lock(registry().mutex);
    registry().stores.clear();
}

TQAnalyticsLoggerSQLiteStore::TQAnalyticsLoggerSQLiteStore(std::string path, std::string schema,
                                                           const DatabaseEnvironment& environment)
    : KSTDSQLite(std::move(path), std::move(schema), environment) {}

bool TQAnalyticsLoggerSQLiteStore::tryToOpenDatabase() {
    if (isOpen()) {
        return true;
    }
    // Versions of another connection say nothing about the one to come.
    knownDate_.reset();
    environment().log.write(platform::LogLevel::warning,
                            "TQAnalyticsLogger: db is closed, attempting to open", {});
    platform::Error error;
    if (!openWithError(&error)) {
        logError(
            platform::message::kDatabaseNotOpened,
            base::concat("TQAnalyticsLogger: failed to open db with error ", error.description));
        return false;
    }
    return true;
}

void TQAnalyticsLoggerSQLiteStore::addEventDict(platform::ValueMap event,
                                                std::string_view toTable) {
    isDateCurrent_ = false;
    if (!tryToOpenDatabase()) {
        return;
    }
    platform::Result<platform::Bytes> data =
        environment().propertyLists.binary(platform::Value(std::move(event)));
    if (!data) {
        logError(platform::message::kEventNotStored,
                 base::concat("Couldn't serialize failure record: ", data.error().description));
        return;
    }
    platform::ValueMap row;
    row.emplace("data", std::move(data).value());
    row.emplace("timestamp", platform::timestampOf(environment().clock.now()));
    insertEvent(std::move(row), toTable);
}

void TQAnalyticsLoggerSQLiteStore::insertEvent(platform::ValueMap row, std::string_view intoTable) {
    const std::uint32_t before = version();
    // A failure is in the log and the event is lost: its sender is never held up by analytics.
    insertOrReplaceInto(intoTable, std::move(row));
    const bool isCommitted =
        sqlite3_errcode(db()) == SQLITE_OK && sqlite3_get_autocommit(db()) != 0;
    // Two steps, and somebody else has written meanwhile, perhaps another date.
    isDateCurrent_ =
        knownDate_ && knownDate_->version == before && isCommitted && version() == before + 1;
    if (isDateCurrent_) {
        knownDate_->version = before + 1;
    }
}

std::uint32_t TQAnalyticsLoggerSQLiteStore::version() const {
    std::uint32_t version = 0;
    static_cast<void>(sqlite3_file_control(db(), nullptr, SQLITE_FCNTL_DATA_VERSION, &version));
    return version;
}

platform::ValueList TQAnalyticsLoggerSQLiteStore::allEvents() {
    platform::ValueList events;
    visitEvents([this, &events](std::span<const std::uint8_t> data) {
        if (auto event = environment().propertyLists.value(data)) {
            events.push_back(*std::move(event));
        }
    });
    return events;
}

void TQAnalyticsLoggerSQLiteStore::visitEvents(
    const std::function<void(std::span<const std::uint8_t> data)>& visitor) {
    if (!tryToOpenDatabase()) {
        return;
    }
    StoredEventCursor events(*this);
    while (const auto data = events.next()) {
        visitor(*data);
    }
}

StoredEventCursor::StoredEventCursor(TQAnalyticsLoggerSQLiteStore& store)
    : statement_(store.statementForSQL(base::concat("select data from ", kEventTable))) {}

StoredEventCursor::~StoredEventCursor() {
    if (statement_ != nullptr) {
        statement_->reset();
    }
}

std::optional<std::span<const std::uint8_t>> StoredEventCursor::next() {
    while (statement_ != nullptr && statement_->step()) {
        if (const auto event = statement_->blobBytesAtIndex(0)) {
            return event;
        }
    }
    return std::nullopt;
}

UnchangingEvents::UnchangingEvents(TQAnalyticsLoggerSQLiteStore& store)
    : store_(store), hasBegun_(store.executeSQL("begin")) {}

UnchangingEvents::~UnchangingEvents() {
    if (hasBegun_) {
        store_.end();
    }
}

void UnchangingEvents::releasePages() {
    static_cast<void>(sqlite3_db_release_memory(store_.db()));
}

std::optional<platform::Timestamp> TQAnalyticsLoggerSQLiteStore::uploadDate() {
    return tryToOpenDatabase() ? datePropertyForKey(kUploadDateKey) : std::nullopt;
}

std::optional<platform::Timestamp> TQAnalyticsLoggerSQLiteStore::uploadDateAfterAdding() {
    if (!std::exchange(isDateCurrent_, false)) {
        knownDate_.reset();
        if (const auto date = uploadDate()) {
            knownDate_ = {*date, version()};
        }
    }
    return knownDate_ ? std::optional(knownDate_->date) : std::nullopt;
}

void TQAnalyticsLoggerSQLiteStore::setUploadDate(const std::optional<platform::Timestamp>& date) {
    if (tryToOpenDatabase()) {
        setDateProperty(date, kUploadDateKey);
    }
}

void TQAnalyticsLoggerSQLiteStore::logError(std::string_view messageId,
                                            std::string_view text) const {
    environment().log.write(platform::LogLevel::error, text, {.messageId = messageId});
}

void TQAnalyticsLoggerSQLiteStore::clearAllData() {
    if (tryToOpenDatabase()) {
        // All rows: a deletion wants a clause. Not a new table, because identifiers are never used
        // twice.
        deleteFrom(kEventTable, "id >= 0", {});
    }
}

} // namespace kstd
