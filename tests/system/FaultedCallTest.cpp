// Each system call of the daemon, and of the HTTPS client that it starts, failed in turn with each
// error that the kernel may give there, once and from there on; KSTD_FAULT_STEP is how many faults
// go on to the next one that is tried.

#include "tests/support/Collector.h"
#include "tests/support/SystemCallErrors.h"
#include "tests/system/CallInjector.h"
#include "tests/system/RelaunchFixture.h"

#include <algorithm>
#include <cerrno>
#include <csignal>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <functional>
#include <iostream>
#include <regex>
#include <set>
#include <system_error>

namespace system_tests {
namespace {

namespace fs = std::filesystem;

/// How long a daemon is given while its call fails for good.
constexpr std::chrono::seconds kPatienceWithCause{3};
/// More failures of the one call than any scenario has calls.
constexpr int kMostHits = 300;

const std::vector<std::uint8_t> kOldBlob(32, 0x11);
const std::vector<std::uint8_t> kNewBlob(32, 0x22);
const std::vector<std::uint8_t> kNextBlob(32, 0x33);

std::string errorName(int error) {
    return ::strerrorname_np(error);
}

/// Without what is different in each run.
std::string shapeOf(const std::string& line) {
    static const std::regex kNumbers("[0-9]+(\\.[0-9]+)?");
    return std::regex_replace(line, kNumbers, "#");
}

/// What the daemon is brought to do while its calls fail.
struct Scenario {
    std::string name;
    /// From the first call of the program on; otherwise from when it waits for its first event.
    bool fromStart = false;
    /// Publishes what is to be handled.
    std::function<void()> act = [] {
    };
    /// What must hold when the record was acknowledged; a text says what does not.
    std::function<std::string()> kept = [] {
        return std::string();
    };
    /// How many rows it makes; at most that many are lost, with a line.
    int rows = 0;
    bool ends = false;
    /// With a first event before, by which the database is open.
    bool isWarm = false;
    bool uploads = false;
};

/// The faults that leave no line of their own, one a line: SCENARIO PROGRAM CALL OBJECT ERROR, each
/// of which may be "*", and after a "#" the reason.
class QuietFaults {
  public:
    QuietFaults() {
        std::ifstream file(KSTD_QUIET_FAULTS);
        for (std::string line; std::getline(file, line);) {
            const std::string words = line.substr(0, line.find('#'));
            std::istringstream stream(words);
            std::vector<std::string> entry{std::istream_iterator<std::string>(stream), {}};
            if (entry.size() == 5) {
                entries_.push_back({entry, 0});
            } else {
                EXPECT_TRUE(entry.empty()) << line;
            }
        }
    }

    [[nodiscard]] bool contains(const std::string& scenario, const Fault& fault) {
        const std::string object = fault.point.object.empty() ? "-" : fault.point.object;
        const std::vector<std::string> words = {scenario, fault.point.program, fault.point.call,
                                                object, errorName(fault.error)};
        bool found = false;
        for (auto& [entry, uses] : entries_) {
            const bool matches =
                std::equal(entry.begin(), entry.end(), words.begin(),
                           [](const std::string& pattern, const std::string& word) {
                               return pattern == "*" || pattern == word ||
                                      (pattern.ends_with('*') &&
                                       word.starts_with(pattern.substr(0, pattern.size() - 1)));
                           });
            uses += matches ? 1 : 0;
            found = found || matches;
        }
        return found;
    }

    /// What is said of a scenario alone was needed in it.
    void expectAllUsed(const std::string& scenario) const {
        for (const auto& [entry, uses] : entries_) {
            EXPECT_TRUE(uses > 0 || entry[0] != scenario) << testing::PrintToString(entry);
        }
    }

  private:
    std::vector<std::pair<std::vector<std::string>, int>> entries_;
};

class FaultedCallTest : public RelaunchFixture {
  protected:
    void SetUp() override {
        startKernel();
        makeTemplate();
    }

