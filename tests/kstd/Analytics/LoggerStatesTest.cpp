// What one logged event does, by the state in which it finds the logger.

#include "tests/kstd/Analytics/LoggerFixture.h"
#include "tests/kstd/Analytics/SQLite/LockHolder.h"
#include "tests/kstd/Analytics/SQLite/SleeplessFiles.h"
#include "tests/support/HostWith.h"

#include <algorithm>
#include <filesystem>
#include <ostream>

namespace kstd {
namespace {

namespace fs = std::filesystem;

using platform::FakeHTTPAnswer;
using Arrange = std::function<void(LoggerFixture&)>;
using Lines = std::vector<std::string>;

constexpr std::int64_t kNow = LoggerFixture::kNow;
constexpr std::int64_t kNext = kNow + LoggerFixture::kInterval;

struct State {
    const char* name;
    Arrange arrange;
    std::optional<std::string> eventName;

    // What is there afterwards.
    std::size_t events;
    std::optional<std::int64_t> dueDate;
    std::size_t requests;
    Lines lines;

    friend std::ostream& operator<<(std::ostream& out, const State& state) {
        return out << state.name;
    }
};

fs::path savedFile(const LoggerFixture& test) {
    return test.directory.path() / "saved";
}

/// Closes the database and puts something in its place that cannot be opened.
void breakDatabase(LoggerFixture& test) {
    test.onQueue([&test] {
        test.logger().fields.database->close();
        fs::rename(test.databaseFile(), savedFile(test));
        fs::create_directory(test.databaseFile());
    });
}

void repairDatabase(LoggerFixture& test) {
    if (fs::exists(savedFile(test))) {
        fs::remove(test.databaseFile());
        fs::rename(savedFile(test), test.databaseFile());
    }
}

void nothing(LoggerFixture& /*test*/) {}

Arrange due(std::int64_t date) {
    return [date](LoggerFixture& test) {
        test.configureUploadLink();
        test.setDueDate(date);
    };
}

Arrange overdue(const FakeHTTPAnswer& answer) {
    return [answer](LoggerFixture& test) {
        due(kNow - 1)(test);
        test.fake.https.setAnswer("POST", LoggerFixture::kUploadLink, answer);
    };
}

Arrange unwanted(const Arrange& before) {
    return [before](LoggerFixture& test) {
        before(test);
        test.onQueue([&test] { test.logger().fields.blacklistedEvents = Lines{"other", "event"}; });
    };
}

Arrange disabled(const Arrange& before) {
    return [before](LoggerFixture& test) {
        before(test);
        test.onQueue([&test] { test.logger().fields.disableLogging = true; });
    };
}

void withUnreadableDate(LoggerFixture& test) {
    test.onQueue([&test] { test.logger().fields.database->setProperty("soon", "upload_date"); });
}

/// The due date has no fraction, the clock has one.
void overdueByAFraction(LoggerFixture& test) {
    overdue(FakeHTTPAnswer::status(500))(test);
    test.setDueDate(kNow);
    test.machine.clock.advance(1'000'000);
}

void overdueWithoutALink(LoggerFixture& test) {
    test.setDueDate(kNow - 1);
}

void overdueAndBrokenBeforeTheDocument(LoggerFixture& test) {
    due(kNow - 1)(test);
    test.logger().onUpload = [&test] {
        breakDatabase(test);
        return platform::ValueMap();
    };
}

void overdueAndClosed(LoggerFixture& test) {
    due(kNow - 1)(test);
    breakDatabase(test);
}

void overdueAndDocumentFails(LoggerFixture& test) {
    due(kNow - 1)(test);
    test.fake.json.failNextFinish({platform::kGenericErrorDomain, 0, "no text"});
}

std::string openError(const LoggerFixture& test) {
    return base::concat("error: TQAnalyticsLogger: failed to open db with error Error opening db "
                        "at ",
                        test.databaseFile().string(), ", rc=14(0xe)");
}

constexpr char kOpening[] = "warning: TQAnalyticsLogger: db is closed, attempting to open";
/// Stands for the line that names the private directory.
constexpr char kOpenError[] = "<cannot be opened>";

class LoggerStatesTest : public LoggerFixture, public testing::WithParamInterface<State> {
  protected:
    Lines expectedLines() {
        Lines lines = GetParam().lines;
        const auto first = std::find(lines.begin(), lines.end(), kOpenError);
        if (first != lines.end()) {
            lines.insert(first, base::concat("warning: kstd: Database: ", databaseFile().string(),
                                             ": unable to open database file (14), Is a "
                                             "directory."));
        }
        std::replace(lines.begin(), lines.end(), std::string(kOpenError), openError(*this));
        return lines;
    }
};

TEST_P(LoggerStatesTest, OneEvent) {
    const State& state = GetParam();
    state.arrange(*this);
    logger();
    takeLines();
    const platform::ValueMap attributes = {{"n", std::int32_t{1}}};
    logger().logEventNamed(state.eventName ? std::optional<std::string_view>(*state.eventName)
                                           : std::nullopt,
                           &attributes);
    EXPECT_EQ(takeLines(), expectedLines());
    repairDatabase(*this);
    EXPECT_EQ(events().size(), state.events);
    EXPECT_EQ(dueDate(), state.dueDate);
    EXPECT_EQ(fake.https.requests().size(), state.requests);
}

const std::string kDocumentLine =
    "debug: uploading oracle statistics: "
    R"({"events":[{"eventTime":1700000000000.0,"eventType":"event","n":1},)"
    R"({"eventTime":1700000000000.0,"eventType":"accumulatedPolicyStats","topic":null}],)"
    R"("postTime":1700000000000.0})";

const std::vector<State> kStates = {
    {"NullName", nothing, {}, 0, {}, 0, {"debug: attempt to log an event with no name"}},
    {"NullNameWhenOverdue",
     due(kNow - 1),
     {},
     0,
     kNow - 1,
     0,
     {"debug: attempt to log an event with no name"}},
    {"First", nothing, "event", 1, kNext, 0, {}},
    {"UnreadableDate", withUnreadableDate, "event", 1, kNext, 0, {}},
    {"NotDue", due(kNow + 1), "event", 1, kNow + 1, 0, {}},
    {"AtTheDueDate", due(kNow), "event", 1, kNow, 0, {}},
    {"OverdueByAFraction",
     overdueByAFraction,
     "event",
     1,
     kNow,
     1,
     {"info: Splunk upload start", "info: Splunk upload challenge",
      "error: Splunk upload unexpected status to URL: https://collector.example/upload -- status: "
      "500"}},
    {"Accepted",
     overdue(FakeHTTPAnswer::status(200)),
     "event",
     0,
     kNext,
     1,
     {"info: Splunk upload start", "info: Splunk upload challenge", "info: Splunk upload success",
      kDocumentLine, "debug: uploaded oracle statistics"}},
    {"Failed",
     overdue(FakeHTTPAnswer::failure(platform::kTimedOut, "too late")),
     "event",
     1,
     kNow - 1,
     1,
     {"info: Splunk upload start", "error: Error in uploading the events to splunk: too late"}},
    {"NoLinks",
     overdueWithoutALink,
     "event",
     1,
     kNow - 1,
     1,
     {"error: Unable to fetch splunk endpoint at URL: (null) -- error: unsupported URL",
      "error: failed to get a splunk upload endpoint - using bag URL instead",
      "error: failed to get a splunk upload endpoint - not uploading"}},
    {"BrokenBeforeTheDocument",
     overdueAndBrokenBeforeTheDocument,
     "event",
     1,
     kNow - 1,
     0,
     {kOpening, kOpenError, "error: can't get logging JSON because database is not openable",
      "error: TQAnalytics: failed to upload json to analytics server with error: could not open db "
      "to read and process metrics (device in class D?)"}},
    {"DocumentFails",
     overdueAndDocumentFails,
     "event",
     1,
     kNow - 1,
     0,
     {"error: TQAnalytics: failed to upload json to analytics server with error: no text"}},
    {"Unwanted", unwanted(nothing), "event", 0, kNext, 0, {}},
    {"UnwantedAndNotDue", unwanted(due(kNow + 1)), "event", 0, kNext, 0, {}},
    {"UnwantedAndOverdue", unwanted(due(kNow - 1)), "event", 0, kNext, 0, {}},
    {"AnotherIsUnwanted", unwanted(nothing), "Event", 1, kNext, 0, {}},
    {"Disabled", disabled(nothing), "event", 0, kNext, 0, {}},
    {"DisabledAndOverdue", disabled(due(kNow - 1)), "event", 0, kNext, 0, {}},
    {"ClosedThroughout",
     overdueAndClosed,
     "event",
     0,
     kNow - 1,
     0,
     {kOpening, kOpenError, kOpening, kOpenError, kOpening, kOpenError}},
};

INSTANTIATE_TEST_SUITE_P(States, LoggerStatesTest, testing::ValuesIn(kStates),
                         [](const auto& state) { return std::string(state.param.name); });

TEST_F(LoggerFixture, FailedUploadIsTriedAgainByTheNextEvent) {
    overdue(FakeHTTPAnswer::status(503))(*this);
    logger().logEventNamed("first", nullptr);
    fake.https.setAnswer("POST", kUploadLink, FakeHTTPAnswer::status(204));
    logger().logEventNamed("second", nullptr);
    EXPECT_EQ(fake.https.requests().size(), 2U);
    EXPECT_EQ(events().size(), 0U);
    EXPECT_EQ(dueDate(), kNext);
}

TEST_F(LoggerFixture, DroppedEventIsFollowedByOneThatIsKeptOnceTheDatabaseCanBeOpened) {
    logger();
    breakDatabase(*this);
    logger().logEventNamed("first", nullptr);
    repairDatabase(*this);
    logger().logEventNamed("second", nullptr);
    EXPECT_EQ(event().at("eventType"), platform::Value("second"));
}

/// The collected events go to the bag's own address; from then on none is kept.
TEST_F(LoggerFixture, BagThatDisablesLogging) {
    configureBagLink();
    fake.https.setAnswer("GET", kBagLink, FakeHTTPAnswer::status(200, R"({"disabled":true})"));
    fake.https.setAnswer("POST", kBagLink, FakeHTTPAnswer::status(200));
    setDueDate(kNow - 1);
    logger().logEventNamed("first", nullptr);
    EXPECT_EQ(events().size(), 0U);
    setDueDate(kNow - 1);
    logger().logEventNamed("second", nullptr);
    EXPECT_EQ(events().size(), 0U);
    EXPECT_EQ(dueDate(), kNext);
    EXPECT_EQ(fake.https.requests().size(), 2U);
}

/// What the bag says holds from the next event on.
TEST_F(LoggerFixture, BagThatChangesWhatIsKept) {
    configureBagLink();
    fake.https.setAnswer("GET", kBagLink, FakeHTTPAnswer::status(200, R"({"postFrequency":7000,
        "blacklistedEvents":["unwanted"],"blacklistedFields":["n"],"metricsBase":{"base":"b"},
        "metricsUrl":"https://m.example"})"));
    fake.https.setAnswer("POST", "https://m.example/2/(null)", FakeHTTPAnswer::status(200));
    setDueDate(kNow - 1);
    const platform::ValueMap attributes = {{"n", std::int32_t{1}}, {"m", std::int32_t{2}}};
    logger().logEventNamed("first", &attributes);
    EXPECT_EQ(dueDate(), kNow + 7);
    logger().logEventNamed("second", &attributes);
    EXPECT_EQ(event(), (platform::ValueMap{{"m", std::int64_t{2}},
                                           {"base", "b"},
                                           {"eventType", "second"},
                                           {"eventTime", 1700000000000.0}}));
    logger().logEventNamed("unwanted", &attributes);
    EXPECT_EQ(events().size(), 1U);
}

/// What is collected is deleted and the date set twice, the second time at the end of everything.
TEST_F(LoggerFixture, TheDateAfterAnUploadIsOneIntervalFromItsEnd) {
    overdue(FakeHTTPAnswer::status(200))(*this);
    logger().logEventNamed("event", nullptr);
    const std::size_t workItems = fake.queues.workItems();
    setDueDate(kNow - 1);
    logger().logEventNamed("event", nullptr);
    // Setting the date, keeping the event, the document and its upload, the reset.
    EXPECT_EQ(fake.queues.workItems() - workItems, 4U);
    EXPECT_EQ(dueDate(), kNext);
}

/// Another program that holds a write transaction for longer than anybody waits.
TEST_F(LoggerFixture, LockHoldsAnEventUpForFiveMinutesAndTheFirstOneForFourTimesThat) {
    constexpr std::int64_t kFiveMinutes = 300'000'000;
    std::filesystem::create_directories(databaseFile().parent_path());
    LockHolder holder(databaseFile());
    std::int64_t waited = 0;
    const SleeplessFiles sleepless([&waited](int microseconds) { waited += microseconds; });
    setDueDate(kNow + kInterval);
    holder.lock();
    logger().logEventNamed("event", nullptr);
    EXPECT_EQ(waited, kFiveMinutes);
    EXPECT_EQ(events().size(), 0U);

    onQueue([this] { logger().fields.database->close(); });
    waited = 0;
    static_cast<void>(TQAnalyticsLoggerSQLiteStore::storeWithPath(
        databaseFile(), kEventSchema,
        {.log = fake.log, .clock = machine.clock, .propertyLists = fake.propertyLists}));
    logger().logEventNamed("event", nullptr);
    EXPECT_EQ(waited, 4 * kFiveMinutes);

    holder.unlock();
    waited = 0;
    logger().logEventNamed("event", nullptr);
    EXPECT_EQ(events().size(), 1U);
    EXPECT_EQ(waited, 0);
}

/// Calls back when a line is written.
class WatchedLog final : public platform::SystemLog {
  public:
    explicit WatchedLog(std::function<void(std::string_view)> onLine)
        : onLine_(std::move(onLine)) {}
    void write(platform::LogLevel /*level*/, std::string_view text,
               const platform::LogFields& /*fields*/) override {
        onLine_(text);
    }

  private:
    std::function<void(std::string_view)> onLine_;
};

/// What another thread stores between the two deletions goes with the second one.
TEST_F(LoggerFixture, EventsAreDeletedOnceMoreAtTheEndOfAnUpload) {
    configureUploadLink();
    fake.https.setAnswer("POST", kUploadLink, FakeHTTPAnswer::status(200));
    int stored = 0;
    WatchedLog log([&](std::string_view text) {
        if (text == "uploaded oracle statistics") {
            EXPECT_EQ(events().size(), 0U);
            store({{"eventType", "between"}});
            machine.clock.advance(5 * platform::kNanosecondsPerSecond);
            ++stored;
        }
    });
    const auto watched = TestLogger::logger(support::hostWith(fake.host(), {.log = &log}));
    setDueDate(kNow - 1);
    watched->logEventNamed("event", nullptr);
    EXPECT_EQ(stored, 1);
    EXPECT_EQ(events().size(), 0U);
    EXPECT_EQ(dueDate(), kNow + 5 + kInterval);
}

} // namespace
} // namespace kstd
