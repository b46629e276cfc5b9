#pragma once

#include "base/Concat.h"
#include "kstd/Analytics/Analytics.h"
#include "kstd/Analytics/KSTDAnalyticsLogger.h"
#include "kstd/Analytics/TQAnalyticsLoggerSQLiteStore.h"
#include "platform/fake/FakeHost.h"
#include "tests/kstd/MachineWithDirectory.h"

#include <gtest/gtest.h>

#include <cstdint>
#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <vector>

namespace kstd {

/// A logger whose fields a test can see.
class TestLogger final : public KSTDAnalyticsLogger {
  public:
    static constexpr char kPath[] = "/var/root/events.db";

    [[nodiscard]] static std::shared_ptr<TestLogger> logger(const platform::Host& host) {
        return instanceOf<TestLogger>(host);
    }
    static std::optional<std::string> databasePath() { return kPath; }

    TestLogger(Creation creation, const platform::Host& host)
        : KSTDAnalyticsLogger(creation, host) {}

    [[nodiscard]] platform::ValueMap extraValuesToUploadToServer() override {
        return onUpload ? onUpload() : KSTDAnalyticsLogger::extraValuesToUploadToServer();
    }

    using KSTDAnalyticsLogger::fields;

    std::function<platform::ValueMap()> onUpload;
};

/// A logger on a fake machine.
class LoggerFixture : public testing::Test, public MachineWithDirectory {
  public:
    using Lines = std::vector<std::string>;

    static constexpr std::int64_t kNow =
        platform::FakeClock::kStart.nanosecondsSince1970 / platform::kNanosecondsPerSecond;
    static constexpr std::int64_t kInterval = 259200;

    static constexpr char kUploadLink[] = "https://collector.example/upload";
    static constexpr char kBagLink[] = "https://bag.example/bag.json";

    /// The logger, made by the first call. What making it has logged is not kept.
    TestLogger& logger() {
        if (logger_ == nullptr) {
            logger_ = TestLogger::logger(fake.host());
            fake.log.clear();
        }
        return *logger_;
    }

    void configure(const std::string& key, const platform::Value& value) {
        configuration_.insert_or_assign(key, value);
        fake.resources.put("Keystrand", "KSTDAnalyticsLogging", configuration_);
    }

    void setVersion(const std::string& build, const std::string& product) {
        fake.version.setBuild(build);
        fake.version.setProduct(product);
    }

    void configureUploadLink() { configure("splunk_uploadURL", kUploadLink); }
    void configureBagLink() { configure("splunk_bagURL", kBagLink); }

    /// What the log holds, each line after its level. The log is empty afterwards.
    Lines takeLines() {
        static constexpr const char* kLevels[] = {
            "debug: ", "info: ", "notice: ", "warning: ", "error: "};
        Lines lines;
        for (const auto& line : fake.log.lines()) {
            lines.push_back(kLevels[static_cast<int>(line.level)] + line.text);
        }
        fake.log.clear();
        return lines;
    }

    template <typename Work>
    void onQueue(const Work& work) {
        logger().splunkLoggingQueue().sync(work);
    }

    /// What is stored.
    platform::ValueList events() {
        platform::ValueList events;
        onQueue([&] { events = logger().fields.database->allEvents(); });
        return events;
    }

    /// The only event that is stored.
    platform::ValueMap event() {
        const platform::ValueList all = events();
        EXPECT_EQ(all.size(), 1U);
        return all.empty() ? platform::ValueMap() : *all.front().as<platform::ValueMap>();
    }

    /// In seconds since 1970.
    std::optional<std::int64_t> dueDate() {
        std::optional<platform::Timestamp> date;
        onQueue([&] { date = logger().fields.database->uploadDate(); });
        return date ? std::optional(static_cast<std::int64_t>(date->secondsSince2001) +
                                    platform::kSecondsFrom1970To2001)
                    : std::nullopt;
    }

    void setDueDate(std::int64_t secondsSince1970) {
        onQueue([&] {
            logger().fields.database->setUploadDate(platform::Timestamp{
                static_cast<double>(secondsSince1970 - platform::kSecondsFrom1970To2001)});
        });
    }

    /// Stores an event without any of the decisions about uploads.
    void store(const platform::ValueMap& event) {
        onQueue([&] { logger().fields.database->addEventDict(event, kEventTable); });
    }

    [[nodiscard]] std::filesystem::path databaseFile() const {
        return directory.path() / "var/root/events.db";
    }

    platform::FakeHost fake{machine};
    AnalyticsLifetime lifetime;

  private:
    platform::ValueMap configuration_;
    std::shared_ptr<TestLogger> logger_;
};

} // namespace kstd