    void failEachCallOf(const Scenario& scenario) {
        run(scenario, std::nullopt);
        if (HasFailure()) {
            return;
        }
        if (points_.empty()) {
            GTEST_SKIP()
                << "no calls of its own but those to the log, which no sanitizer lets fail";
        }
        std::size_t number = 0;
        std::size_t tried = 0;
        for (const CallPoint& point : std::vector(points_)) {
            for (const int error : point.errors) {
                for (const bool lasts : {false, true}) {
                    const Fault fault{point, error, lasts};
                    if (isWanted(nameOf(scenario, fault), number++)) {
                        ++tried;
                        run(scenario, fault);
                    }
                }
            }
        }
        std::cout << scenario.name << ": " << points_.size() << " calls, " << number << " faults, "
                  << tried << " tried\n";
        RecordProperty("tried", static_cast<int>(tried));
        EXPECT_GT(tried, 0U);
        if (tried == number) {
            quiet_.expectAllUsed(scenario.name);
        }
    }

    /// By a text that the fault's name holds, which KSTD_FAULT may give; otherwise by its number.
    [[nodiscard]] static bool isWanted(const std::string& name, std::size_t number) {
        const char* const text = std::getenv("KSTD_FAULT");
        return text != nullptr ? name.find(text) != std::string::npos
                               : number % KSTD_FAULT_STEP == 0;
    }

    [[nodiscard]] static std::string nameOf(const Scenario& scenario, const Fault& fault) {
        return scenario.name + ": " + fault.point.name() + ' ' + errorName(fault.error) +
               (fault.lasts ? " lasting" : " once");
    }

    [[nodiscard]] Scenario timerRestarted(const std::string& name, const std::string& alarm) {
        Scenario scenario;
        scenario.name = name;
        scenario.act = [this, alarm] {
            kernel("publish timer-restarted alarm=" + alarm +
                   " version=2 start=1800000000 locked=1");
        };
        scenario.kept = [this] {
            return file(kStateFile) == stateOf(2) ? "" : "the state is not on disk";
        };
        return scenario;
    }

  private:
    /// A database with one event, and the upload far away.
    void makeTemplate() {
        const auto first = relaunched();
        kernel("publish analytics-collected");
        kernel("wait acks=1");
        first->signal(SIGTERM);
        ASSERT_EQ(first->awaitEnd(), 0);
        fs::copy_file(database(), root.path() / "template.db");
    }

    void arrange(const Scenario& scenario) {
        dropEvents();
        for (const char* const suffix : {"-wal", "-shm"}) {
            fs::remove(database() + suffix);
        }
        fs::copy_file(root.path() / "template.db", database(),
                      fs::copy_options::overwrite_existing);
        fs::remove_all(real("/var/lib/kstd/alarms"));
        fs::create_directories(real("/var/lib/kstd/alarms"));
        putFile(kStateFile, stateOf(1));
        putFile(kAnalyticsFile, kOldBlob);
        kernel("requests clear");
        scenario_ = &scenario;
    }

    /// The number of lines with SIGTERM at the end of a run, whatever went before.
    struct Run {
        int acksBefore = 0;
        int rowsBefore = 0;
        bool ended = false;
        std::set<std::string> shapes;
        std::string trouble;
        std::string effect;
    };

    void run(const Scenario& scenario, const std::optional<Fault>& fault) {
        SCOPED_TRACE(fault ? nameOf(scenario, *fault) : scenario.name);
        arrange(scenario);
        Run now;
        now.acksBefore = acks();
        now.rowsBefore = 1;
        CallInjector injector(root.path().string(), eventSocket(), fault);
        {
            const auto behind = relaunchedBehind(
                [&injector](const support::SystemCall& call) { return injector.judge(call); });
            support::SystemCallGate& gate = *behind;
            if (scenario.fromStart) {
                injector.armAtMain();
            }
            if (!scenario.fromStart) {
                await(gate.program(), injector, now, support::kPatience);
                if (scenario.isWarm) {
                    warmUp(gate.program(), injector, now);
                }
                injector.arm();
            }
            perform(scenario, gate.program(), injector, now, fault && fault->lasts);
            injector.disarm();
            if (!now.ended) {
                await(gate.program(), injector, now, support::kPatience);
            }
            if (!now.ended) {
                expectNextEventIsHandled(scenario, gate.program(), injector, now);
            }
            if (!now.ended) {
                gate.program().signal(SIGTERM);
            }
            const auto status = gate.program().awaitEnd();
            if (!status) {
                now.trouble += "does not end; ";
            } else if (*status != 0 && (!now.ended || *status != 1) &&
                       !(*status == 128 + SIGTERM && saysThatItHasNoStopRequest(gate.program()))) {
                now.trouble += "ended with " + std::to_string(*status) + "; ";
            }
            for (const std::string& line : gate.program().lines()) {
                now.shapes.insert(shapeOf(line));
            }
            lines_ = gate.program().lines();
        }
        recover(scenario, now);
        if (!fault) {
            points_ = injector.points();
            shapes_ = now.shapes;
            effect_ = now.effect;
            EXPECT_EQ(now.trouble, "");
            EXPECT_FALSE(now.ended && !scenario.ends);
            return;
        }
        if (injector.hits() > 0) {
            judge(scenario, *fault, now);
        }
    }

