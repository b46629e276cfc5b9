#include "kstd/Analytics/SQLite/StatementRows.h"
#include "tests/kstd/Analytics/EventStoreFixture.h"

#include <sqlite3.h>
#include <thread>

namespace kstd {
namespace {

using platform::Timestamp;
using platform::ValueList;
using platform::ValueMap;

class EventStoreTest : public EventStoreFixture {
  protected:
    [[nodiscard]] static Texts storedEvents(TQAnalyticsLoggerSQLiteStore& store) {
        Texts events;
        store.visitEvents([&events](std::span<const std::uint8_t> data) {
            events.emplace_back(data.begin(), data.end());
        });
        return events;
    }
};

/// A store with an upload date, which counts how often it reads it.
class UploadDateTest : public EventStoreFixture {
  protected:
    UploadDateTest() {
        store->setUploadDate(kDate);
        sqlite3_trace_v2(
            store->db(), SQLITE_TRACE_STMT,
            [](unsigned, void* test, void* /*statement*/, void* text) {
                if (std::string_view(static_cast<const char*>(text)).starts_with("select value")) {
                    ++static_cast<UploadDateTest*>(test)->readings;
                }
                return 0;
            },
            this);
    }

    /// Adds an event, and gives the date then.
    std::optional<Timestamp> dateAfterAdding(std::string_view toTable = kEventTable) {
        store->addEventDict(event(1), toTable);
        return store->uploadDateAfterAdding();
    }

    static constexpr Timestamp kDate{1000};
    static constexpr Timestamp kOtherDate{2000};
    static constexpr char kSetOtherDate[] =
        "update Properties set value = '2001-01-01T00:33:20Z' where key = 'upload_date'";

