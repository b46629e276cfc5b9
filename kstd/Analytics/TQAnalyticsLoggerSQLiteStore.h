#pragma once

#include "kstd/Analytics/SQLite/KSTDSQLite.h"
#include "platform/Date.h"
#include "platform/Value.h"
#include "platform/ValueSink.h"

#include <cstdint>
#include <functional>
#include <memory>
#include <optional>
#include <span>
#include <string>
#include <string_view>

namespace kstd {

/// The analytics events that wait for upload, one store for each database file in the process.
///
/// A store whose file could not be opened stays closed; every operation tries to open it first, so
/// it recovers once the cause is gone. All operations but storeWithPath belong to the serial queue
/// of the store's logger.
class TQAnalyticsLoggerSQLiteStore final : public KSTDSQLite {
  public:
    /// The store for that path, opened once more by every call. Made by the first call for the
    /// path, with that call's schema and environment. From any thread.
    [[nodiscard]] static std::shared_ptr<TQAnalyticsLoggerSQLiteStore>
    storeWithPath(const std::string& path, const std::string& schema,
                  const DatabaseEnvironment& environment);

    /// Forgets all stores: what their environments refer to is about to go.
    static void releaseStores();

    TQAnalyticsLoggerSQLiteStore(std::string path, std::string schema,
                                 const DatabaseEnvironment& environment);

    /// Whether the database is open after the call.
    bool tryToOpenDatabase();

    /// Adds one row, with the current time. An event that cannot be kept is dropped with a line.
    void addEventDict(platform::ValueMap event, std::string_view toTable);

    /// All events in the order in which they came. A row that holds none is left out.
    [[nodiscard]] platform::ValueList allEvents();

    /// Hands the stored form of each event to `visitor`, in the order in which they came. The
    /// visitor uses the store for nothing.
    void visitEvents(const std::function<void(std::span<const std::uint8_t> data)>& visitor);

    [[nodiscard]] std::optional<platform::Timestamp> uploadDate();
    /// The upload date right after the last adding: as it was read before, if that was the only
    /// writing to the database since then, by whichever process; else read now.
    [[nodiscard]] std::optional<platform::Timestamp> uploadDateAfterAdding();
    /// None removes it.
    void setUploadDate(const std::optional<platform::Timestamp>& date);

    /// Deletes every event. The upload date stays.
    void clearAllData();

    /// Never filled: null.
    [[nodiscard]] std::shared_ptr<const platform::ValueList> failureRecords() const {
        return failureRecords_;
    }

  private:
    /// An upload date, and the version of the database for which it holds.
    struct KnownDate {
        platform::Timestamp date;
        std::uint32_t version = 0;
    };

    void logError(std::string_view messageId, std::string_view text) const;
    /// Grows by one with each transaction of this connection that writes, and when one begins after
    /// other connections have written.
    [[nodiscard]] std::uint32_t version() const;
    void insertEvent(platform::ValueMap row, std::string_view intoTable);

    std::optional<KnownDate> knownDate_;
    /// Whether that is the date right after the last adding.
    bool isDateCurrent_ = false;

    const std::shared_ptr<const platform::ValueList> failureRecords_;
};

/// The stored form of one event after the other, in the order in which they came. Only one at a
/// time goes over an open store; nothing else reads its events meanwhile, and nothing writes.
class StoredEventCursor : private base::NotCopied {
  public:
    explicit StoredEventCursor(TQAnalyticsLoggerSQLiteStore& store);
    ~StoredEventCursor();

    /// None after the last one. What it points to lasts until the next call.
    [[nodiscard]] std::optional<std::span<const std::uint8_t>> next();

  private:
    std::shared_ptr<KSTDSQLiteStatement> statement_;
};

/// While it is there, everybody who goes over an open store finds the same events, those of the
/// first look, whatever other processes add. It also keeps SQLite from holding the pages that were
/// read.
class UnchangingEvents : private base::NotCopied {
  public:
    explicit UnchangingEvents(TQAnalyticsLoggerSQLiteStore& store);
    ~UnchangingEvents();

    /// Frees what SQLite keeps of the pages that were read: each is read once only.
    void releasePages();

  private:
    TQAnalyticsLoggerSQLiteStore& store_;
    bool hasBegun_;
};

/// The table of the events, and the text that makes it. A changed text rebuilds the database.
inline constexpr char kEventTable[] = "all_events";
inline constexpr char kEventSchema[] =
    "CREATE TABLE IF NOT EXISTS all_events (\nid INTEGER PRIMARY KEY AUTOINCREMENT,\n"
    "timestamp REAL,data BLOB\n);\n";

} // namespace kstd