    static bool saysThatItHasNoStopRequest(const Program& program) {
        return program.count("kstd: StopRequest: SIGTERM ends the daemon wherever it is: ") > 0;
    }

    void perform(const Scenario& scenario, Program& program, CallInjector& injector, Run& now,
                 bool lasts) {
        scenario.act();
        if (scenario.ends) {
            program.signal(SIGTERM);
            static_cast<void>(program.awaitLine("Stoping service"));
            now.ended = true;
            return;
        }
        // With a cause that does not go away by itself it may wait for as long as that is there.
        await(program, injector, now, lasts ? kPatienceWithCause : support::kPatience);
        if (acks() > now.acksBefore) {
            now.trouble += scenario.kept();
        }
        now.effect = effect(scenario, now);
    }

    void warmUp(const Program& program, CallInjector& injector, Run& now) {
        kernel("publish analytics-collected");
        await(program, injector, now, support::kPatience);
        now.acksBefore = acks();
        now.rowsBefore = storedEvents();
        kernel("requests clear");
        if (scenario_->uploads) {
            makeUploadDue();
        }
    }

    static void await(const Program& program, CallInjector& injector, Run& now,
                      std::chrono::milliseconds patience) {
        const auto daemonIs = injector.awaitIdle(program.pid(), patience);
        now.ended = daemonIs == CallInjector::Daemon::ended;
        if (daemonIs == CallInjector::Daemon::busy && patience == support::kPatience) {
            now.trouble += "is not done after half a minute; ";
        }
        if (injector.hits() > kMostHits) {
            now.trouble += "goes in circles; ";
        }
    }

    /// What has come of it, which is the same in each run without a fault.
    [[nodiscard]] std::string effect(const Scenario& scenario, const Run& now) {
        std::ostringstream text;
        text << "ended " << now.ended << " acks " << acks() - now.acksBefore << " requests";
        for (const Request& request : requests()) {
            text << ' ' << request.control << ' ' << request.payload << ' ' << request.status;
        }
        if (scenario.rows > 0) {
            text << " rows " << storedEvents();
        }
        return text.str();
    }

    void expectNextEventIsHandled(const Scenario& scenario, const Program& program,
                                  CallInjector& injector, Run& now) {
        const int before = acks();
        kernel("publish save-analytics " + hex(kNextBlob));
        await(program, injector, now, support::kPatience);
        if (!now.ended && (acks() != before + 1 || file(kAnalyticsFile) != kNextBlob)) {
            now.trouble += "the next record is not handled; ";
        }
        if (scenario.rows > 0 && !now.ended) {
            const int rows = storedEvents();
            kernel("publish analytics-collected");
            await(program, injector, now, support::kPatience);
            if (!now.ended && storedEvents() != rows + 1 && !scenario.uploads) {
                now.trouble += "the next event is not stored; ";
            }
        }
    }

    /// The next daemon, without a fault, handles whatever is left.
    void recover(const Scenario& scenario, Run& now) {
        if (now.ended || kernelStatus("properties") != "0") {
            kernel("publish save-analytics " + hex(kNextBlob));
            const int wanted = acks() + std::stoi(kernelStatus("properties"));
            const auto next = relaunched();
            kernel("wait acks=" + std::to_string(wanted));
            next->signal(SIGTERM);
            if (next->awaitEnd() != 0) {
                now.trouble += "the next daemon does not end well; ";
            }
        }
        if (kernelStatus("properties") != "0") {
            now.trouble += "a record stays unacknowledged; ";
            stopKernel();
            startKernel();
        }
        now.trouble += scenario.kept();
        if (file(kAnalyticsFile) != kNextBlob) {
            now.trouble += "the next record is not on disk; ";
        }
        OtherConnection connection(database());
        if (connection.one("pragma integrity_check") != "ok") {
            now.trouble += "the database is damaged; ";
        }
        if (!scenario.uploads &&
            std::stoi(connection.one("select count(*) from all_events")) < now.rowsBefore) {
            now.trouble += "an earlier event is lost; ";
        }
    }

