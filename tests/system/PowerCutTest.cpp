// The power goes during a run of the daemon: whatever the disk then holds, the next daemon starts,
// and what was acknowledged of the timer's state, the accumulator and the alarm is there. Of the
// states of a database every KSTD_CUT_STEP-th is tried.

#include "tests/support/PowerCut.h"

#include "kstd/Analytics/TQAnalyticsLoggerSQLiteStore.h"
#include "platform/fake/FakeClock.h"
#include "platform/fake/FakeFormats.h"
#include "platform/fake/FakeSystemLog.h"
#include "platform/linux/alarms/AlarmStore.h"
#include "tests/support/SystemCallGate.h"
#include "tests/system/AnalyticsFixture.h"
#include "wire/EventDatagram.h"

#include <atomic>
#include <cerrno>
#include <csignal>
#include <filesystem>
#include <iostream>
#include <set>
#include <utility>

namespace system_tests {
namespace {

namespace fs = std::filesystem;
using platform::Date;
using support::DiskState;
using support::DiskStep;
using Bytes = std::vector<std::uint8_t>;

/// How many steps of a database go on to the next one that is looked behind.
constexpr std::size_t kLooks = KSTD_CUT_STEP == 1 ? 1 : 17;
/// How many steps of the disk later the next daemon is killed.
constexpr std::size_t kKillStep = KSTD_CUT_STEP == 1 ? 1 : 3;

constexpr std::int64_t kNanosecondsPerSecond = 1'000'000'000;

Bytes stateOf(std::uint8_t version) {
    return {version, 0, 0, 0, 0x00, 0xd2, 0x49, 0x6b, 0, 0, 0, 0, 1};
}

/// A record that the daemon is given, and what it has to keep of it.
struct Record {
    std::string command;
    std::string property;
    Bytes kept;
    /// Seconds since 1970; 0 takes the alarm away.
    std::int64_t alarm = 0;
};

Record timerRestarted(std::uint8_t version, std::int64_t alarm) {
    return {"publish timer-restarted alarm=" + std::to_string(alarm) +
                " version=" + std::to_string(version) + " start=1800000000 locked=1",
            "KSTRMTimerRestarted", stateOf(version), alarm};
}

Record saveAnalytics(std::uint8_t filling) {
    const Bytes blob(32, filling);
    return {"publish save-analytics " + hex(blob), "KSTRMSaveAnalytics", blob};
}

Record analyticsCollected() {
    return {"publish analytics-collected", "KSTRMAnalyticsCollected", {}};
}

/// Whether something said is the acknowledgement of a property.
bool acknowledges(const DiskStep& step, const std::string& property) {
    std::string payload = property;
    payload.resize(64, '\0');
    return step.what == DiskStep::What::mark && step.other.ends_with(payload);
}

class PowerCutTest : public AnalyticsFixture {
  protected:
    PowerCutTest() : AnalyticsFixture(support::directoryInMemory()) {}

    void SetUp() override {
        startKernel();
        // Of these the package takes care.
        fs::create_directories(real("/var/lib/kstd/alarms"));
        before_ = DiskState::of(real("/var"));
    }

    /// Runs a daemon through the records; with `killAt` it is killed when it is about to take its
    /// killAt-th step on the disk, and the next one goes on with what is left.
    void record(const std::vector<Record>& records, std::size_t killAt = SIZE_MAX) {
        support::DiskRecorder recorder(real("/var"));
        records_ = records;
        acknowledgements_ = std::stoi(kernelStatus("acks"));
        std::size_t next = 0;
        bool wasKilled = runDaemon(recorder, killAt, next);
        if (wasKilled) {
            static_cast<void>(runDaemon(recorder, SIZE_MAX, next));
        }
        steps_ = recorder.steps();
    }

    /// Visits each state that the disk may hold after each of the steps, no state twice with the
    /// same of the records acknowledged; `count` of those are. Of the steps every so-manieth is
    /// looked behind, and then of the states every KSTD_CUT_STEP-th visited.
    void eachState(const std::function<void(const DiskState& state, std::size_t count)>& visit,
                   std::size_t every = 1) {
        support::PowerCut cut(before_);
        std::size_t acknowledged = 0;
        std::size_t looks = 0;
        const auto visitAll = [&] {
            if (looks++ % every != 0) {
                return;
            }
            cut.eachState([&](const DiskState& state) {
                ++all_;
                if (known_.emplace(state.hash(), acknowledged).second &&
                    unique_++ % (every == 1 ? 1 : KSTD_CUT_STEP) == 0) {
                    ++tried_;
                    visit(state, acknowledged);
                }
            });
        };
        visitAll();
        for (const DiskStep& step : steps_) {
            if (acknowledged < records_.size() &&
                acknowledges(step, records_[acknowledged].property)) {
                ++acknowledged;
                visitAll();
            } else if (step.what != DiskStep::What::mark) {
                cut.add(step);
                visitAll();
            }
            if (HasFailure()) {
                return;
            }
        }
        EXPECT_EQ(acknowledged, records_.size());
    }

