#include "kstd/Analytics/Analytics.h"
#include "tests/kstd/Analytics/LoggerFixture.h"

#include <filesystem>
#include <thread>

namespace kstd {
namespace {

using platform::FakeHTTPAnswer;
using platform::Timestamp;
using platform::Value;
using platform::ValueMap;
using Lines = std::vector<std::string>;
using Texts = std::vector<std::string>;

class LoggerTest : public LoggerFixture {
  protected:
    ValueMap eventDict(const ValueMap* attributes) {
        ValueMap event;
        onQueue([&] { event = logger().eventDictForEventName("event", attributes); });
        return event;
    }

    /// The only event, after `attributes` were logged.
    ValueMap logged(const ValueMap& attributes) {
        logger().logEventNamed("event", &attributes);
        return event();
    }
};

TEST_F(LoggerTest, TheBaseHasNoInstanceAndNoPath) {
    EXPECT_EQ(KSTDAnalyticsLogger::logger(fake.host()), nullptr);
    EXPECT_EQ(KSTDAnalyticsLogger::databasePath(), std::nullopt);
    EXPECT_EQ(takeLines(), Lines{"info: attempt to instatiate abstract class KSTDAnalyticsLogger"});
}

TEST_F(LoggerTest, OneInstanceOfEachClass) {
    const auto analytics = Analytics::logger(fake.host());
    EXPECT_NE(analytics, nullptr);
    EXPECT_EQ(Analytics::logger(fake.host()), analytics);
    const std::shared_ptr<KSTDAnalyticsLogger> other = TestLogger::logger(fake.host());
    EXPECT_NE(other, analytics);
    EXPECT_EQ(TestLogger::logger(fake.host()), other);
    EXPECT_EQ(takeLines(), Lines());
}

TEST_F(LoggerTest, OneInstanceForAllThreads) {
    std::vector<std::shared_ptr<Analytics>> instances(4);
    std::vector<std::thread> threads;
    for (auto& instance : instances) {
        threads.emplace_back([&] { instance = Analytics::logger(fake.host()); });
    }
    for (auto& thread : threads) {
        thread.join();
    }
    for (const auto& instance : instances) {
        EXPECT_EQ(instance, instances[0]);
    }
    EXPECT_EQ(fake.queues.names().size(), 1U);
}

TEST_F(LoggerTest, TheLifetimesEndReleasesLoggersStoresAndTheSystemsVersion) {
    setVersion("B1", "P1");
    std::weak_ptr<Analytics> first;
    std::weak_ptr<TQAnalyticsLoggerSQLiteStore> store;
    {
        const AnalyticsLifetime shorter;
        first = Analytics::logger(fake.host());
        store = TestLogger::logger(fake.host())->fields.database;
        EXPECT_FALSE(first.expired());
        EXPECT_FALSE(store.expired());
        ValueMap version;
        KSTDAnalyticsLogger::addOSVersion(version, fake.version);
    }
    EXPECT_TRUE(first.expired());
    EXPECT_TRUE(store.expired());
    setVersion("B2", "P2");
    const auto document = Analytics::logger(fake.host())->getLoggingJSON();
    ASSERT_TRUE(document);
    EXPECT_NE(document.value().view().find(R"("build":"B2")"), std::string::npos);
}

TEST_F(LoggerTest, DatabaseOfTheRestrictedModeService) {
    EXPECT_EQ(Analytics::databasePath(), "/var/root/.usbrestrictedmode_analytics_v2.db");
    static_cast<void>(Analytics::logger(fake.host()));
    EXPECT_TRUE(std::filesystem::is_regular_file(directory.path() /
                                                 "var/root/.usbrestrictedmode_analytics_v2.db"));
}

TEST_F(LoggerTest, NewLogger) {
    const auto& fields = logger().fields;
    EXPECT_EQ(fields.database->path(), databaseFile().string());
    EXPECT_EQ(fields.database->schema(),
              "CREATE TABLE IF NOT EXISTS all_events (\nid INTEGER PRIMARY KEY AUTOINCREMENT,\n"
              "timestamp REAL,data BLOB\n);\n");
    EXPECT_TRUE(fields.database->isOpen());
    EXPECT_EQ(fake.queues.names(), Texts{"com.zerva.keystrand.analytics"});
    EXPECT_EQ(fields.metricsBase, std::nullopt);
    EXPECT_EQ(fields.blacklistedEvents, std::nullopt);
    EXPECT_EQ(fields.blacklistedFields, std::nullopt);
    EXPECT_FALSE(fields.disableLogging);
    EXPECT_FALSE(fields.disableUploads);
    EXPECT_FALSE(logger().ignoreServerDisablingMessages());
    EXPECT_FALSE(logger().allowsInsecureSplunkCert());
    EXPECT_EQ(logger().extraValuesToUploadToServer(), ValueMap());
}

TEST_F(LoggerTest, EventsOfTheRestrictedModeService) {
    const auto analytics = Analytics::logger(fake.host());
    analytics->logPolicyEventWithAttributes({{"a", std::int32_t{1}}});
    analytics->logTimerRestartedEventWithAttributes({{"b", std::int32_t{2}}});
    const auto document = analytics->getLoggingJSON();
    ASSERT_TRUE(document);
    EXPECT_TRUE(document.value().view().starts_with(
        R"({"events":[{"a":1,"eventTime":1700000000000.0,"eventType":"policy"},)"
        R"({"b":2,"eventTime":1700000000000.0,"eventType":"timerRestarted"},{)"));
}

TEST_F(LoggerTest, EventWithoutAttributes) {
    machine.clock.advance(500'250'000);
    EXPECT_EQ(eventDict(nullptr),
              (ValueMap{{"eventType", "event"}, {"eventTime", 1700000000500.25}}));
    const ValueMap none;
    EXPECT_EQ(eventDict(&none), eventDict(nullptr));
}

TEST_F(LoggerTest, NumbersKeepTheirKinds) {
    const ValueMap attributes = {{"a", std::uint8_t{1}},
                                 {"b", std::uint32_t{1}},
                                 {"c", std::int32_t{1}},
                                 {"d", true},
                                 {"e", 1.0},
                                 {"f", 1.0F}};
    const ValueMap event = eventDict(&attributes);
    for (const auto& [key, value] : attributes) {
        EXPECT_EQ(event.at(key), value) << key;
    }
    EXPECT_EQ(event.size(), attributes.size() + 2);
}

TEST_F(LoggerTest, AttributesOfTheLoggersNamesAreReplaced) {
    configure("splunk_topic", "kst");
    const ValueMap attributes = {
        {"eventType", "mine"}, {"eventTime", std::int32_t{1}}, {"topic", "mine"}};
    EXPECT_EQ(eventDict(&attributes),
              (ValueMap{{"eventType", "event"}, {"eventTime", 1700000000000.0}, {"topic", "kst"}}));
}

TEST_F(LoggerTest, WithoutATopicNoEventHasOne) {
    const ValueMap attributes = {{"topic", "mine"}};
    EXPECT_EQ(eventDict(&attributes).count("topic"), 0U);
}

TEST_F(LoggerTest, BaseMetricsFillGapsOnly) {
    logger().fields.metricsBase = ValueMap{{"a", "base"},
                                           {"b", "base"},
                                           {"eventType", "base"},
                                           {"topic", "base"},
                                           {"map", ValueMap{{"x", std::int64_t{1}}}}};
    const ValueMap attributes = {{"a", "mine"}};
    EXPECT_EQ(eventDict(&attributes), (ValueMap{{"a", "mine"},
                                                {"b", "base"},
                                                {"eventType", "event"},
                                                {"eventTime", 1700000000000.0},
                                                {"topic", "base"},
                                                {"map", ValueMap{{"x", std::int64_t{1}}}}}));
}

TEST_F(LoggerTest, NullAmongTheBaseMetricsMakesEventsFail) {
    logger().fields.metricsBase = ValueMap{{"a", platform::Null()}};
    logger().logEventNamed("event", nullptr);
    EXPECT_EQ(takeLines(), Lines{"error: Couldn't serialize failure record: a property list cannot "
                                 "hold a value of the kind null"});
    EXPECT_EQ(events().size(), 0U);
    EXPECT_EQ(dueDate(), kNow + kInterval);
}

TEST_F(LoggerTest, UnwantedFieldsAreNotStored) {
    logger().fields.blacklistedFields = Texts{"build", "eventTime", "fromTheBase", "absent"};
    logger().fields.metricsBase = ValueMap{{"fromTheBase", "x"}};
    EXPECT_EQ(logged({{"build", "B"}, {"Build", "kept"}}),
              (ValueMap{{"Build", "kept"}, {"eventType", "event"}}));
}

TEST_F(LoggerTest, StrippingMakesACopy) {
    const ValueMap map = {{"a", "x"}, {"b", "y"}};
    EXPECT_EQ(logger().eventDictWithBlacklistedFieldsStrippedFrom(map), map);
    logger().fields.blacklistedFields.emplace();
    EXPECT_EQ(logger().eventDictWithBlacklistedFieldsStrippedFrom(map), map);
    logger().fields.blacklistedFields = Texts{"a", "a"};
    EXPECT_EQ(logger().eventDictWithBlacklistedFieldsStrippedFrom(map), (ValueMap{{"b", "y"}}));
    EXPECT_EQ(map.size(), 2U);
}

TEST_F(LoggerTest, EmptyNameIsAName) {
    logger().logEventNamed("", nullptr);
    EXPECT_EQ(event().at("eventType"), Value(""));
}

TEST_F(LoggerTest, ResetWithAndWithoutClearing) {
    logger().logEventNamed("event", nullptr);
    machine.clock.advance(10 * platform::kNanosecondsPerSecond);
    logger().resetUploadDate(false);
    EXPECT_EQ(events().size(), 1U);
    EXPECT_EQ(dueDate(), kNow + 10 + kInterval);
    logger().fields.secondsBetweenUploads = 1;
    logger().resetUploadDate(true);
    EXPECT_EQ(events().size(), 0U);
    EXPECT_EQ(dueDate(), kNow + 11);
}

TEST_F(LoggerTest, DatesOfASubclass) {
    EXPECT_EQ(logger().datePropertyForKey("k"), std::nullopt);
    logger().setDateProperty(Timestamp{1234.75}, "k");
    EXPECT_EQ(logger().datePropertyForKey("k"), Timestamp{1234});
    EXPECT_EQ(logger().datePropertyForKey("other"), std::nullopt);
    logger().setDateProperty(std::nullopt, "k");
    EXPECT_EQ(logger().datePropertyForKey("k"), std::nullopt);
}

/// Work of the queue that asks for the queue stops the process.
TEST_F(LoggerTest, DatesOfASubclassAreWorkOfTheQueue) {
    logger();
    EXPECT_DEATH(onQueue([this] { logger().setDateProperty(Timestamp{0}, "k"); }),
                 "com.zerva.keystrand.analytics");
    EXPECT_DEATH(onQueue([this] { static_cast<void>(logger().datePropertyForKey("k")); }),
                 "com.zerva.keystrand.analytics");
}

TEST_F(LoggerTest, DatesOfASubclassDoNotOpenTheDatabase) {
    onQueue([this] { logger().fields.database->close(); });
    logger().setDateProperty(Timestamp{1234}, "k");
    EXPECT_EQ(logger().datePropertyForKey("k"), std::nullopt);
    EXPECT_FALSE(logger().fields.database->isOpen());
    EXPECT_EQ(takeLines(), Lines(2, "notice: KSTDSQLite: Database is closed"));
}

struct Age {
    double seconds;
    int days;
};

TEST_F(LoggerTest, FuzzyDays) {
    constexpr double kDay = 86400;
    for (const Age& age : {Age{-1e9, 0},
                           {-1, 0},
                           {0, 0},
                           {kDay - 0.5, 0},
                           {kDay, 1},
                           {7 * kDay - 0.5, 1},
                           {7 * kDay, 7},
                           {30 * kDay - 0.5, 7},
                           {30 * kDay, 30},
                           {365 * kDay - 0.5, 30},
                           {365 * kDay, 365},
                           {1e12, 365}}) {
        const double now = platform::timestampOf(machine.clock.now()).secondsSince2001;
        EXPECT_EQ(KSTDAnalyticsLogger::fuzzyDaysSinceDate({now - age.seconds}, machine.clock),
                  age.days)
            << age.seconds;
    }
}

TEST_F(LoggerTest, TheSystemsVersionIsReadOnce) {
    setVersion("B1", "P1");
    ValueMap map = {{"build", "before"}, {"other", "kept"}};
    KSTDAnalyticsLogger::addOSVersion(map, fake.version);
    const ValueMap expected = {{"build", "B1"}, {"product", "P1"}, {"other", "kept"}};
    EXPECT_EQ(map, expected);
    setVersion("B2", "P2");
    KSTDAnalyticsLogger::addOSVersion(map, fake.version);
    EXPECT_EQ(map, expected);
}

TEST_F(LoggerTest, UnknownVersionStaysUnknown) {
    ValueMap map;
    KSTDAnalyticsLogger::addOSVersion(map, fake.version);
    setVersion("B1", "P1");
    KSTDAnalyticsLogger::addOSVersion(map, fake.version);
    EXPECT_EQ(map, ValueMap());
}

TEST_F(LoggerTest, HalfKnownVersion) {
    fake.version.setProduct("P1");
    ValueMap map;
    KSTDAnalyticsLogger::addOSVersion(map, fake.version);
    EXPECT_EQ(map, (ValueMap{{"product", "P1"}}));
}

/// Several may find the date passed and upload; every call returns and every document is whole.
TEST_F(LoggerTest, SeveralThreadsAtTheDueMoment) {
    configureUploadLink();
    fake.https.setAnswer("POST", kUploadLink, FakeHTTPAnswer::status(200));
    setDueDate(kNow - 1);
    std::vector<std::thread> threads;
    for (int thread = 0; thread < 4; ++thread) {
        threads.emplace_back([this] {
            for (int i = 0; i < 5; ++i) {
                setDueDate(kNow - 1);
                logger().logEventNamed("event", nullptr);
            }
        });
    }
    for (auto& thread : threads) {
        thread.join();
    }
    const auto requests = fake.https.requests();
    EXPECT_GE(requests.size(), 1U);
    EXPECT_LE(requests.size(), 20U);
    for (const auto& request : requests) {
        const auto document = fake.json.read(request.body);
        ASSERT_TRUE(document) << request.body;
        EXPECT_EQ(document.value().as<ValueMap>()->size(), 2U);
    }
}

} // namespace
} // namespace kstd
