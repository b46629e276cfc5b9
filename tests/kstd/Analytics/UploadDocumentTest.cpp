#include "kstd/Analytics/UploadDocument.h"

#include "tests/kstd/Analytics/LoggerFixture.h"
#include "tests/support/HostWith.h"

#include <gmock/gmock.h>

#include <filesystem>
#include <sqlite3.h>

namespace kstd {
namespace {

using platform::FakeHTTPAnswer;
using platform::ValueMap;

/// Calls something before each reading of a property list.
class WatchedPropertyLists final : public platform::PropertyLists {
  public:
    explicit WatchedPropertyLists(platform::PropertyLists& real) : real_(real) {}

    [[nodiscard]] platform::Result<platform::Bytes> binary(const platform::Value& value) override {
        return real_.binary(value);
    }
    [[nodiscard]] bool read(std::span<const std::uint8_t> data,
                            platform::ValueSink& sink) override {
        ++readings;
        if (onRead) {
            onRead(readings);
        }
        return real_.read(data, sink);
    }

    std::function<void(int)> onRead;
    int readings = 0;

  private:
    platform::PropertyLists& real_;
};

class UploadDocumentTest : public LoggerFixture {
  protected:
    UploadDocumentTest() {
        configureUploadLink();
        fake.https.setAnswer("POST", kUploadLink, FakeHTTPAnswer::status(200));
    }

    TestLogger& logger() {
        if (watched_ == nullptr) {
            watched_ = TestLogger::logger(
                support::hostWith(fake.host(), {.propertyLists = &propertyLists}));
        }
        return *watched_;
    }

    void store(int count) {
        logger().splunkLoggingQueue().sync([&] {
            logger().fields.database->begin();
            for (int number = 0; number < count; ++number) {
                logger().fields.database->addEventDict(
                    {{"eventType", "policy"}, {"number", std::int64_t{number}}}, kEventTable);
            }
            logger().fields.database->end();
        });
    }

    [[nodiscard]] std::string document() {
        const auto document = logger().getLoggingJSON();
        return document ? std::string(document.value().view()) : std::string();
    }

    bool upload() {
        std::optional<platform::Error> error;
        const bool isUploaded = logger().forceUploadWithError(&error);
        EXPECT_EQ(error, std::nullopt);
        return isUploaded;
    }

    [[nodiscard]] int countEvents() {
        int count = 0;
        logger().splunkLoggingQueue().sync(
            [&] { logger().fields.database->visitEvents([&count](auto /*data*/) { ++count; }); });
        return count;
    }

    /// As another process would.
    void storeFromElsewhere() {
        sqlite3* elsewhere = nullptr;
        ASSERT_EQ(
            sqlite3_open_v2(databaseFile().c_str(), &elsewhere, SQLITE_OPEN_READWRITE, nullptr),
            SQLITE_OK);
        ASSERT_EQ(sqlite3_exec(elsewhere,
                               "insert into all_events (data) select data from all_events limit 1",
                               nullptr, nullptr, nullptr),
                  SQLITE_OK);
        ASSERT_EQ(sqlite3_close(elsewhere), SQLITE_OK);
    }

    static constexpr int kEvents = 5000;
    /// So many take about a piece.
    static constexpr int kEventsInPiece = 1801;

    WatchedPropertyLists propertyLists{fake.propertyLists};

  private:
    std::shared_ptr<TestLogger> watched_;
};

TEST_F(UploadDocumentTest, WhatIsSentAreTheBytesOfTheDocumentAtAnySize) {
    store(kEventsInPiece - 50);
    bool wasInOnePiece = false;
    bool wasInMore = false;
    for (int count = kEventsInPiece - 50; count < kEventsInPiece + 50; count += 7) {
        const std::string expected = document();
        propertyLists.readings = 0;
        fake.https.setAnswer("POST", kUploadLink, FakeHTTPAnswer::status(503));
        EXPECT_FALSE(upload());
        ASSERT_TRUE(fake.https.requests().back().body == expected) << expected.size();
        const bool isInOnePiece = propertyLists.readings == count;
        EXPECT_TRUE(isInOnePiece || propertyLists.readings == 2 * count) << propertyLists.readings;
        EXPECT_LE(isInOnePiece, expected.size() < UploadDocument::kPieceSize + 200);
        (isInOnePiece ? wasInOnePiece : wasInMore) = true;
        store(7);
    }
    EXPECT_TRUE(wasInOnePiece);
    EXPECT_TRUE(wasInMore);
}

TEST_F(UploadDocumentTest, EventsAreGoneWhenTheDocumentWasTaken) {
    store(kEvents);
    EXPECT_TRUE(upload());
    EXPECT_EQ(countEvents(), 0);
    EXPECT_THAT(takeLines().back(), testing::StartsWith("debug: uploading oracle statistics: {"));
    EXPECT_TRUE(upload()) << "the store can be written and read again";
}

TEST_F(UploadDocumentTest, TheLogShowsTheBeginning) {
    store(kEvents);
    const std::string expected = document();
    EXPECT_TRUE(upload());
    EXPECT_EQ(takeLines().back(), "debug: uploading oracle statistics: " +
                                      expected.substr(0, UploadDocument::kBeginningSize));
}

TEST_F(UploadDocumentTest, WhatIsAddedMeanwhileIsNotInIt) {
    store(kEvents);
    const std::string expected = document();
    propertyLists.readings = 0;
    propertyLists.onRead = [this](int reading) {
        if (reading == 2 || reading == kEvents + 2) {
            storeFromElsewhere();
        }
    };
    fake.https.setAnswer("POST", kUploadLink, FakeHTTPAnswer::status(503));
    EXPECT_FALSE(upload());
    EXPECT_TRUE(fake.https.requests().back().body == expected);
    EXPECT_EQ(countEvents(), kEvents + 2);
}

TEST_F(UploadDocumentTest, WhatCannotBeReadASecondTimeEndsTheUpload) {
    store(kEvents);
    logger();
    fake.log.clear();
    propertyLists.onRead = [this](int reading) {
        if (reading == kEvents + 3) {
            fake.propertyLists.failNextRead();
        }
    };
    EXPECT_FALSE(upload());
    EXPECT_EQ(takeLines(), (Lines{"info: Splunk upload start",
                                  "error: Error in uploading the events to splunk: transfer "
                                  "failed: the body cannot be read"}));
    propertyLists.onRead = nullptr;
    EXPECT_EQ(countEvents(), kEvents);
    EXPECT_TRUE(upload());
}

TEST_F(UploadDocumentTest, MemoryDoesNotGrowWithTheEvents) {
    store(8 * kEvents);
    logger().splunkLoggingQueue().sync([&] {
        TQAnalyticsLoggerSQLiteStore& store = *logger().fields.database;
        sqlite3_db_release_memory(store.db());
        const sqlite3_int64 before = sqlite3_memory_used();
        sqlite3_memory_highwater(1);
        UploadDocument document(fake.json, propertyLists, store, {}, 0);
        ASSERT_EQ(document.measure(), std::nullopt);
        std::uint64_t given = 0;
        while (given < document.size()) {
            const std::string_view piece = document.next(~std::size_t{0});
            ASSERT_FALSE(piece.empty());
            ASSERT_LE(piece.size(), UploadDocument::kPieceSize + 200);
            given += piece.size();
        }
        EXPECT_EQ(given, document.size());
        EXPECT_GT(given, 1024U * 1024);
        EXPECT_TRUE(document.next(1).empty());
        EXPECT_LE(sqlite3_memory_highwater(0) - before, 256 * 1024);
    });
}

} // namespace
} // namespace kstd
