#include "kstd/Analytics/TQAnalyticsLoggerSQLiteStore.h"

#include "base/Concat.h"
#include "kstd/Analytics/SQLite/StatementRows.h"
#include "platform/MessageClasses.h"

#include <filesystem>
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

/// Without ".", ".." and doubled separators, by the text alone.
std::string standardisedPath(const std::string& path) {
    return std::filesystem::path(path).lexically_normal().string();
}

} // namespace

std::shared_ptr<TQAnalyticsLoggerSQLiteStore>
TQAnalyticsLoggerSQLiteStore::storeWithPath(const std::string& path, const std::string& schema,
                                            const DatabaseEnvironment& environment) {
    const std::lock_guard lock(registry().mutex);
    const std::string standardised = standardisedPath(path);
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
    visitEvents([this, &events](const platform::Bytes& data) {
        if (auto event = environment().propertyLists.value(data)) {
            events.push_back(*std::move(event));
        }
    });
    return events;
}

void TQAnalyticsLoggerSQLiteStore::visitEvents(
    const std::function<void(const platform::Bytes& data)>& visitor) {
    if (!tryToOpenDatabase()) {
        return;
    }
    // One buffer for all events: a million of them is read in one go.
    platform::Bytes data;
    forEachRow(*this, base::concat("select data from ", kEventTable), {},
               [&data, &visitor](const KSTDSQLiteStatement& row) {
                   if (row.columnTypeAtIndex(0) == SQLITE_BLOB) {
                       const std::span<const std::uint8_t> bytes = row.blobBytesAtIndex(0);
                       data.assign(bytes.begin(), bytes.end());
                       visitor(data);
                   }
                   return true;
               });
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