    void report(const char* what) {
        std::cout << what << ": " << all_ << " states, " << known_.size() << " different, "
                  << tried_ << " tried\n";
        RecordProperty("tried", static_cast<int>(tried_));
    }

    /// The next daemon starts on the state and hands over what it has to.
    void expectKept(const DiskState& state, std::size_t acknowledged) {
        state.restore(real("/var"));
        expectAlarmKept(acknowledged);
        kernel("requests clear");
        const auto next = startDaemon();
        const auto all = requests();
        ASSERT_FALSE(all.empty()) << describe(state, acknowledged);
        const bool restores = all[0].control == 6;
        ASSERT_GE(all.size(), restores ? 2U : 1U) << describe(state, acknowledged);
        const Request& started = all[restores ? 1 : 0];
        EXPECT_EQ(started.control, 3U);
        expectOneOf("KSTRMTimerRestarted", started.payload.substr(6), hex(Bytes(13, 0)),
                    acknowledged, state);
        expectOneOf("KSTRMSaveAnalytics", restores ? all[0].payload : "", "", acknowledged, state);
        next->signal(SIGKILL);
        next->awaitEnd();
    }

    [[nodiscard]] std::string describe(const DiskState& state, std::size_t acknowledged) const {
        std::string text = std::to_string(acknowledged) + " acknowledged";
        for (const auto& [path, bytes] : state.files) {
            text += '\n' + path + ": " + std::to_string(bytes.size()) + " bytes";
            text += bytes.size() <= 40 ? ' ' + hex(bytes) : "";
        }
        return text;
    }

    DiskState before_;
    std::vector<DiskStep> steps_;
    std::vector<Record> records_;

  private:
    /// Whether the daemon was killed. `next` is the record to be published next.
    bool runDaemon(support::DiskRecorder& recorder, std::size_t killAt, std::size_t& next) {
        std::atomic<bool> wasKilled = false;
        const auto judge = [&](const support::SystemCall& call) {
            const std::size_t steps = recorder.steps().size();
            recorder.note(call);
            if (!wasKilled && killAt < SIZE_MAX && diskSteps(recorder) > killAt &&
                recorder.steps().size() > steps) {
                wasKilled = true;
                recorder.forgetLast();
                ::kill(call.thread, SIGKILL);
                // Let go on, it would be carried out once more before the signal counts.
                return EINTR;
            }
            return 0;
        };
        support::SystemCallGate gate({KSTD_DEV, "--root", root.path().string()}, judge);
        // A daemon may be killed before it says so.
        static_cast<void>(gate.program().awaitLine("Entering the main runloop."));
        if (next > 0) {
            // What the one before has left.
            kernel("wait acks=" + std::to_string(acknowledgements_ + static_cast<int>(next)));
        }
        while (next < records_.size() && !wasKilled) {
            kernel(records_[next].command);
            ++next;
            const std::string line = "SENDING ACK " + records_[next - 1].property;
            if (!gate.program().awaitLine(line)) {
                break;
            }
            kernel("wait acks=" + std::to_string(acknowledgements_ + static_cast<int>(next)));
        }
        gate.program().signal(SIGTERM);
        const auto status = gate.program().awaitEnd();
        EXPECT_EQ(status, wasKilled ? 128 + SIGKILL : 0);
        return wasKilled;
    }

    static std::size_t diskSteps(const support::DiskRecorder& recorder) {
        std::size_t count = 0;
        for (const DiskStep& step : recorder.steps()) {
            count += step.what != DiskStep::What::mark ? 1 : 0;
        }
        return count;
    }

    /// What the last acknowledged record of a property says, or any later one; `nothing` when none
    /// was acknowledged.
    void expectOneOf(const std::string& property, const std::string& found,
                     const std::string& nothing, std::size_t acknowledged,
                     const DiskState& state) const {
        std::set<std::string> allowed = {nothing};
        for (std::size_t i = 0; i <= acknowledged && i < records_.size(); ++i) {
            if (records_[i].property == property) {
                if (i < acknowledged) {
                    allowed.clear();
                }
                allowed.insert(hex(records_[i].kept));
            }
        }
        EXPECT_TRUE(allowed.contains(found))
            << property << " is " << found << " with " << describe(state, acknowledged);
    }

