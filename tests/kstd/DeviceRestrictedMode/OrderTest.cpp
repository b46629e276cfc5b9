// In which order the service logs, loads and saves, asks, sends and registers.

#include "platform/EventStream.h"
#include "tests/kstd/DaemonFixture.h"
#include "tests/support/HostWith.h"

#include <gmock/gmock.h>

#include <utility>

namespace kstd {
namespace {

using testing::ElementsAre;

using Diary = std::vector<std::string>;

class DiaryLog final : public platform::SystemLog {
  public:
    explicit DiaryLog(Diary& diary) : diary_(diary) {}
    void write(platform::LogLevel /*level*/, std::string_view text,
               const platform::LogFields& /*fields*/) override {
        diary_.emplace_back(text.substr(0, text.find('\n')));
    }

  private:
    Diary& diary_;
};

class DiarySettings final : public platform::ManagedSettings {
  public:
    explicit DiarySettings(Diary& diary) : diary_(diary) {}
    [[nodiscard]] bool isRestrictedModeAllowed() override {
        diary_.emplace_back("SETTING");
        return false;
    }

  private:
    Diary& diary_;
};

class DiaryFiles final : public platform::Files {
  public:
    DiaryFiles(Diary& diary, platform::Files& files) : diary_(diary), files_(files) {}
    [[nodiscard]] platform::OpenFile openForWriting(const std::string& path,
                                                    platform::ProtectionClass protection,
                                                    int classOptions, unsigned mode) override {
        diary_.push_back("OPEN " + path);
        return files_.openForWriting(path, protection, classOptions, mode);
    }
    [[nodiscard]] std::unique_ptr<platform::FileStream>
    attachStream(const platform::OpenFile& file) override {
        return files_.attachStream(file);
    }
    [[nodiscard]] std::optional<Bytes> load(const std::string& path) override {
        diary_.push_back("LOAD " + path);
        return files_.load(path);
    }
    [[nodiscard]] std::string locate(const std::string& path) const override {
        return files_.locate(path);
    }

  private:
    Diary& diary_;
    platform::Files& files_;
};

class DiaryAlarms final : public platform::AlarmEvent {
  public:
    explicit DiaryAlarms(Diary& diary) : diary_(diary) {}
    void set(std::string_view stream, std::string_view event,
             const platform::EventDictionary* dictionary) override {
        const auto date = platform::alarmDateIn(dictionary);
        diary_.push_back((date ? "REGISTER " : "CANCEL ") + std::string(stream) + " " +
                         std::string(event));
    }

  private:
    Diary& diary_;
};

class OrderTest : public DaemonFixture {
  protected:
    OrderTest() {
        machine.kernel.onStructCall = [this](const platform::FakeStructCall& /*call*/) {
            diary.push_back("REQUEST " + std::to_string(requests().back().code));
            return platform::FakeStructAnswer();
        };
    }

    /// What happened since the last call.
    [[nodiscard]] Diary entries() { return std::exchange(diary, {}); }

    [[nodiscard]] static std::string line(const std::string& function, const std::string& text) {
        return "kstd: -[DeviceRestrictedModeService " + function + "]: " + text;
    }
    [[nodiscard]] static std::string loading(const std::string& path) {
        return line("loadDataBlob:", "called, filePath = " + path + ".");
    }

    Diary diary;
    DiaryLog log{diary};
    DiarySettings settings{diary};
    DiaryFiles files{diary, fake.files};
    DiaryAlarms alarms{diary};
    std::shared_ptr<DeviceRestrictedModeService> service =
        DeviceRestrictedModeService::make(support::hostWith(
            fake.host(), {.log = &log, .alarms = &alarms, .settings = &settings, .files = &files}));
};

TEST_F(OrderTest, StartWithBothFiles) {
    machine.disk.put(kAnalyticsPath, counting(32, 0));
    machine.disk.put(kStatePath, counting(13, 0));
    service->notifyDaemonStarted();
    EXPECT_THAT(
        entries(),
        ElementsAre(loading(kAnalyticsPath), std::string("LOAD ") + kAnalyticsPath, "REQUEST 6",
                    loading(kStatePath), std::string("LOAD ") + kStatePath, "SETTING",
                    line("notifyDaemonStarted", "kstd started, restricted mode allowed: NO."),
                    "REQUEST 3"));
}

TEST_F(OrderTest, StartWithoutFiles) {
    service->notifyDaemonStarted();
    EXPECT_THAT(
        entries(),
        ElementsAre(loading(kAnalyticsPath), std::string("LOAD ") + kAnalyticsPath,
                    line("notifyDaemonStarted", "Analytics blob not loaded (length = 0).."),
                    loading(kStatePath), std::string("LOAD ") + kStatePath, "SETTING",
                    line("notifyDaemonStarted", "State blob not loaded (length = 0).."),
                    line("notifyDaemonStarted", "kstd started, restricted mode allowed: NO."),
                    "REQUEST 3"));
}

TEST_F(OrderTest, ChangedSettings) {
    service->onQuorvaneChanged();
    EXPECT_THAT(entries(), ElementsAre(line("onQuorvaneChanged", "called, ."), "SETTING",
                                       line("onQuorvaneChanged",
                                            "Quorvane Changed Restricted Mode Allowed: NO."),
                                       "REQUEST 5"));
}

TEST_F(OrderTest, TimerRecordWithAnAlarmAndWithoutOne) {
    for (const std::uint64_t alarm : {1700000000U, 0U}) {
        const Bytes bytes = timerRecord(alarm);
        const auto notification = KSTDRMDeamonNotification::fromBytes(bytes);
        ASSERT_TRUE(notification);
        EXPECT_EQ(service->onKextTimerRestarted(*notification), 0);
        const std::string stateLine =
            line("saveDataBlob:data:", std::string("called, filePath = ") + kStatePath + ".");
        const std::string name = "com.zerva.alarm com.zerva.kstd.alarm";
        EXPECT_THAT(entries(),
                    ElementsAre(line("onKextTimerRestarted:", "called, ."),
                                line("onKextTimerRestarted:",
                                     "version = 2, standardModeStartTimestamp = 1700000000, "
                                     "lockedInRestrictedMode = 1."),
                                stateLine, std::string("OPEN ") + kStatePath,
                                alarm != 0 ? line("scheduleAlarm:", "called, timestamp=1700000000.")
                                           : line("unscheduleAlarm", "called, ."),
                                (alarm != 0 ? "REGISTER " : "CANCEL ") + name));
    }
}

} // namespace
} // namespace kstd
