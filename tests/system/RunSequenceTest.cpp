// The main job, on real programs: what ./run shows.

#include "base/FileDescriptor.h"
#include "base/UnixAddress.h"
#include "tests/system/SystemFixture.h"

#include <gmock/gmock.h>

#include <chrono>
#include <csignal>
#include <filesystem>
#include <sys/socket.h>

namespace system_tests {
namespace {

using testing::ElementsAre;
using testing::HasSubstr;
using testing::IsSupersetOf;

/// version 2, standardModeStartTimestamp 1700000000, lockedInRestrictedMode 1.
const std::vector<std::uint8_t> kState{2, 0, 0, 0, 0x00, 0xf1, 0x53, 0x65, 0, 0, 0, 0, 1};

std::vector<std::uint8_t> analytics(std::uint8_t first) {
    std::vector<std::uint8_t> bytes(32);
    for (std::size_t i = 0; i < bytes.size(); ++i) {
        bytes[i] = static_cast<std::uint8_t>(first + i);
    }
    return bytes;
}

constexpr char kAlarmFile[] = "/var/lib/kstd/alarms/com.zerva.alarm/com.zerva.kstd.alarm";

/// An idle time, in milliseconds, after which no test still runs.
constexpr int kNever = 3'600'000;

class RunSequenceTest : public SystemFixture {
  protected:
    static std::int64_t now() {
        return std::chrono::duration_cast<std::chrono::seconds>(
                   std::chrono::system_clock::now().time_since_epoch())
            .count();
    }

    static constexpr char kKernelSocket[] = "/run/keystrand/service.sock";

    [[nodiscard]] std::string cannotConnect(const std::string& reason) const {
        return "kstd: KernelSocket: cannot connect to " + real(kKernelSocket) + ": " + reason + ".";
    }