    void expectAlarmKept(std::size_t acknowledged) {
        const Record* last = nullptr;
        for (std::size_t i = 0; i < acknowledged; ++i) {
            last = records_[i].property == "KSTRMTimerRestarted" ? &records_[i] : last;
        }
        if (last == nullptr || last->alarm == 0) {
            return;
        }
        const Record* const next =
            acknowledged < records_.size() ? &records_[acknowledged] : nullptr;
        const bool isReplaced = next != nullptr && next->property == last->property;
        if (isReplaced && next->alarm == 0) {
            return;
        }
        platform::FakeSystemLog log;
        platform::AlarmStore store(real("/var/lib/kstd/alarms"), {wire::kAlarmName}, log);
        const auto found = store.load(wire::kAlarmStream);
        ASSERT_EQ(found.size(), 1U) << "the alarm is lost after " << acknowledged << " records";
        const bool isDue = found[0].second == Date{};
        EXPECT_TRUE(isDue || found[0].second == Date{last->alarm * kNanosecondsPerSecond} ||
                    (isReplaced && found[0].second == Date{next->alarm * kNanosecondsPerSecond}));
    }

    int acknowledgements_ = 0;
    std::set<std::pair<std::size_t, std::size_t>> known_;
    std::size_t all_ = 0;
    std::size_t unique_ = 0;
    std::size_t tried_ = 0;
};

TEST_F(PowerCutTest, WhatWasAcknowledgedIsThereWhenTheFilesAreNew) {
    record({timerRestarted(1, 4102444800), saveAnalytics(0x11), timerRestarted(2, 4102444801),
            timerRestarted(3, 0), saveAnalytics(0x22), timerRestarted(4, 4102444802)});
    eachState([this](const DiskState& state, std::size_t acknowledged) {
        expectKept(state, acknowledged);
    });
    report("new files");
}

TEST_F(PowerCutTest, WhatWasAcknowledgedIsThereAfterADaemonWasKilled) {
    const std::vector<Record> records = {timerRestarted(1, 4102444800), saveAnalytics(0x11)};
    for (std::size_t killAt = 0;; killAt += kKillStep) {
        SCOPED_TRACE("killed before step " + std::to_string(killAt));
        before_.restore(real("/var"));
        record(records, killAt);
        if (HasFailure()) {
            return;
        }
        eachState([this](const DiskState& state, std::size_t acknowledged) {
            expectKept(state, acknowledged);
        });
        std::size_t steps = 0;
        for (const DiskStep& step : steps_) {
            steps += step.what != DiskStep::What::mark ? 1 : 0;
        }
        if (HasFailure() || killAt >= steps) {
            break;
        }
        stopKernel();
        startKernel();
    }
    report("killed before");
}

/// Events are not promised to outlive the power; the database is.
class PowerCutOfDatabaseTest : public PowerCutTest {
  protected:
    ~PowerCutOfDatabaseTest() override { kstd::TQAnalyticsLoggerSQLiteStore::releaseStores(); }

    void expectUsable(const DiskState& state) {
        state.restore(real("/var"));
        log_.clear();
        int rows = 0;
        {
            const auto store = kstd::TQAnalyticsLoggerSQLiteStore::storeWithPath(
                database(), kstd::kEventSchema, {log_, clock_, propertyLists_});
            ASSERT_TRUE(store->isOpen())
                << describe(state, 0) << testing::PrintToString(log_.texts());
            rows = static_cast<int>(store->allEvents().size());
            store->addEventDict({{"eventType", "policy"}}, kstd::kEventTable);
            EXPECT_EQ(store->allEvents().size(), static_cast<std::size_t>(rows) + 1)
                << describe(state, 0) << testing::PrintToString(log_.texts());
        }
        kstd::TQAnalyticsLoggerSQLiteStore::releaseStores();
        EXPECT_LE(rows, static_cast<int>(records_.size()) + rowsBefore_);
        EXPECT_GE(rows, rowsBefore_) << describe(state, 0);
        OtherConnection connection(database());
        EXPECT_EQ(connection.one("pragma integrity_check"), "ok") << describe(state, 0);
    }

    int rowsBefore_ = 0;

  private:
    platform::FakeSystemLog log_;
    platform::FakeClock clock_;
    platform::FakePropertyLists propertyLists_;
};

TEST_F(PowerCutOfDatabaseTest, TheNextOneUsesItWhileItWasMade) {
    record({analyticsCollected(), analyticsCollected(), analyticsCollected()});
    eachState([this](const DiskState& state, std::size_t) { expectUsable(state); }, kLooks);
    report("database made");
}

TEST_F(PowerCutOfDatabaseTest, RowsThatWereInTheFileStayInIt) {
    record({analyticsCollected(), analyticsCollected()});
    before_ = DiskState::of(real("/var"));
    ASSERT_FALSE(before_.files.contains("/root/.usbrestrictedmode_analytics_v2.db-wal"));
    rowsBefore_ = 2;
    record({analyticsCollected(), analyticsCollected(), analyticsCollected()});
    eachState([this](const DiskState& state, std::size_t) { expectUsable(state); }, kLooks);
    report("database used");
}

} // namespace
} // namespace system_tests