    void judge(const Scenario& scenario, const Fault& fault, const Run& now) {
        bool said = false;
        for (const std::string& shape : now.shapes) {
            said = said || !shapes_.contains(shape);
        }
        std::string trouble = now.trouble;
        if (!said && !(now.effect == effect_ && mayBeQuiet(scenario, fault))) {
            trouble += "no line says why; it is " + now.effect + " in the place of " + effect_;
        }
        if (!trouble.empty()) {
            ADD_FAILURE() << nameOf(scenario, fault) << ": " << trouble << "The daemon said:\n"
                          << saidLast();
        }
    }

    [[nodiscard]] bool mayBeQuiet(const Scenario& scenario, const Fault& fault) {
        return support::passes(fault.point.call, fault.error) ||
               quiet_.contains(scenario.name, fault);
    }

    [[nodiscard]] std::string saidLast() const {
        constexpr std::size_t kMostLines = 40;
        std::string text;
        for (std::size_t i = lines_.size() - std::min(lines_.size(), kMostLines); i < lines_.size();
             ++i) {
            text += "    " + lines_[i] + '\n';
        }
        return text;
    }

    std::vector<CallPoint> points_;
    std::set<std::string> shapes_;
    std::string effect_;
    QuietFaults quiet_;
    const Scenario* scenario_ = nullptr;
    Lines lines_;
};

TEST_F(FaultedCallTest, Start) {
    Scenario scenario;
    scenario.name = "start";
    scenario.fromStart = true;
    failEachCallOf(scenario);
}

TEST_F(FaultedCallTest, TimerRestarted) {
    failEachCallOf(timerRestarted("timer-restarted", "4102444800"));
}

TEST_F(FaultedCallTest, AlarmThatIsDue) {
    failEachCallOf(timerRestarted("alarm-due", "1000000000"));
}

TEST_F(FaultedCallTest, SaveAnalytics) {
    Scenario scenario;
    scenario.name = "save-analytics";
    scenario.act = [this] {
        kernel("publish save-analytics " + hex(kNewBlob));
    };
    failEachCallOf(scenario);
}

TEST_F(FaultedCallTest, AnalyticsCollected) {
    Scenario scenario;
    scenario.name = "analytics-collected";
    scenario.act = [this] {
        kernel("publish analytics-collected");
    };
    scenario.rows = 1;
    failEachCallOf(scenario);
}

TEST_F(FaultedCallTest, TimerRestartedAnalyticsCollected) {
    Scenario scenario;
    scenario.name = "timer-restarted-analytics";
    scenario.act = [this] {
        kernel("publish timer-restarted-analytics total=60");
    };
    scenario.rows = 1;
    scenario.isWarm = true;
    failEachCallOf(scenario);
}

TEST_F(FaultedCallTest, Settings) {
    Scenario scenario;
    scenario.name = "settings";
    scenario.act = [this] {
        putSettings("restricted-mode-allowed = no\n");
        // The change waits in no socket; an event behind it does.
        sendEvent("the one behind it");
    };
    failEachCallOf(scenario);
}

TEST_F(FaultedCallTest, End) {
    Scenario scenario;
    scenario.name = "end";
    scenario.ends = true;
    failEachCallOf(scenario);
}

TEST_F(FaultedCallTest, Upload) {
    support::Collector collector;
    configure({.uploadURL = collector.link("/2/kst")});
    options = {"--trust-anchors", collector.authority()};
    Scenario scenario;
    scenario.name = "upload";
    scenario.act = [this] {
        kernel("publish analytics-collected");
    };
    scenario.rows = 1;
    scenario.isWarm = true;
    scenario.uploads = true;
    failEachCallOf(scenario);
}

} // namespace
} // namespace system_tests