    /// The lines, each of a failed check without the number of its line in the source.
    static std::vector<std::string> withoutNumbers(std::vector<std::string> lines) {
        for (std::string& line : lines) {
            if (line.find(",  file: ") != std::string::npos) {
                line.replace(line.rfind(':') + 1, std::string::npos, "<n>");
            }
        }
        return lines;
    }
};

TEST_F(RunSequenceTest, TheWholeJob) {
    putFile(kStateFile, kState);
    putFile(kAnalyticsFile, analytics(0x40));
    startKernel();
    auto supervisor = startSupervisor(kNever, true);

    // What was saved is handed over.
    kernel("wait requests=2");
    EXPECT_THAT(requests(), ElementsAre(Request{6, hex(analytics(0x40)), 0},
                                        Request{3, "010000" + hex(kState), 0}));
    kernel("requests clear");

    // A record of each type. The alarm lies in the past, so it fires at once.
    kernel("publish timer-restarted alarm=" + std::to_string(now() - 5) +
           " version=3 start=1800000000 locked=0");
    ASSERT_TRUE(supervisor->awaitLine("init]_block_invoke: alarm."));
    ASSERT_TRUE(supervisor->awaitLine("unscheduleAlarm]: called, ."));
    kernel("publish analytics-collected");
    kernel("publish save-analytics " + hex(analytics(0x80)));
    kernel("publish timer-restarted-analytics total=119");
    kernel("wait acks=4");
    EXPECT_THAT(requests(),
                ElementsAre(Request{7, ackPayload("KSTRMTimerRestarted"), 0},
                            Request{7, ackPayload("KSTRMAnalyticsCollected"), 0},
                            Request{7, ackPayload("KSTRMSaveAnalytics"), 0},
                            Request{7, ackPayload("KSTRMTimerRestartedAnalyticsCollected"), 0}));
    const std::vector<std::uint8_t> newState{3, 0, 0, 0, 0x00, 0xd2, 0x49, 0x6b, 0, 0, 0, 0, 0};
    EXPECT_EQ(file(kStateFile), newState);
    EXPECT_EQ(file(kAnalyticsFile), analytics(0x80));
    kernel("requests clear");
    supervisor->signal(SIGTERM);
    EXPECT_EQ(supervisor->awaitEnd(), 0);
    EXPECT_EQ(supervisor->count("kstd: main: Stoping service - "), 1U);

    // The next event launches it and it hands the files back; idle, it ends by itself.
    supervisor = startSupervisor(1, false);
    sendEvent("com.example.any");
    ASSERT_TRUE(supervisor->awaitLine("Wisp Event: com.example.any (notifyd)."));
    EXPECT_THAT(requests(), ElementsAre(Request{6, hex(analytics(0x80)), 0},
                                        Request{3, "010000" + hex(newState), 0}));
    ASSERT_EQ(supervisor->awaitLine("kstd-supervise: ended"), "kstd-supervise: ended 0");
    supervisor->signal(SIGTERM);
    EXPECT_EQ(supervisor->awaitEnd(), 0);
    stopKernel();
}

TEST_F(RunSequenceTest, ManagedSettingChangesWhileTheDaemonRuns) {
    startKernel();
    const auto daemon = startDaemon();
    kernel("requests clear");
    putSettings("restricted-mode-allowed = no\n");
    kernel("wait control=5 count=1");
    putSettings("restricted-mode-allowed = yes\n");
    kernel("wait control=5 count=2");
    EXPECT_THAT(requests(), ElementsAre(Request{5, "00", 0}, Request{5, "01", 0}));
}

TEST_F(RunSequenceTest, SettingThatForbidsIsHandedOverAtTheStart) {
    putSettings("restricted-mode-allowed = no\n");
    startKernel();
    const auto daemon = startDaemon();
    EXPECT_THAT(requests(), ElementsAre(Request{3, "000000" + std::string(26, '0'), 0}));
    EXPECT_EQ(kernelStatus("allowed"), "off");
}

TEST_F(RunSequenceTest, FutureAlarmFiresAtItsDateAndIsCancelled) {
    startKernel();
    const auto daemon = startDaemon();
    const std::int64_t date = now() + 2;
    kernel("publish timer-restarted alarm=" + std::to_string(date));
    kernel("wait acks=1");
    ASSERT_TRUE(daemon->awaitLine("init]_block_invoke: alarm."));
    EXPECT_GE(now(), date);
    ASSERT_TRUE(daemon->awaitLine("unscheduleAlarm]: called, ."));
}

TEST_F(RunSequenceTest, AlarmThatBecameDueWhileNobodyRanFiresAtTheNextStart) {
    startKernel();
    {
        const auto daemon = startDaemon();
        kernel("publish timer-restarted alarm=4102444800");
        kernel("wait acks=1");
        daemon->signal(SIGKILL);
        EXPECT_EQ(daemon->awaitEnd(), 128 + SIGKILL);
    }
    // Time goes by, more of it than a test can wait for.
    const std::string due = "01700000000000000000\n";
    const auto registered = file(kAlarmFile);
    ASSERT_TRUE(registered);
    ASSERT_EQ(registered->size(), due.size());
    putFile(kAlarmFile, {due.begin(), due.end()});
    const auto daemon = startDaemon();
    ASSERT_TRUE(daemon->awaitLine("init]_block_invoke: alarm."));
}

TEST_F(RunSequenceTest, KernelAbsentAtTheStartAndPresentLater) {
    putFile(kAnalyticsFile, analytics(0x40));
    const auto daemon = startDaemon();
    // The order of the lines on the two outputs is part of it.
    EXPECT_THAT(
        withoutNumbers(daemon->lines()),
        ElementsAre(
            "kstd: main: Started service - <DeviceRestrictedModeService>.",
            "kstd: -[DeviceRestrictedModeService start]: called, .",
            "kstd: -[DeviceRestrictedModeService loadDataBlob:]: called, filePath "
            "= /var/root/.usbrestrictedmode_analytics.",
            cannotConnect("No such file or directory"),
            "KSTLib: AssertMacros: service (value: 0x0),  file: KSTLib/KSTLib:<n>",
            "KST: AssertMacros: err == 0  (value: 0xfffffffffffffffb),  file: "
            "common/LibCallBlock:<n>",
            "KST: LibCall_KSTKernelControl_Block: returning, err = -5.",
            "KSTLib: KSTKernelControl: returning, err = -5.",
            "kstd: AssertMacros: err == 0  (value: 0xfffffffffffffffb),  file: "
            "kstd/DeviceRestrictedMode/DeviceRestrictedModeService:<n>",
            "kstd: -[DeviceRestrictedModeService notifyDaemonStarted]: returning, err = -5.",
            "kstd: -[DeviceRestrictedModeService start]: returning, .",
            "kstd: main: Entering the main runloop."));
    sendEvent("com.zerva.Keystrand.KSTRMSaveAnalytics");
    ASSERT_TRUE(daemon->awaitLine("XXX Daemon: EMPTY IGNORING KSTRMSaveAnalytics."));

    startKernel();
    kernel("publish save-analytics " + hex(analytics(0x60)));
    kernel("wait acks=1");
    EXPECT_EQ(file(kAnalyticsFile), analytics(0x60));
}

TEST_F(RunSequenceTest, KernelSocketThatNobodyServes) {
    std::filesystem::create_directories(root.path() / "run/keystrand");
    {
        const base::FileDescriptor socket(::socket(AF_UNIX, SOCK_SEQPACKET | SOCK_CLOEXEC, 0));
        const auto address = base::UnixAddress::of(real(kKernelSocket)).value();
        ASSERT_EQ(::bind(socket.get(), address.get(), address.size()), 0);
    }
    putFile(kAnalyticsFile, analytics(0x40));
    const auto daemon = startDaemon();
    // -1111, also as 64 bits in hexadecimal: not what an absent kernel side gives.
    EXPECT_THAT(
        withoutNumbers(daemon->lines()),
        IsSupersetOf({
            cannotConnect("Connection refused"),
            std::string("KSTLib: AssertMacros: err == 0  (value: 0xfffffffffffffba9),  file: "
                        "KSTLib/KSTLib:<n>"),
            std::string("KSTLib: KSTKernelControl: returning, err = -1111."),
            std::string("kstd: AssertMacros: err == 0  (value: 0xfffffffffffffba9),  file: "
                        "kstd/DeviceRestrictedMode/DeviceRestrictedModeService:<n>"),
            std::string("kstd: -[DeviceRestrictedModeService notifyDaemonStarted]: returning, "
                        "err = -5."),
        }));
    startKernel();
    kernel("publish save-analytics " + hex(analytics(0x60)));
    kernel("wait acks=1");
}

TEST_F(RunSequenceTest, ModelOfTheTimerDrivesTheDaemonByItself) {
    startKernel({"--clock", "1700000000", "--period", "3600"});
    const auto daemon = startDaemon();
    kernel("lock");
    kernel("wait acks=1");
    ASSERT_TRUE(daemon->awaitLine("scheduleAlarm:]: called, timestamp=1700003600."));
    // Restricted mode begins: the alarm is no longer wanted, and the figures are saved.
    kernel("clock advance 3600");
    kernel("wait acks=3");
    EXPECT_EQ(kernelStatus("restricted"), "on");
    EXPECT_EQ(file(kStateFile),
              (std::vector<std::uint8_t>{1, 0, 0, 0, 0x00, 0xf1, 0x53, 0x65, 0, 0, 0, 0, 1}));
    EXPECT_TRUE(file(kAnalyticsFile));
    kernel("clock advance 60");
    kernel("unlock");
    ASSERT_TRUE(daemon->awaitLine("SENDING ACK KSTRMTimerRestartedAnalyticsCollected."));
    // Forbidding the policy reaches the model as request 5.
    putSettings("restricted-mode-allowed = no\n");
    kernel("wait control=5 count=1");
    EXPECT_EQ(kernelStatus("allowed"), "off");
}

TEST_F(RunSequenceTest, KernelRestartedWhileTheDaemonRuns) {
    startKernel();
    const auto daemon = startDaemon();
    kernel("publish analytics-collected");
    kernel("wait acks=1");
    stopKernel();
    startKernel();
    kernel("publish analytics-collected");
    kernel("wait acks=1");
}

TEST_F(RunSequenceTest, SecondDaemonUnderTheSameRootIsRefusedWhileTheFirstLives) {
    startKernel();
    const auto first = startDaemon();
    const auto second = beginDaemon();
    EXPECT_EQ(second->awaitEnd(), 1);
    EXPECT_EQ(second->lines(), std::vector<std::string>{"kstd-dev: another kstd-dev runs under " +
                                                        root.path().string()});
    sendEvent("for the first");
    EXPECT_TRUE(first->awaitLine("Wisp Event: for the first (notifyd)."));
    first->signal(SIGTERM);
    EXPECT_EQ(first->awaitEnd(), 0);
    static_cast<void>(startDaemon());
}

} // namespace
} // namespace system_tests
