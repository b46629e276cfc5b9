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
    // A failure is in the log and the event is lost: its sender is never held up by analytics.
    insertOrReplaceInto(toTable, std::move(row));
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
