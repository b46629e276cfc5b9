#pragma once

#include "kstd/Analytics/TQAnalyticsLoggerSQLiteStore.h"
#include "tests/kstd/Analytics/SQLite/DatabaseFixture.h"

namespace kstd {

class EventStoreFixture : public DatabaseFixture {
  protected:
    using Store = std::shared_ptr<TQAnalyticsLoggerSQLiteStore>;

    /// The doubles go before the process does.
    ~EventStoreFixture() override { TQAnalyticsLoggerSQLiteStore::releaseStores(); }

    [[nodiscard]] Store storeAt(const std::string& file) {
        return TQAnalyticsLoggerSQLiteStore::storeWithPath(file, kEventSchema, environment);
    }
    [[nodiscard]] Store makeStore() { return storeAt(path); }

    [[nodiscard]] static platform::ValueMap event(std::int64_t number) {
        return {{"eventType", "policy"}, {"number", number}};
    }

    [[nodiscard]] Texts linesAtOpening(const std::string& error) const {
        return {"TQAnalyticsLogger: could not open db at init, will try again later. Error: " +
                error};
    }
    [[nodiscard]] Texts linesWhenClosed(const std::string& error) const {
        return {"TQAnalyticsLogger: db is closed, attempting to open",
                "TQAnalyticsLogger: failed to open db with error " + error};
    }
    /// The lines when it was closed and could be opened.
    [[nodiscard]] Texts lineOfRecovery() const {
        return {"TQAnalyticsLogger: db is closed, attempting to open"};
    }

    static constexpr char kInsertText[] =
        "insert or replace into all_events (data,timestamp) values (?,?)";
};

} // namespace kstd
