#include "tests/kstd/Analytics/LoggerFixture.h"
#include "tests/support/HostWith.h"

#include <filesystem>
#include <thread>

namespace kstd {
namespace {

using platform::FakeHTTPAnswer;
using platform::Value;
using platform::ValueMap;
using Lines = std::vector<std::string>;

constexpr char kStart[] = "info: Splunk upload start";
constexpr char kChallenged[] = "info: Splunk upload challenge";
constexpr char kSuccess[] = "info: Splunk upload success";
constexpr char kBagInstead[] =
    "error: failed to get a splunk upload endpoint - using bag URL instead";

/// The text of an upload without events, at the time at which the clock starts.
constexpr char kEmptyDocument[] =
    R"({"events":[{"eventTime":1700000000000.0,"eventType":"accumulatedPolicyStats",)"
    R"("topic":null}],"postTime":1700000000000.0})";

class UploadTest : public LoggerFixture {
  protected:
    std::string document() {
        const auto document = logger().getLoggingJSON();
        EXPECT_TRUE(document);
        return document ? std::string(document.value().view()) : std::string();
    }

    bool upload() {
        std::optional<platform::Error> error;
        const bool isUploaded = logger().forceUploadWithError(&error);
        EXPECT_EQ(error, std::nullopt);
        return isUploaded;
    }

    void answerUploads(const FakeHTTPAnswer& answer) {
        configureUploadLink();
        fake.https.setAnswer("POST", kUploadLink, answer);
        logger();
    }
};

TEST_F(UploadTest, WholeDocument) {
    configure("splunk_topic", "kst");
    setVersion("B1", "P");
    const ValueMap policy = {{"eventVersion", std::int32_t{3}},
                             {"restrictedMode", std::uint8_t{1}},
                             {"restrictedModeDuration", std::uint32_t{3600}},
                             {"policyEnabled", std::int32_t{0}},
                             {"policyDisabledByPasscodeNotSet", std::uint8_t{0}},
                             {"policyDisabledByBootArg", std::uint8_t{2}},
                             {"policyDisabledByQuorvane", std::uint8_t{0}},
                             {"eventPeriodDuration", std::uint32_t{4294967295}}};
    logger().logEventNamed("policy", &policy);
    const ValueMap restarted = {{"eventVersion", std::int32_t{4}},
                                {"totalRestrictedModeDurationMin", std::uint32_t{1}}};
    logger().logEventNamed("timerRestarted", &restarted);
    machine.clock.advance(500'250'000);
    // The events have their topic, the summary has none.
    onQueue([this] { logger().fields.splunkTopicName.reset(); });
    EXPECT_EQ(
        document(),
        R"({"events":[{"eventPeriodDuration":4294967295,"eventTime":1700000000000.0,)"
        R"("eventType":"policy","eventVersion":3,"policyDisabledByBootArg":2,)"
        R"("policyDisabledByPasscodeNotSet":0,"policyDisabledByQuorvane":0,"policyEnabled":0,)"
        R"("restrictedMode":1,"restrictedModeDuration":3600,"topic":"kst"},)"
        R"({"eventTime":1700000000000.0,"eventType":"timerRestarted","eventVersion":4,)"
        R"("topic":"kst","totalRestrictedModeDurationMin":1},)"
        R"({"build":"B1","eventTime":1700000000500.25,"eventType":"accumulatedPolicyStats",)"
        R"("product":"P","topic":null}],"postTime":1700000000500.25})");
}

TEST_F(UploadTest, EmptyStore) {
    EXPECT_EQ(document(), kEmptyDocument);
}

/// Is a second later at every reading.
class RunningClock final : public platform::Clock {
  public:
    [[nodiscard]] platform::Date now() override {
        ++readings_;
        return {platform::FakeClock::kStart.nanosecondsSince1970 +
                readings_ * platform::kNanosecondsPerSecond};
    }