    const Store store = makeStore();
    int readings = 0;
};

TEST_F(UploadDateTest, IsReadOnceAsLongAsNothingButEventsIsWritten) {
    for (int i = 0; i < 3; ++i) {
        EXPECT_EQ(dateAfterAdding(), kDate);
        EXPECT_EQ(readings, 1);
    }
    // By itself it is always read.
    EXPECT_EQ(store->uploadDate(), kDate);
    EXPECT_EQ(readings, 2);
    // Once for each adding: the next one may have been changed since.
    EXPECT_EQ(dateAfterAdding(), kDate);
    EXPECT_EQ(readings, 2);
    EXPECT_EQ(store->uploadDateAfterAdding(), kDate);
    EXPECT_EQ(readings, 3);
}

TEST_F(UploadDateTest, IsReadAgainWhenAnotherProcessHasWritten) {
    EXPECT_EQ(dateAfterAdding(), kDate);
    OtherConnection other(path);
    EXPECT_EQ(other.run(kSetOtherDate), SQLITE_OK);
    EXPECT_EQ(dateAfterAdding(), kOtherDate);
    EXPECT_EQ(readings, 2);
    EXPECT_EQ(dateAfterAdding(), kOtherDate);
    EXPECT_EQ(readings, 2);
    EXPECT_EQ(other.run("delete from Properties where key = 'upload_date'"), SQLITE_OK);
    for (int i = 0; i < 2; ++i) {
        EXPECT_EQ(dateAfterAdding(), std::nullopt);
        EXPECT_EQ(readings, 3 + i);
    }
    EXPECT_EQ(other.run("insert into Properties values ('upload_date', '2001-01-01T00:33:20Z')"),
              SQLITE_OK);
    EXPECT_EQ(dateAfterAdding(), kOtherDate);
    EXPECT_EQ(other.run("delete from all_events"), SQLITE_OK);
    EXPECT_EQ(dateAfterAdding(), kOtherDate);
    EXPECT_EQ(readings, 6);
}

TEST_F(UploadDateTest, IsReadAgainWhenThisProcessHasWritten) {
    EXPECT_EQ(dateAfterAdding(), kDate);
    store->setUploadDate(kOtherDate);
    EXPECT_EQ(dateAfterAdding(), kOtherDate);
    store->setDateProperty(kDate, "upload_date");
    EXPECT_EQ(dateAfterAdding(), kDate);
    store->clearAllData();
    EXPECT_EQ(dateAfterAdding(), kDate);
    EXPECT_EQ(readings, 4);
}

TEST_F(UploadDateTest, IsReadAgainWhenTheEventWasNotAdded) {
    EXPECT_EQ(dateAfterAdding(), kDate);
    EXPECT_EQ(dateAfterAdding("no_table"), kDate);
    EXPECT_EQ(readings, 2);
    // Nor is a date from elsewhere taken for the event.
    OtherConnection other(path);
    EXPECT_EQ(other.run("create trigger full before insert on all_events "
                        "begin select raise(abort, 'full'); end"),
              SQLITE_OK);
    EXPECT_EQ(dateAfterAdding(), kDate);
    EXPECT_EQ(other.run(kSetOtherDate), SQLITE_OK);
    EXPECT_EQ(dateAfterAdding(), kOtherDate);
    store->addEventDict({{"unfit", platform::Value()}}, kEventTable);
    EXPECT_EQ(store->uploadDateAfterAdding(), kOtherDate);
    EXPECT_EQ(readings, 5);
}

TEST_F(UploadDateTest, IsReadAgainBehindAnEventThatNobodyAskedAbout) {
    EXPECT_EQ(dateAfterAdding(), kDate);
    store->addEventDict(event(1), kEventTable);
    EXPECT_EQ(OtherConnection(path).run(kSetOtherDate), SQLITE_OK);
    store->addEventDict({{"unfit", platform::Value()}}, kEventTable);
    EXPECT_EQ(store->uploadDateAfterAdding(), kOtherDate);
}

TEST_F(UploadDateTest, IsReadAgainInATransaction) {
    EXPECT_EQ(dateAfterAdding(), kDate);
    OtherConnection other(path);
    EXPECT_EQ(other.run(kSetOtherDate), SQLITE_OK);
    store->executeSQL("begin");
    EXPECT_EQ(dateAfterAdding(), kOtherDate);
    EXPECT_EQ(dateAfterAdding(), kOtherDate);
    store->end();
    EXPECT_EQ(dateAfterAdding(), kOtherDate);
    EXPECT_EQ(readings, 4);
}

TEST_F(UploadDateTest, IsReadAgainFromAnotherConnection) {
    for (const bool isFoundAnew : {false, true}) {
        EXPECT_EQ(dateAfterAdding(), kDate);
        const std::uint64_t openings = store->openCount();
        for (std::uint64_t i = 0; i < openings; ++i) {
            store->close();
        }
        {
            OtherConnection other(path);
            EXPECT_EQ(other.run(kSetOtherDate), SQLITE_OK);
        }
        if (isFoundAnew) {
            static_cast<void>(makeStore());
        }
        EXPECT_EQ(dateAfterAdding(), kOtherDate);
        store->setUploadDate(kDate);
    }
}

TEST_F(EventStoreTest, SchemaHasItsHash) {
    EXPECT_EQ(makeStore()->schemaVersion(),
              "E524AEABD6006CCF317D8822426FBB8216B6003E7441046B55B0B9CE564D7EEE");
}

TEST_F(EventStoreTest, OneStoreForAllSpellingsOfAPath) {
    const std::string base = directory.path().string();
    const Store store = storeAt(base + "/a/b/../b/x.db");
    EXPECT_EQ(store->path(), base + "/a/b/x.db");
    EXPECT_TRUE(std::filesystem::exists(base + "/a/b/x.db"));
    EXPECT_EQ(storeAt(base + "/a/b/x.db"), store);
    EXPECT_EQ(storeAt(base + "/a//./b///x.db"), store);
    EXPECT_NE(storeAt(base + "/a/x.db"), store);
    EXPECT_EQ(store->openCount(), 3U);
    EXPECT_EQ(lines(), Texts());
}

TEST_F(EventStoreTest, FirstSchemaStays) {
    const Store store = makeStore();
    const Store again =
        TQAnalyticsLoggerSQLiteStore::storeWithPath(path, "create table other (x);", environment);
    EXPECT_EQ(again, store);
    EXPECT_EQ(store->schema(), kEventSchema);
}

TEST_F(EventStoreTest, ReleasedStoresAreMadeAnew) {
    std::weak_ptr<TQAnalyticsLoggerSQLiteStore> released = makeStore();
    static_cast<void>(makeStore());
    TQAnalyticsLoggerSQLiteStore::releaseStores();
    EXPECT_TRUE(released.expired());
    EXPECT_FALSE(std::filesystem::exists(path + "-wal"));
    EXPECT_EQ(makeStore()->openCount(), 1U);
    EXPECT_EQ(lines(), Texts());
}

TEST_F(EventStoreTest, ManyThreadsGetOneStore) {
    constexpr std::size_t kThreads = 8;
    std::vector<Store> stores(kThreads);
    std::vector<std::thread> threads;
    for (Store& store : stores) {
        threads.emplace_back([this, &store] { store = makeStore(); });
    }
    for (std::thread& thread : threads) {
        thread.join();
    }
    EXPECT_EQ(stores, std::vector<Store>(kThreads, stores.front()));
    EXPECT_EQ(stores.front()->openCount(), kThreads);
}

TEST_F(EventStoreTest, EventIsOneRowWithTheTimeAndAPropertyList) {
    const Store store = makeStore();
    clock.advance(500'000'000);
    store->addEventDict(event(7), kEventTable);
    OtherConnection other(path);
    EXPECT_EQ(other.rows("select id, typeof(timestamp), timestamp, typeof(data), "
                         "substr(cast(data as text), 1, 8) from all_events"),
              Texts{"1|real|721692800.5|blob|bplist00"});
    EXPECT_EQ(store->statementsBySQL().count(kInsertText), 1U);
    EXPECT_EQ(store->allEvents(), ValueList{event(7)});
    EXPECT_EQ(lines(), Texts());
}

TEST_F(EventStoreTest, EventsComeInTheOrderInWhichTheyWereAdded) {
    const Store store = makeStore();
    EXPECT_EQ(store->allEvents(), ValueList());
    ValueList expected;
    for (std::int64_t i = 0; i < 300; ++i) {
        store->addEventDict(event(i), kEventTable);
        expected.emplace_back(event(i));
    }
    EXPECT_EQ(store->allEvents(), expected);
    EXPECT_EQ(store->statementsBySQL().count("select data from all_events"), 1U);
    EXPECT_EQ(lines(), Texts());
}

TEST_F(EventStoreTest, EventsSurviveTheProcess) {
    makeStore()->addEventDict(event(1), kEventTable);
    TQAnalyticsLoggerSQLiteStore::releaseStores();
    clock.advance(1);
    EXPECT_EQ(makeStore()->allEvents(), ValueList{event(1)});
    EXPECT_EQ(lines(), Texts());
}

/// What a power cut may take is what was logged since then.
TEST_F(EventStoreTest, LogIsSyncedWhenItIsWorkedIntoTheFileAndThatEveryThousandPages) {
    const Store store = makeStore();
    const auto valueOf = [&store](const std::string& pragma) {
        std::int64_t value = -1;
        forEachRow(*store, "pragma " + pragma, {}, [&value](const KSTDSQLiteStatement& row) {
            value = row.int64AtIndex(0);
            return true;
        });
        return value;
    };
    EXPECT_EQ(valueOf("synchronous"), 1);
    EXPECT_EQ(valueOf("wal_autocheckpoint"), 1000);
    store->addEventDict(event(1), kEventTable);
    EXPECT_GT(std::filesystem::file_size(path + "-wal"), 0U);
}

TEST_F(EventStoreTest, EventThatCannotBeExpressedIsDroppedWithALine) {
    const Store store = makeStore();
    propertyLists.failNextBinary({platform::kGenericErrorDomain, 0, "the reason"});
    store->addEventDict(event(1), kEventTable);
    EXPECT_EQ(lines(), Texts{"Couldn't serialize failure record: the reason"});
    store->addEventDict({{"nothing", platform::Null()}}, kEventTable);
    const platform::Result<platform::Bytes> refused =
        propertyLists.binary(ValueMap{{"nothing", platform::Null()}});
    ASSERT_FALSE(refused);
    EXPECT_EQ(lines(), Texts{"Couldn't serialize failure record: " + refused.error().description});
    EXPECT_EQ(store->allEvents(), ValueList());
    store->addEventDict(event(2), kEventTable);
    EXPECT_EQ(store->allEvents(), ValueList{event(2)});
}

TEST_F(EventStoreTest, RowsThatHoldNoEventAreLeftOut) {
    const Store store = makeStore();
    store->addEventDict(event(1), kEventTable);
    ASSERT_EQ(OtherConnection(path).run(
                  "insert into all_events (data) values (null), (x''), (x'00ff'), ('text'), (5)"),
              SQLITE_OK);
    store->addEventDict(event(2), kEventTable);
    EXPECT_EQ(store->allEvents(), (ValueList{event(1), event(2)}));
    const Texts stored = storedEvents(*store);
    ASSERT_EQ(stored.size(), 4U);
    EXPECT_EQ(stored[1], "");
    EXPECT_EQ(stored[2], std::string("\0\xff", 2));
    EXPECT_EQ(lines(), Texts());
}

TEST_F(EventStoreTest, ThrowingVisitorLeavesTheStoreUsable) {
    const Store store = makeStore();
    store->addEventDict(event(1), kEventTable);
    EXPECT_THROW(store->visitEvents([](std::span<const std::uint8_t> /*data*/) { throw 1; }), int);
    EXPECT_EQ(store->allEvents(), ValueList{event(1)});
    store->clearAllData();
    EXPECT_EQ(store->allEvents(), ValueList());
    EXPECT_EQ(lines(), Texts());
}

TEST_F(EventStoreTest, TransactionOfSomebodyElseIsNotEnded) {
    const Store store = makeStore();
    { const UnchangingEvents events(*store); }
    EXPECT_EQ(lines(), Texts());
    store->begin();
    { const UnchangingEvents events(*store); }
    static_cast<void>(lines());
    EXPECT_EQ(sqlite3_get_autocommit(store->db()), 0);
    store->end();
    EXPECT_EQ(lines(), Texts());
}

TEST_F(EventStoreTest, AnotherTableTakesEventsToo) {
    const Store store = makeStore();
    ASSERT_TRUE(store->executeSQL("create table more (data, timestamp)"));
    store->addEventDict(event(1), "more");
    EXPECT_EQ(OtherConnection(path).one("select count(*) from more"), "1");
    store->addEventDict(event(1), "none");
    EXPECT_EQ(lines(), Texts{"Error preparing statement: insert or replace into none "
                             "(data,timestamp) values (?,?)"});
    EXPECT_EQ(store->allEvents(), ValueList());
}

TEST_F(EventStoreTest, UploadDateIsAProperty) {
    const Store store = makeStore();
    EXPECT_EQ(store->uploadDate(), std::nullopt);
    store->setUploadDate(Timestamp{721'692'800.75});
    EXPECT_EQ(OtherConnection(path).property("upload_date"), "2023-11-14T22:13:20Z");
    EXPECT_EQ(store->uploadDate(), Timestamp{721'692'800});
    store->setProperty("next week", "upload_date");
    EXPECT_EQ(store->uploadDate(), std::nullopt);
    store->setUploadDate(std::nullopt);
    EXPECT_EQ(OtherConnection(path).rows("select key from Properties where key = 'upload_date'"),
              Texts());
    EXPECT_EQ(lines(), Texts());
}

TEST_F(EventStoreTest, ClearingKeepsTheUploadDateAndTheNumbers) {
    const Store store = makeStore();
    store->setUploadDate(Timestamp{0});
    for (const std::int64_t i : {1, 2, 3}) {
        store->addEventDict(event(i), kEventTable);
    }
    store->clearAllData();
    EXPECT_EQ(store->allEvents(), ValueList());
    EXPECT_EQ(store->uploadDate(), Timestamp{0});
    EXPECT_EQ(store->statementsBySQL().count("delete from all_events where id >= 0"), 1U);
    store->clearAllData();
    store->addEventDict(event(4), kEventTable);
    EXPECT_EQ(OtherConnection(path).rows("select id from all_events"), Texts{"4"});
}

TEST_F(EventStoreTest, FailureRecordsStayNull) {
    const Store store = makeStore();
    propertyLists.failNextBinary({platform::kGenericErrorDomain, 0, "the reason"});
    store->addEventDict(event(1), kEventTable);
    EXPECT_EQ(store->failureRecords(), nullptr);
}

TEST_F(EventStoreTest, RebuiltStoreIsEmptyAndUsable) {
    {
        OtherConnection older(path);
        ASSERT_EQ(older.run("create table Properties (key text primary key, value text);"
                            "insert into Properties values ('SchemaVersion', 'older');"
                            "create table all_events (id integer primary key autoincrement, x);"
                            "insert into all_events (x) values (1)"),
                  SQLITE_OK);
    }
    const Store store = makeStore();
    EXPECT_EQ(lines(),
              Texts{"KSTDSQLite: Error executing SQL: \"drop table sqlite_sequence\" (1)"});
    EXPECT_TRUE(store->hasMigrated());
    EXPECT_EQ(store->allEvents(), ValueList());
    store->addEventDict(event(1), kEventTable);
    EXPECT_EQ(store->allEvents(), ValueList{event(1)});
    EXPECT_EQ(OtherConnection(path).one("select id from all_events"), "1");
}

int countInsert(void* count, int action, const char* /*a*/, const char* /*b*/, const char* /*c*/,
                const char* /*d*/) {
    if (action == SQLITE_INSERT || action == SQLITE_SELECT) {
        ++*static_cast<int*>(count);
    }
    return SQLITE_OK;
}

TEST_F(EventStoreTest, NoStatementIsPreparedTwice) {
    const Store store = makeStore();
    int prepared = 0;
    ASSERT_EQ(sqlite3_set_authorizer(store->db(), countInsert, &prepared), SQLITE_OK);
    const auto logOne = [&store](std::int64_t number) {
        store->addEventDict(event(number), kEventTable);
        static_cast<void>(store->uploadDate());
        static_cast<void>(store->allEvents());
    };
    logOne(0);
    const int afterOne = prepared;
    EXPECT_GT(afterOne, 0);
    for (std::int64_t i = 1; i < 50; ++i) {
        logOne(i);
    }
    EXPECT_EQ(prepared, afterOne);
}

} // namespace
} // namespace kstd