  private:
    std::int64_t readings_ = 0;
};

TEST_F(UploadTest, TheSummaryIsOfTheTimeOfTheDocument) {
    RunningClock clock;
    const auto running = TestLogger::logger(support::hostWith(fake.host(), {.clock = &clock}));
    const auto document = running->getLoggingJSON();
    ASSERT_TRUE(document);
    const auto read = fake.json.read(document.value().view());
    ASSERT_TRUE(read);
    const ValueMap& map = *read.value().as<ValueMap>();
    const ValueMap& summary = *map.at("events").as<platform::ValueList>()->back().as<ValueMap>();
    EXPECT_EQ(summary.at("eventTime"), map.at("postTime"));
}

TEST_F(UploadTest, TheSummaryHasTheTopic) {
    configure("splunk_topic", "kst");
    EXPECT_NE(document().find(R"("eventType":"accumulatedPolicyStats","topic":"kst"}])"),
              std::string::npos);
}

TEST_F(UploadTest, ExtraValuesGoIntoTheSummaryBeneathItsOwn) {
    configure("splunk_topic", "kst");
    setVersion("B1", "P");
    logger().onUpload = [] {
        return ValueMap{
            {"a", true},         {"build", "mine"}, {"eventTime", "mine"},  {"eventType", "my"},
            {"product", "mine"}, {"topic", "mine"}, {"z", std::int32_t{-1}}};
    };
    EXPECT_EQ(document(),
              R"({"events":[{"a":true,"build":"B1","eventTime":1700000000000.0,)"
              R"("eventType":"accumulatedPolicyStats","product":"P","topic":"kst","z":-1}],)"
              R"("postTime":1700000000000.0})");
}

TEST_F(UploadTest, ExtraValuesStandWhereTheSystemsVersionIsNotKnown) {
    logger().onUpload = [] {
        return ValueMap{{"build", "mine"}};
    };
    EXPECT_NE(document().find(R"("build":"mine")"), std::string::npos);
}

TEST_F(UploadTest, ExtraValuesAreTakenOffTheQueue) {
    bool isOnQueue = true;
    logger().onUpload = [&] {
        isOnQueue = logger().splunkLoggingQueue().isCurrent();
        return ValueMap();
    };
    static_cast<void>(document());
    EXPECT_FALSE(isOnQueue);
}

TEST_F(UploadTest, ValuesThatJSONCannotExpressAreLeftOut) {
    store({{"a", std::int32_t{1}},
           {"bytes", platform::Bytes{1}},
           {"date", platform::Timestamp{0}},
           {"list", platform::ValueList{platform::Timestamp{0}, std::int32_t{2}}},
           {"z", "last"}});
    EXPECT_TRUE(document().starts_with(R"({"events":[{"a":1,"list":[2],"z":"last"},{)"));
}

TEST_F(UploadTest, BrokenRowLeavesNoTrace) {
    store({{"n", std::int32_t{1}}});
    for (const char* const data : {"X'00'", "X''", "NULL", "'text'", "1"}) {
        onQueue([&] {
            EXPECT_TRUE(logger().fields.database->executeSQL(
                "insert into all_events (timestamp, data) values (0, %@)", data));
        });
    }
    // The first bytes of an event that is cut in the middle.
    onQueue([&] {
        EXPECT_TRUE(logger().fields.database->executeSQL(
            "insert into all_events (timestamp, data) select 0, substr(data, 1, length(data) - 4) "
            "from all_events where id = 1"));
    });
    store({{"n", std::int32_t{2}}});
    EXPECT_TRUE(document().starts_with(R"({"events":[{"n":1},{"n":2},{"eventTime")"));
    EXPECT_EQ(takeLines(), Lines());
}

/// The reader fails when it has already handed over a part.
TEST_F(UploadTest, RowThatBreaksInTheMiddleLeavesNoTrace) {
    class Breaking final : public platform::PropertyLists {
      public:
        explicit Breaking(platform::PropertyLists& real) : real_(real) {}
        platform::Result<platform::Bytes> binary(const Value& value) override {
            return real_.binary(value);
        }
        bool read(std::span<const std::uint8_t> /*data*/, platform::ValueSink& sink) override {
            sink.beginMap();
            sink.key("broken");
            sink.beginList();
            sink.integer(1);
            return false;
        }

      private:
        platform::PropertyLists& real_;
    };
    Breaking propertyLists(fake.propertyLists);
    const auto logger =
        TestLogger::logger(support::hostWith(fake.host(), {.propertyLists = &propertyLists}));
    logger->logEventNamed("event", nullptr);
    const auto document = logger->getLoggingJSON();
    ASSERT_TRUE(document);
    EXPECT_EQ(document.value().view(), kEmptyDocument);
}

TEST_F(UploadTest, DocumentWithWritingOptions) {
    answerUploads(FakeHTTPAnswer::status(200));
    const auto document = logger().getLoggingJSON({.isPretty = true});
    ASSERT_TRUE(document);
    EXPECT_EQ(document.value().view(), R"({
  "events": [
    {
      "eventTime": 1700000000000.0,
      "eventType": "accumulatedPolicyStats",
      "topic": null
    }
  ],
  "postTime": 1700000000000.0
})");
    EXPECT_TRUE(upload());
    EXPECT_EQ(fake.https.requests().back().body, kEmptyDocument) << "uploads are compact";
}

TEST_F(UploadTest, DocumentThatCannotBeFinished) {
    logger();
    fake.json.failNextFinish({"d", 7, "no text"});
    std::optional<platform::Error> error;
    EXPECT_FALSE(logger().forceUploadWithError(&error));
    EXPECT_EQ(error, (platform::Error{"d", 7, "no text"}));
    EXPECT_EQ(takeLines(), Lines());
    EXPECT_TRUE(fake.https.requests().empty());
}

TEST_F(UploadTest, ClosedStoreGivesNoDocument) {
    std::filesystem::create_directories(databaseFile());
    static_cast<void>(TestLogger::logger(fake.host()));
    const std::string opening =
        base::concat("Error opening db at ", databaseFile().string(), ", rc=14(0xe)");
    EXPECT_EQ(takeLines(),
              (Lines{base::concat("warning: kstd: Database: ", databaseFile().string(),
                                  ": unable to open database file (14), Is a directory."),
                     base::concat("error: TQAnalyticsLogger: could not open db at "
                                  "init, will try again later. Error: ",
                                  opening)}));
    const auto document = logger().getLoggingJSON();
    ASSERT_FALSE(document);
    EXPECT_EQ(document.error(),
              (platform::Error{"TQAnalyticsLogger", -1,
                               "could not open db to read and process metrics (device in class "
                               "D?)"}));
    EXPECT_FALSE(logger().forceUploadWithError());
    fake.log.clear();
    static_cast<void>(logger().getLoggingJSON());
    EXPECT_EQ(
        takeLines(),
        (Lines{"warning: TQAnalyticsLogger: db is closed, attempting to open",
               base::concat("error: TQAnalyticsLogger: failed to open db with error ", opening),
               "error: can't get logging JSON because database is not openable"}));
}

TEST_F(UploadTest, TheRequest) {
    answerUploads(FakeHTTPAnswer::status(200));
    EXPECT_TRUE(upload());
    const auto requests = fake.https.requests();
    ASSERT_EQ(requests.size(), 1U);
    EXPECT_EQ(requests[0].method, "POST");
    EXPECT_EQ(requests[0].link, platform::Link{kUploadLink});
    EXPECT_EQ(requests[0].body, kEmptyDocument);
    EXPECT_EQ(requests[0].headers,
              (std::map<std::string, std::string>{{"User-Agent", "kstd/1.0"}}));
}

TEST_F(UploadTest, AcceptedStatuses) {
    answerUploads(FakeHTTPAnswer::status(200));
    for (const int status : {200, 201, 204, 299}) {
        SCOPED_TRACE(status);
        answerUploads(FakeHTTPAnswer::status(status));
        logger().logEventNamed("event", nullptr);
        fake.log.clear();
        setDueDate(kNow + 5);
        EXPECT_TRUE(upload());
        const Lines lines = takeLines();
        ASSERT_EQ(lines.size(), 4U);
        EXPECT_EQ(Lines(lines.begin(), lines.end() - 1), (Lines{kStart, kChallenged, kSuccess}));
        EXPECT_TRUE(lines[3].starts_with("debug: uploading oracle statistics: {\"events\":["));
        EXPECT_EQ(events().size(), 0U);
        EXPECT_EQ(dueDate(), kNow + kInterval);
    }
}

TEST_F(UploadTest, RefusedStatuses) {
    answerUploads(FakeHTTPAnswer::status(200));
    logger().logEventNamed("event", nullptr);
    setDueDate(kNow + 5);
    for (const int status : {0, 100, 199, 300, 301, 302, 400, 413, 429, 500, 503, 999}) {
        SCOPED_TRACE(status);
        answerUploads(FakeHTTPAnswer::status(status));
        EXPECT_FALSE(upload());
        EXPECT_EQ(takeLines(),
                  (Lines{kStart, kChallenged,
                         base::concat("error: Splunk upload unexpected status to URL: ",
                                      kUploadLink, " -- status: ", status)}));
        EXPECT_EQ(events().size(), 1U);
        EXPECT_EQ(dueDate(), kNow + 5);
    }
}

TEST_F(UploadTest, TransportError) {
    answerUploads(FakeHTTPAnswer::failure(platform::kTransferFailed, "reset by peer"));
    EXPECT_FALSE(upload());
    EXPECT_EQ(takeLines(),
              (Lines{kStart, "error: Error in uploading the events to splunk: reset by peer"}));
}

TEST_F(UploadTest, AnswerThatIsNotHTTP) {
    answerUploads(FakeHTTPAnswer::notHTTP("OtherResponse"));
    EXPECT_FALSE(upload());
    EXPECT_EQ(takeLines(), (Lines{kStart, kChallenged,
                                  "error: Received the wrong kind of response: OtherResponse"}));
}

TEST_F(UploadTest, NoResponseAtAll) {
    answerUploads(FakeHTTPAnswer{});
    EXPECT_FALSE(upload());
    EXPECT_EQ(takeLines().back(), "error: Received the wrong kind of response: (null)");
}

TEST_F(UploadTest, PostsToTheLinkOfTheBag) {
    configureBagLink();
    configure("splunk_topic", "kst");
    fake.https.setAnswer("GET", kBagLink,
                         FakeHTTPAnswer::status(200, R"({"metricsUrl":"https://m.example"})"));
    fake.https.setAnswer("POST", "https://m.example/2/kst", FakeHTTPAnswer::status(200));
    logger();
    EXPECT_TRUE(upload());
    const Lines lines = takeLines();
    EXPECT_EQ(Lines(lines.begin(), lines.begin() + 5),
              (Lines{kChallenged, "info: got metrics endpoint: https://m.example/2/kst", kStart,
                     kChallenged, kSuccess}));
    EXPECT_EQ(fake.https.sessionCount(), 2U);
}

struct Bag {
    FakeHTTPAnswer answer;
    Lines lines;
};

/// Whatever is wrong with the bag, its own address is the next best.
TEST_F(UploadTest, PostsToTheBagsAddressWhenTheBagGivesNoLink) {
    configureBagLink();
    fake.https.setAnswer("POST", kBagLink, FakeHTTPAnswer::status(200));
    logger();
    const std::string disabled = "info: not returning a splunk URL because uploads are disabled";
    const std::string malformed = "error: Malformed Ombrix config payload!";
    const Bag bags[] = {
        {FakeHTTPAnswer::failure(platform::kCannotConnect, "refused"),
         {"error: Unable to fetch splunk endpoint at URL: https://bag.example/bag.json -- error: "
          "refused"}},
        {FakeHTTPAnswer::status(200), {kChallenged, malformed}},
        {FakeHTTPAnswer::status(200, R"({"metricsUrl":"http://m.example"})"),
         {kChallenged, "info: got metrics endpoint: http://m.example/2/(null)", malformed}},
        {FakeHTTPAnswer::status(200, R"({"sendDisabled":true})"), {kChallenged, disabled}},
        {FakeHTTPAnswer::status(200, R"({"disabled":true})"), {kChallenged, disabled}},
    };
    for (const Bag& bag : bags) {
        fake.https.setAnswer("GET", kBagLink, bag.answer);
        store({{"n", std::int32_t{1}}});
        EXPECT_TRUE(upload());
        EXPECT_EQ(events().size(), 0U);
        Lines expected = bag.lines;
        expected.insert(expected.end(), {kBagInstead, kStart, kChallenged, kSuccess});
        Lines lines = takeLines();
        lines.pop_back();
        EXPECT_EQ(lines, expected);
    }
    EXPECT_TRUE(logger().fields.disableLogging);
}

TEST_F(UploadTest, NoAddressAtAll) {
    logger();
    EXPECT_FALSE(upload());
    EXPECT_EQ(
        takeLines(),
        (Lines{"error: Unable to fetch splunk endpoint at URL: (null) -- error: unsupported "
               "URL",
               kBagInstead, "error: failed to get a splunk upload endpoint - not uploading"}));
}

TEST_F(UploadTest, OnlyTheStartOfALongDocumentIsLogged) {
    answerUploads(FakeHTTPAnswer::status(200));
    store({{"text", std::string(20000, 'x')}});
    EXPECT_TRUE(upload());
    const std::string line = takeLines().back();
    const std::string prefix = "debug: uploading oracle statistics: ";
    EXPECT_EQ(line.size(), prefix.size() + 8192);
    EXPECT_TRUE(fake.https.requests()[0].body.starts_with(line.substr(prefix.size())));
}

TEST_F(UploadTest, CompletionThatComesTwiceCountsOnce) {
    FakeHTTPAnswer answer = FakeHTTPAnswer::status(200);
    answer.completesTwice = true;
    answerUploads(answer);
    EXPECT_TRUE(upload());
    EXPECT_EQ(takeLines().size(), 4U);
}

TEST_F(UploadTest, CompletionThatComesAgainWhenTheLoggerIsGone) {
    configureBagLink();
    FakeHTTPAnswer bag = FakeHTTPAnswer::status(200, R"({"disabled":true})");
    bag.completesLate = true;
    fake.https.setAnswer("GET", kBagLink, bag);
    FakeHTTPAnswer answer = FakeHTTPAnswer::status(200);
    answer.completesLate = true;
    fake.https.setAnswer("POST", kBagLink, answer);
    {
        const AnalyticsLifetime shorter;
        EXPECT_TRUE(TestLogger::logger(fake.host())->forceUploadWithError());
        fake.log.clear();
        fake.https.completeLate();
    }
    EXPECT_EQ(takeLines(), Lines());
}

TEST_F(UploadTest, AnswerThatTakesItsTime) {
    FakeHTTPAnswer answer = FakeHTTPAnswer::status(200);
    answer.held = true;
    answerUploads(answer);
    std::thread uploader([this] { EXPECT_TRUE(upload()); });
    fake.https.awaitRequests(1);
    std::thread waiter([this] { logger().logEventNamed("while it stands still", nullptr); });
    fake.https.release();
    uploader.join();
    waiter.join();
    EXPECT_EQ(events().size(), 1U);
}

} // namespace
} // namespace kstd
